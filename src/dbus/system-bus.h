// The daemon's connection to the system bus, which comes when the bus does. Main thread.
#pragma once

#include <gio/gio.h>

#include <functional>

// Calls `ready` once, from the main loop, as soon as there is a connection. A bus that is not there
// yet is reported once, at critical level, and looked for every second.
void system_bus_when_ready(std::function<void(GDBusConnection *)> ready);

// Waits until everything that was sent is on its way, for a second at the most: a bus that takes
// nothing any more must not keep the daemon from ending. At shutdown.
void system_bus_flush();
