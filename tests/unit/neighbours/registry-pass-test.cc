#include <gtest/gtest.h>

#include "port/ioport.h"
#include "port/port-registry.h"

namespace {

constexpr int kCheckBackend = 9;

// A backend that asks the registry while it is set up, as an event library may.
constexpr PortFunctions kCuriousFunctions = {
    .setup =
        [](IOPort * /*port*/, bool /*level*/) {
          (void)port_registry_any_port_active();
          return true;
        },
    .get_state = [](IOPort * /*port*/) { return 0U; },
};

const PortFunctions *curious_backend(IOPort * /*port*/) {
  return &kCuriousFunctions;
}

TEST(RegistryPasses, LeaveTheRegistryFreeWhileABackendIsSetUp) {
  io_port_register_backend(kCheckBackend, curious_backend);
  IOPortRef port(io_port_new());
  io_port_set_optional(port.get(), true);
  io_port_set_backend(port.get(), kCheckBackend);
  port_registry_add(port.get());
  port_registry_park(port.get());
  EXPECT_EQ(port_registry_retry_parked(), 1U);
  port_registry_setup_all();
  EXPECT_TRUE(io_port_is_set_up(port.get()));
  port.reset();
  port_registry_drop_all();
}

}  // namespace
