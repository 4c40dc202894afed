// The supervised-input interface: its bus name, its object and its nine methods.
#pragma once

// Owns the bus name and, once the bus is there, exports the object. Start the control interface
// first: it makes the names of the errors known. Main thread, once.
void iosupervised_start();
// Withdraws the object and gives the name up.
void iosupervised_stop();
