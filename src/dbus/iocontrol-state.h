// The control interface: its bus name, its object and its signals.
#pragma once

// Owns the bus names of the control and the connector interface and, once the bus is there, exports
// both objects. Fills the port listener's slots for the two signals. Main thread, once.
void iocontrol_state_start();
// Withdraws the objects and gives the names up. Signals are skipped from then on.
void iocontrol_state_stop();
// Sees to it that what was sent last, the withdrawal of events included, leaves before the process
// ends.
void iocontrol_state_flush();
