// The calls to the service that looks after I/O boxes. They block until it answers, so they are
// made on the worker's thread.
#pragma once

#include <gio/gio.h>

#include <cstdint>
#include <optional>

#include "base/log.h"
#include "port/supervised-range.h"

class TimeoutBudget;

// Fixed: the function and the line that messages about boxes begin with.
struct IoBoxPlace {
  const char *function;
  int line;
};

#define log_iobox(level, place, format, ...) \
  log_at((level), "%s@%d: " format, (place).function, (place).line __VA_OPT__(, ) __VA_ARGS__)

// How a call is made.
struct IoBoxCall {
  GDBusProxy *proxy;
  GCancellable *cancellable;
  TimeoutBudget *budget;  // null: it waits as long as the bus allows
};

// The mode of a port at the time of the request.
struct IoBoxMode {
  int number;
  std::int32_t level;
  const char *word;
};

// Whether there is a box. False, with a message, without an answer too.
bool iobox_is_connected(const IoBoxCall &call);
bool iobox_port_is_enabled(const IoBoxCall &call, int number);
// The state of an input. Unset, with a message, without an answer.
std::optional<SupervisedRangeState> iobox_query_state(const IoBoxCall &call, int number);
// A failure is only logged.
void iobox_send_mode(const IoBoxCall &call, const IoBoxMode &mode);

// The line state for a word of the service. Other words are undefined, with a warning. Any thread.
SupervisedRangeState iobox_state_to_portd_state(const char *word);
