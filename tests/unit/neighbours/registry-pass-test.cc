#include <gtest/gtest.h>

#include "port/ioport.h"
#include "port/port-registry.h"

namespace {

// A backend that asks the registry while it is set up, as an event library may.
constexpr PortFunctions kCuriousFunctions = {
    .setup =
        [](IOPort * /*port*/, bool /*level*/) {
          (void)port_registry_any_port_active();
          return true;
        },
    .get_state = [](IOPort * /*port*/) { return 0U; },
};

TEST(RegistryPasses, LeaveTheRegistryFreeWhileABackendIsSetUp) {
  io_port_register_backend({"curious", BACKEND_CHECK, &kCuriousFunctions});
  IOPortRef port(io_port_new());
  io_port_set_optional(port.get(), true);
  io_port_set_backend(port.get(), BACKEND_CHECK);
  port_registry_add(port.get());
  port_registry_park(port.get());
  std::size_t back = 0;
  port_registry_retry_parked([&](std::size_t count) { back = count; });
  EXPECT_EQ(back, 1U);
  port_registry_setup_all();
  EXPECT_TRUE(io_port_is_set_up(port.get()));
  port.reset();
  port_registry_drop_all();
}

}  // namespace
