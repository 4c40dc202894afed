// The events of ports on the device's event system: which declaration an event description becomes,
// and when it is sent.
//
// Declaring belongs to the main thread, sending to any thread. Nobody may hold the registry lock
// while calling in: the event library asks for the state of ports.
#pragma once

#include <cstdint>

struct IOPort;
struct IoEvent;

// Fills the port listener's event slots. Once, at start-up.
void io_events_start();
// Withdraws all that is left of this daemon's declarations. After the last port is gone.
void io_events_stop();

// Declares the event if it applies to the port now and is not declared yet. Always true: what can't
// be declared is logged, and is then never sent.
bool io_event_declare(IOPort *port, IoEvent *event);
// Withdraws the declaration. The any-port event, which ports share, stays.
void io_event_undeclare(IoEvent *event);
// Makes the declaration anew, as the port's name in it has changed. Not for the any-port event.
void io_event_redeclare(IOPort *port, IoEvent *event);
// Sends the event. False when it was not sent: not declared, declared only, or a repeat.
bool io_event_send(IOPort *port, IoEvent *event, std::int32_t value);
// Lets the next send pass the repeat filter.
void io_event_reset_filter(IoEvent *event);
