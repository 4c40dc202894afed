// These tests have a private bus from beginning to end.
#include <gio/gio.h>
#include <gtest/gtest.h>

#include "base/glib-ptr.h"
#include "bus-test.h"
#include "private-bus.h"

namespace {
std::string the_address;
std::string the_name;
}  // namespace

const std::string &bus_address() {
  return the_address;
}

const std::string &shared_name() {
  return the_name;
}

int main(int argc, char **argv) {
  the_address = point_system_bus_at_nothing();
  testing::InitGoogleTest(&argc, argv);
  const PrivateBus bus(the_address);
  const GObjectPtr<GDBusConnection> connection(g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, nullptr));
  if (!connection) {
    return 1;
  }
  g_dbus_connection_set_exit_on_close(connection.get(), FALSE);
  the_name = g_dbus_connection_get_unique_name(connection.get());
  return RUN_ALL_TESTS();
}
