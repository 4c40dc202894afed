// The calls of SetState, which clients may make without waiting for an answer: any number of them.
// They are taken where the bus connection reads them, and served by the main loop many at once, at
// a fraction of what the library spends on each call of an object; so a client that sends faster
// than the daemon serves keeps others waiting hardly longer than the reading of its calls takes.
//
// Calls are served in the order in which the connection reads them, also between those taken here
// and all others.
#pragma once

#include <gio/gio.h>

// Takes the calls for the object of that path and interface from now on. Main thread.
void state_calls_start(GDBusConnection *connection, const char *path, const char *interface);
// Takes no more of them. Main thread.
void state_calls_stop();
