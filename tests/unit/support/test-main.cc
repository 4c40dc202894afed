// The main function of every unit test binary.
#include <glib.h>
#include <gtest/gtest.h>

namespace {

// A test that reached for the bus would find the one of the machine that it runs on.
constexpr const char *kNoBus = "unix:path=/nonexistent/portd-unit-tests-use-no-bus";

}  // namespace

int main(int argc, char **argv) {
  g_setenv("DBUS_SYSTEM_BUS_ADDRESS", kNoBus, TRUE);
  g_setenv("DBUS_SESSION_BUS_ADDRESS", kNoBus, TRUE);
  testing::InitGoogleTest(&argc, argv);
  return RUN_ALL_TESTS();
}
