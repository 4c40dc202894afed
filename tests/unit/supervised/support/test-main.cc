#include <glib.h>
#include <gtest/gtest.h>

int main(int argc, char **argv) {
  // A test that reached for the bus would find the one of the machine that it runs on.
  g_setenv("DBUS_SYSTEM_BUS_ADDRESS", "unix:path=/nonexistent/no-bus-in-unit-tests", TRUE);
  testing::InitGoogleTest(&argc, argv);
  return RUN_ALL_TESTS();
}
