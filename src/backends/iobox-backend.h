// Ports of external I/O boxes, which another service looks after: this is a client of it.
//
// Calls of the service block the calling thread, for 25 seconds at most, and one process of the
// service is not waited for like that again and again (base/patience.h). After a call that it left
// without an answer, its calls get 0.1 seconds each for a minute, but for methods that answer in
// that time; what they ask of a box is still delivered if the service recovers. So a service that
// hangs, or leaves one method without an answer, holds start-up, or a refresh, for 25 seconds plus
// 0.1 seconds for every port on a box. One that answers late is waited for until its late answers
// add up to a minute, so it holds them for 85 seconds at most, plus 0.1 seconds for every call
// after that; ports that did not come into service by then need a refresh. A pass of more than a
// minute of short waits begins anew.
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
