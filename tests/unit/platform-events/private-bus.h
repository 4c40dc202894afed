// A message bus of the test's own, in the place of the system bus.
#pragma once

#include <glib.h>

#include <string>

// The address of a bus that is not there. From here on it is the system bus's; call before the
// first use of the bus.
std::string point_system_bus_at_nothing();

class PrivateBus {
 public:
  // Starts a bus at the address and returns when it takes connections.
  explicit PrivateBus(const std::string &address);
  ~PrivateBus();
  PrivateBus(const PrivateBus &) = delete;
  PrivateBus &operator=(const PrivateBus &) = delete;

 private:
  GPid daemon_ = 0;
};
