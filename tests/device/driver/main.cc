// The device tier's tests. They run as root in the guest and play the device: they move lines and
// values, are the daemon's client, and look at what the kernel saw.
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>

int main(int argc, char **argv) {
  testing::InitGoogleTest(&argc, argv);
  // They write to system files and load kernel modules: never on a machine that somebody works on.
  if (access("/etc/portd-test-guest", F_OK) != 0 && !GTEST_FLAG_GET(list_tests)) {
    std::fputs("These tests run in the device tier's guest only.\n", stderr);
    return 1;
  }
  return RUN_ALL_TESTS();
}
