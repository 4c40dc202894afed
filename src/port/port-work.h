// What a backend does for a port in the background, because it has to wait for a service.
//
// A piece of work lasts from the construction of its PortWork to its destruction, and keeps the
// port alive for that long. io_port_when_idle() waits for its end.
#pragma once

#include "port/ioport.h"

class PortWork {
 public:
  // Any thread.
  explicit PortWork(IOPort *port);
  PortWork(const PortWork &) = delete;
  PortWork &operator=(const PortWork &) = delete;
  // Any thread.
  ~PortWork();

 private:
  IOPortRef port_;
};
