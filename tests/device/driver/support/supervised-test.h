// What the tests of supervised inputs share: the plain line, the two control lines, and ranges.
#pragma once

#include <string>

#include "support/device-test.h"

class SupervisedTest : public DeviceTest {
 protected:
  enum Line { LINE_INPUT, LINE_OUTPUT, LINE_IO_CTRL, LINE_SIO_CTRL, LINE_COUNT };

  // Levels in the middle of the ranges of all_ranges().
  static constexpr unsigned int kShort = 100;
  static constexpr unsigned int kClosed = 1000;
  static constexpr unsigned int kOpen = 2000;
  static constexpr unsigned int kCut = 3500;

  SupervisedTest();

  // The sections of a port that is an input on these lines.
  std::string input_pins() const;
  std::string configurable_pins() const;
  static std::string all_ranges();

  // The readout becomes this state and level.
  ::testing::AssertionResult reads(unsigned int port, const std::string &state, unsigned int level);
  // Exactly one of the paths is on: the measured one or the plain one.
  void expect_path(bool measured) const;
  void expect_no_path() const;

  GpioSim sim_{"supervised", {"", "", "", ""}};
};
