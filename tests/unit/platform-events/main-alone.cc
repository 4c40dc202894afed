// These tests have no bus at all.
#include <gtest/gtest.h>

#include "private-bus.h"

int main(int argc, char **argv) {
  point_system_bus_at_nothing();
  testing::InitGoogleTest(&argc, argv);
  return RUN_ALL_TESTS();
}
