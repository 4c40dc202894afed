// Supervised inputs on an SPI converter that is polled.
#include <cerrno>
#include <map>

#include "support/mock-spi.h"
#include "support/supervised-test.h"

namespace {

constexpr int kConverter = 1;
constexpr unsigned int kCommand = 0x1F;
constexpr const char *kNoConverter = "error: com.kelv.IOSupervised.Error.Generic: ";

class SupervisedSpi : public SupervisedTest {
 protected:
  static std::string converter(const std::string &speed = "") {
    return "<device path='" + MockSpi::node(kConverter) + "'/><address value='1f'/>" + speed +
           all_ranges();
  }
  void start_input(const std::string &speed = "") {
    start(port_element("loop", 0, "input", "spi", input_pins() + converter(speed)));
  }
  static void set_level(unsigned int level) { MockSpi::set_sample(kConverter, kCommand, level); }

  MockSpi spi_;
};

TEST_F(SupervisedSpi, EveryBoundaryBelongsToItsRange) {
  start_input();
  EXPECT_EQ(client_.set_supervised(0, true), "");
  struct Step {
    unsigned int level;
    const char *state;
  };
  constexpr Step steps[] = {{0, "short"},   {499, "short"}, {500, "closed"}, {1499, "closed"},
                            {1500, "open"}, {2999, "open"}, {3000, "cut"},   {4095, "cut"}};
  for (const auto &step : steps) {
    set_level(step.level);
    EXPECT_TRUE(reads(0, step.state, step.level)) << step.level;
  }
}

TEST_F(SupervisedSpi, ALevelInNoRangeIsUndefined) {
  start_input();
  EXPECT_EQ(client_.set_range(0, "cut", 3000, 3999), "");
  set_level(4000);
  EXPECT_TRUE(reads(0, "undefined", 4000));
}

TEST_F(SupervisedSpi, PollingReportsChanges) {
  set_level(kOpen);
  start_input();
  client_.forget_changes();
  EXPECT_EQ(client_.set_supervised(0, true), "");
  EXPECT_TRUE(wait_until([&] { return client_.count_changes(0) == 1; }));
  EXPECT_EQ(client_.last_reported(0), 0);
  set_level(kClosed);
  EXPECT_TRUE(wait_until([&] { return client_.count_changes(0) == 2; }));
  EXPECT_EQ(client_.last_reported(0), 1);
  set_level(kCut);
  EXPECT_TRUE(wait_until([&] { return client_.count_changes(0) == 3; }));
  EXPECT_TRUE(MockSpi::next_messages(kConverter, 3));
  EXPECT_EQ(client_.count_changes(0), 3);
}

TEST_F(SupervisedSpi, SupervisionSwitchesThePaths) {
  start_input();
  expect_path(false);
  EXPECT_EQ(client_.set_supervised(0, true), "");
  expect_path(true);
  restart();
  expect_path(true);
  EXPECT_EQ(client_.set_supervised(0, false), "");
  expect_path(false);
  client_.forget_changes();
  sim_.pull(LINE_INPUT, true);
  EXPECT_TRUE(reports(0, true));
}

// Whichever way: for a moment neither path is on, and on the way back both are.
TEST_F(SupervisedSpi, ThePlainPathIsSwitchedBeforeTheMeasuredOne) {
  start_input();
  const std::map<int, std::string> paths{{sim_.number(LINE_IO_CTRL), "plain"},
                                         {sim_.number(LINE_SIO_CTRL), "measured"}};
  const LineHistory history;
  EXPECT_EQ(client_.set_supervised(0, true), "");
  EXPECT_EQ(LineHistory::together(paths),
            (std::vector<std::string>{"plain set 0", "measured set 1"}));
  LineHistory::forget();
  EXPECT_EQ(client_.set_supervised(0, false), "");
  EXPECT_EQ(LineHistory::together(paths),
            (std::vector<std::string>{"plain set 1", "measured set 0"}));
}

TEST_F(SupervisedSpi, AConfigurablePortLeavesBothPathsAsAnOutput) {
  set_level(kOpen);
  start(port_element("loop", 0, "io_ctrl", "spi", configurable_pins() + converter()));
  EXPECT_EQ(client_.set_direction(0, "output"), "");
  expect_no_path();
  EXPECT_EQ(client_.set_state(0, true), "");
  EXPECT_TRUE(sim_.level(LINE_OUTPUT));
  EXPECT_EQ(client_.set_supervised(0, true), "");
  EXPECT_FALSE(sim_.level(LINE_OUTPUT));
  expect_path(true);
  EXPECT_TRUE(reads(0, "open", kOpen));
}

TEST_F(SupervisedSpi, TheKernelSeesTwoTransfersAtTheDocumentsSpeed) {
  set_level(0xABC);
  start_input("<speed value='0x7A120'/>");
  EXPECT_TRUE(reads(0, "open", 0xABC));
  EXPECT_EQ(MockSpi::last_message(kConverter),
            "tx 1f 00 | len 2 speed 500000 bits 8 delay 0 cs_change 0\n"
            "rx ab c0 | len 2 speed 500000 bits 8 delay 0 cs_change 0");
}

TEST_F(SupervisedSpi, WithoutASpeedTheDevicesOwnHolds) {
  start_input();
  EXPECT_TRUE(reads(0, "short", 0));
  EXPECT_NE(MockSpi::last_message(kConverter).find("speed 1000000"), std::string::npos);
}

TEST_F(SupervisedSpi, AFailedTransferCostsTheDeviceUntilThePortIsSetUpAgain) {
  set_level(kOpen);
  start(port_element("loop", 0, "input", "spi", input_pins() + converter(), true));
  EXPECT_EQ(client_.set_supervised(0, true), "");
  EXPECT_TRUE(reads(0, "open", kOpen));
  MockSpi::set_error(kConverter, EREMOTEIO);
  EXPECT_TRUE(wait_until([&] { return Daemon::logged("Readout failed: "); }));
  MockSpi::set_error(kConverter, 0);
  const std::string state = client_.readout(0).state;
  EXPECT_TRUE(state.starts_with(kNoConverter)) << state;
  daemon_.kill_hard();
  daemon_.start();
  EXPECT_TRUE(reads(0, "open", kOpen));
}

TEST_F(SupervisedSpi, AnErrorReachesTheClientInTheSystemsWords) {
  start_input();
  MockSpi::set_error(kConverter, EREMOTEIO);
  EXPECT_EQ(client_.readout(0).state, std::string(kNoConverter) + g_strerror(EREMOTEIO));
}

}  // namespace
