// The control interface: its bus name, its object and its signals.
#pragma once

// Serves the interface under its bus name as soon as there is a bus. Fills the port listener's
// slots for the two signals, and makes the names of the errors known. Main thread, once.
void iocontrol_state_start();
// Withdraws the object and gives the name up. Signals are skipped from then on.
void iocontrol_state_stop();
