// The supervised-input interface: its bus name, its object and its nine methods.
#pragma once

// Serves the interface under its bus name as soon as there is a bus. Start the control interface
// first: it makes the names of the errors known. Main thread, once.
void iosupervised_start();
// Withdraws the object and gives the name up.
void iosupervised_stop();
