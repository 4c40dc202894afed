// The callbacks of the port layer to the layers above. The event code and the D-Bus interfaces fill
// their slots at start-up; an empty slot is skipped.
#pragma once

#include <gio/gio.h>

#include <cstdint>

struct IOPort;
struct IoEvent;

struct PortChange {
  int number;
  bool is_virtual;
  bool hidden;
  bool input;
  bool virtual_trig;
  bool state;
  bool activelow;
};

struct PortListener {
  // Declares the event if it applies to the port now and is not declared yet; false: it could not.
  bool (*declare_event)(IOPort *port, IoEvent *event) = nullptr;
  void (*undeclare_event)(IoEvent *event) = nullptr;
  // Withdraws the declaration and makes it anew, since what it says of the port has changed.
  void (*redeclare_event)(IOPort *port, IoEvent *event) = nullptr;
  // Sends the event for a state: the logical state, or the line state of a supervised input. Also
  // from action threads.
  void (*send_event)(IOPort *port, IoEvent *event, std::int32_t state) = nullptr;
  // Also from action threads.
  void (*port_changed)(const PortChange &change) = nullptr;
  void (*action_sequence_done)(int number) = nullptr;
  // Waits until what was reported so far has been taken by those who pass it on, or until
  // `deadline_us` of the monotonic clock, or until `cancelled` is. On action threads, which hold no
  // lock meanwhile.
  void (*wait_until_sent)(GCancellable *cancelled, std::int64_t deadline_us) = nullptr;
};

// The one table of the process. Fill slots before watches are armed and before the main loop serves
// the first client, who may start an action sequence, and leave them: action threads read them
// without a lock. Main thread.
PortListener &port_listener();
