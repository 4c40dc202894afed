// Ports of external I/O boxes, which another service looks after: this is a client of it.
//
// The service is called from a thread of its own (base/worker.h), in the order of the requests, and
// each call waits for 25 seconds at most: nothing else waits for a service that hangs. A change of
// a port is effective at once; io_port_when_idle() tells when the box has answered. Set-ups that
// wait behind each other, at start or in a refresh, share one time limit (base/timeout-budget.h),
// so that a service that hangs costs it once and not once a port.
//
// A service that restarts is sent the modes of all ports that are set up, and asked for the states
// of the inputs.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>

#include "base/glib-ptr.h"
#include "port/ioport.h"

// How many signals a port has received since it was set up.
using IoBoxSignalCount = std::shared_ptr<std::atomic<unsigned>>;

// The record of a port, open to the tests that need no bus. Action threads use what is atomic.
struct IoBoxBackendData : PortBackendData {
  ~IoBoxBackendData() override;

  std::atomic<bool> connected = false;  // the proxy exists
  std::atomic<bool> watching = false;   // changes are reported to the port
  std::atomic<std::int32_t> output_value = 0;
  std::atomic<std::int32_t> state = SUPERVISED_STATE_OPEN;  // a SupervisedRangeState
  std::mutex mode_lock;  // the box ends up with what was asked last
  IoBoxSignalCount signal_count;
  IOPort *follower = nullptr;  // the port, while it follows the signals of the service
};

// Serves a signal of the service for one port. What is not for it, or malformed, is ignored.
void iobox_handle_signal(IOPort *port, const char *signal, GVariant *parameters);
