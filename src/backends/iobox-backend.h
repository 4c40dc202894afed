// Ports of external I/O boxes, which another service looks after: this is a client of it.
//
// Calls of the service block the calling thread. While the service does not answer, a call waits
// 25 seconds, but for the following minute further calls of the same process of the service wait
// only 0.1 seconds each (base/patience.h); what they ask of a box is still delivered if the service
// recovers. So a service that hangs holds start-up, or a refresh, for 25 seconds plus 0.1 seconds
// for every port on a box, and each later request for a box at most 25 seconds. A service that
// answers late is waited for: three answers for an input, two for an output, at the worst just
// under 25 seconds each.
#pragma once

#include <atomic>
#include <cstdint>
#include <mutex>

#include "base/glib-ptr.h"
#include "base/signal-handler.h"
#include "port/ioport.h"

// The record of a port, open to the tests that need no bus. Action threads use what is atomic, and
// the proxy, which stays as it is while the port is set up.
struct IoBoxBackendData : PortBackendData {
  GObjectPtr<GDBusProxy> proxy;
  SignalHandler handler;
  std::atomic<bool> connected = false;  // the proxy exists
  std::atomic<bool> watching = false;   // changes are reported to the port
  std::atomic<std::int32_t> output_value = 0;
  std::atomic<std::int32_t> state = SUPERVISED_STATE_OPEN;  // a SupervisedRangeState
  std::mutex mode_lock;  // the box ends up with what was asked last
};

// The line state for a word of the service. Other words are undefined, with a warning.
SupervisedRangeState iobox_state_to_portd_state(const char *word);

// Serves a signal of the service for one port. What is not for it, or malformed, is ignored.
void iobox_handle_signal(IOPort *ioport, const char *signal, GVariant *parameters);
