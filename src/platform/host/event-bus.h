// The event library's side of the bus: the connection, the producers' objects and their signals.
// The caller holds the library's lock; any thread.
#pragma once

#include "platform/host/event-library.h"

// A producer has come: its object is to appear as soon as there is a connection.
void event_bus_publish(EventLibrary &library, EventProducer &producer);

// A producer goes, and is no longer among the library's.
void event_bus_withdraw(EventLibrary &library, EventProducer &producer);

// Sends a signal of the producer's object, now or when the connection that is being made is there.
// Takes over `parameters`, which is floating.
void event_bus_signal(const EventLibrary &library, EventProducer &producer, const char *name,
                      GVariant *parameters);
