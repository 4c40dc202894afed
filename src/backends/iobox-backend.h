// Ports of external I/O boxes, which another service looks after: this is a client of it.
//
// The service is called from a thread of its own (base/worker.h), in the order in which it was
// asked, and each call waits for 25 seconds at most: nobody else waits for a service that hangs.
// What a port is told counts from that moment; who wants to know when the box has answered asks
// io_port_when_settled(). Set-ups that wait behind each other, at start or in a refresh, share one
// time limit (base/patience.h), so that a service that hangs costs it once and not once a port.
//
// A service that is started anew is told the modes of all ports that are set up, and asked for the
// states of the inputs.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>

#include "base/glib-ptr.h"
#include "port/ioport.h"

// How many signals a port has heard since it was set up.
using IoBoxHeard = std::shared_ptr<std::atomic<unsigned>>;

// The record of a port, open to the tests that need no bus. Action threads use what is atomic.
struct IoBoxBackendData : PortBackendData {
  ~IoBoxBackendData() override;

  std::atomic<bool> connected = false;  // the proxy exists
  std::atomic<bool> watching = false;   // changes are reported to the port
  std::atomic<std::int32_t> output_value = 0;
  std::atomic<std::int32_t> state = SUPERVISED_STATE_OPEN;  // a SupervisedRangeState
  std::mutex mode_lock;  // the box ends up with what was asked last
  IoBoxHeard heard;
  IOPort *follower = nullptr;  // the port, while it follows the signals of the service
};

// Serves a signal of the service for one port. What is not for it, or malformed, is ignored.
void iobox_handle_signal(IOPort *port, const char *signal, GVariant *parameters);
