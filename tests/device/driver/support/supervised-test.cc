#include "support/supervised-test.h"

namespace {

std::string range(const char *state, unsigned int lower, unsigned int upper) {
  return std::string("<range state='") + state + "' lower='" + std::to_string(lower) + "' upper='" +
         std::to_string(upper) + "'/>";
}

}  // namespace

// The daemon leaves the direction of the line to the measured path as it finds it.
SupervisedTest::SupervisedTest() {
  sim_.export_low(LINE_SIO_CTRL);
}

std::string SupervisedTest::input_pins() const {
  return "<input pin='" + sim_.number_text(LINE_INPUT) + "'/><io_ctrl pin='" +
         sim_.number_text(LINE_IO_CTRL) + "'/><sio_ctrl pin='" + sim_.number_text(LINE_SIO_CTRL) +
         "'/>";
}

std::string SupervisedTest::configurable_pins() const {
  return input_pins() + "<output pin='" + sim_.number_text(LINE_OUTPUT) + "'/>";
}

std::string SupervisedTest::all_ranges() {
  return range("short", 0, 499) + range("closed", 500, 1499) + range("open", 1500, 2999) +
         range("cut", 3000, 4095);
}

::testing::AssertionResult SupervisedTest::reads(unsigned int port, const std::string &state,
                                                 unsigned int level) {
  const Readout wanted{.state = state, .level = level};
  if (wait_until([&] { return client_.readout(port) == wanted; })) {
    return ::testing::AssertionSuccess();
  }
  const Readout readout = client_.readout(port);
  return ::testing::AssertionFailure() << "it reads " << readout.state << " " << readout.level;
}

void SupervisedTest::expect_path(bool measured) const {
  EXPECT_EQ(sim_.level(LINE_SIO_CTRL), measured);
  EXPECT_EQ(sim_.level(LINE_IO_CTRL), !measured);
}

void SupervisedTest::expect_no_path() const {
  EXPECT_FALSE(sim_.level(LINE_SIO_CTRL));
  EXPECT_FALSE(sim_.level(LINE_IO_CTRL));
}
