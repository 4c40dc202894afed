// The connector interface: which of the ports that sense a connector are plugged in. Main thread.
#pragma once

// Serves the interface under its bus name as soon as there is a bus.
void connector_start();
// Withdraws the object and gives the name up.
void connector_stop();
