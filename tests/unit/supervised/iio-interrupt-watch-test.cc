// Thresholds of the converter that watches them by itself: armed, met, shared and moved.
#include "iio-interrupt-fixture.h"
#include "supervised/iio-thresholds.h"

namespace {

using Words = std::vector<std::string>;

constexpr guint kLimit = 1000;

TEST_F(Interrupt, ThresholdsLieJustOutsideTheRange) {
  const SupervisedRange range = {SUPERVISED_STATE_CLOSED, 200, 100};
  EXPECT_EQ(plan_thresholds(range, {.hysteresis = 5}), (ThresholdPlan{true, true, 205, 95}));
  EXPECT_EQ(plan_thresholds(range, {.hysteresis = 5, .bitshift = 3}),
            (ThresholdPlan{true, true, 1640, 760}));
  EXPECT_EQ(plan_thresholds(range, {.hysteresis = 105}), (ThresholdPlan{true, true, 305, -5}));
  EXPECT_EQ(plan_thresholds(range, {.bitshift = 32}), (ThresholdPlan{true, true, 0, 0}));
  EXPECT_EQ(plan_thresholds(range, {.bitshift = -1}), (ThresholdPlan{true, true, 200, 100}));
}

TEST_F(Interrupt, WithOneThresholdTheLowerEndCountsUnlessItIsZero) {
  EXPECT_EQ(plan_thresholds({SUPERVISED_STATE_CLOSED, 200, 100},
                            {.hysteresis = 5, .one_threshold = true}),
            (ThresholdPlan{false, true, 0, 95}));
  EXPECT_EQ(
      plan_thresholds({SUPERVISED_STATE_CLOSED, 200, 0}, {.hysteresis = 5, .one_threshold = true}),
      (ThresholdPlan{true, false, 205, 0}));
}

TEST_F(Interrupt, SetUpLeavesTheEventsOff) {
  const IOPortRef port = make();
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_EQ(armed(), "1/0, enabled 0/0");
  EXPECT_EQ(descriptors("dev/iio:device6"), 0U);
  EXPECT_EQ(descriptors("dev/iio:device6.events"), 2U);  // the test has one
  EXPECT_EQ(logged(), (Words{"info: Init pin: (null)", "info: Init pin: (null)"}));
}

TEST_F(Interrupt, TheWatchArmsTheThresholdsAroundTheLevel) {
  const IOPortRef port = watched({{"device", "hysteresis", "5"}});
  EXPECT_EQ(armed(), "205/95, enabled 1/1");
  EXPECT_EQ(readout(port), "closed 150");
  EXPECT_EQ(reports(), Words{});
}

TEST_F(Interrupt, LevelsAndThresholdsAreShifted) {
  set_raw(150 << 4);
  const IOPortRef port = watched({{"device", "bitshift", "4"}});
  EXPECT_EQ(armed(), "3200/1600, enabled 1/1");
  EXPECT_EQ(readout(port), "closed 150");
}

TEST_F(Interrupt, OneFileMayServeBothSides) {
  write(attribute(6, "events/in_voltage0_thresh_either_en"), "");
  const IOPortRef port = watched();
  EXPECT_EQ(event_file("either_en"), "1");
  EXPECT_EQ(armed(), "200/100, enabled /");
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_EQ(event_file("either_en"), "0");
}

TEST_F(Interrupt, WithOneThresholdOnlyItsSideIsEnabled) {
  const IOPortRef port = watched({{"device", "one_threshold", "true"}});
  EXPECT_EQ(armed(), "1/100, enabled 0/1");
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_EQ(armed(), "1/100, enabled 0/0");
}

// A converter may have files for each side and one for both: the side that was enabled is disabled
// by its own.
TEST_F(Interrupt, OneThresholdIsDisabledByTheFileThatEnabledIt) {
  write(attribute(6, "events/in_voltage0_thresh_either_en"), "");
  const IOPortRef port = watched({{"device", "one_threshold", "true"}});
  EXPECT_EQ(armed(), "1/100, enabled 0/1");
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_EQ(armed(), "1/100, enabled 0/0");
}

TEST_F(Interrupt, WithOneThresholdARangeFromZeroIsLeftAtItsUpperEnd) {
  set_raw(50);
  const IOPortRef port = watched({{"device", "one_threshold", "true"},
                                  {"device", "hysteresis", "5"},
                                  {"range", "state", "short"},
                                  {"range", "lower", "0"},
                                  {"range", "upper", "99"}});
  EXPECT_EQ(armed(), "104/0, enabled 1/0");
  set_raw(150);
  send_events(0);
  EXPECT_EQ(armed(), "104/95, enabled 0/1");
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_EQ(armed(), "104/95, enabled 0/0");
}

TEST_F(Interrupt, OneThresholdMayBeEnabledByTheFileForBothSides) {
  write(attribute(6, "events/in_voltage0_thresh_either_en"), "");
  remove(attribute(6, "events/in_voltage0_thresh_rising_en"));
  remove(attribute(6, "events/in_voltage0_thresh_falling_en"));
  const IOPortRef port = watched({{"device", "one_threshold", "true"}});
  EXPECT_EQ(event_file("falling_value"), "100");
  EXPECT_EQ(event_file("either_en"), "1");
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_EQ(event_file("either_en"), "0");
}

TEST_F(Interrupt, ChannelsMayHaveNamesOfTheirOwn) {
  write(attribute(6, "in_proximity7_loop_raw"), "42\n");
  write(attribute(6, "events/in_proximity7_loop_thresh_rising_value"), "");
  const IOPortRef port = make({{"device", "channel", "7"},
                               {"device", "channel_name", "proximity7"},
                               {"device", "chan_extend_name", "loop"},
                               {"device", "cache_ad_value", "false"}});
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_EQ(read(attribute(6, "events/in_proximity7_loop_thresh_rising_value")), "1");
  EXPECT_EQ(readout(port), "undefined 42");
}

TEST_F(Interrupt, AnEventReportsTheNewStateAndArmsAnew) {
  const IOPortRef port = watched();
  set_raw(250);
  send_events(0);
  EXPECT_EQ(reports(), (Words{"1 off"}));
  EXPECT_EQ(armed(), "300/201, enabled 1/1");
  EXPECT_EQ(readout(port), "open 250");
}

TEST_F(Interrupt, AnEventWithoutAChangeOnlyArmsAnew) {
  const IOPortRef port = watched();
  send_events(0);
  EXPECT_EQ(reports(), (Words{"1 on"}));  // the first state is news
  write(attribute(6, "events/in_voltage0_thresh_rising_en"), "");
  send_events(0);
  EXPECT_EQ(reports(), Words{});
  EXPECT_EQ(armed(), "200/100, enabled 1/1");
}

TEST_F(Interrupt, ABurstIsWorkedOff) {
  const IOPortRef port = watched();
  set_raw(250);
  send_events(0, 500);
  EXPECT_EQ(reports(), (Words{"1 off"}));
  EXPECT_EQ(armed(), "300/201, enabled 1/1");
}

TEST_F(Interrupt, EventsOfOtherChannelsAreNobodysAffair) {
  const IOPortRef port = watched();
  set_raw(250);
  send_events(1);
  send_events(-1);
  EXPECT_EQ(reports(), Words{});
  send_events(0);
  EXPECT_EQ(reports(), (Words{"1 off"}));
}

TEST_F(Interrupt, TwoPortsShareADevice) {
  const IOPortRef first = watched();
  const IOPortRef second = watched({{"device", "channel", "1"}});
  io_port_set_number(second.get(), 2);
  EXPECT_EQ(descriptors("dev/iio:device6.events"), 2U);
  set_raw(250, 1);
  send_events(1);
  EXPECT_EQ(reports(), (Words{"2 off"}));
  EXPECT_TRUE(io_port_set_supervised(first.get(), false));
  EXPECT_EQ(armed(0), "200/100, enabled 0/0");
  set_raw(150, 1);
  send_events(1);
  EXPECT_EQ(reports(), (Words{"2 on"}));
  EXPECT_TRUE(io_port_set_supervised(second.get(), false));
  send_events(1);
  EXPECT_EQ(reports(), Words{});
}

TEST_F(Interrupt, APortThatIsDroppedLeavesTheDeviceToTheOther) {
  const IOPortRef first = watched();
  const IOPortRef second = watched({{"device", "channel", "1"}});
  io_port_drop(first.get());
  set_raw(250, 1);
  send_events(1);
  EXPECT_EQ(reports(), (Words{"1 off"}));
  io_port_drop(second.get());
  EXPECT_EQ(descriptors("dev/iio:device6.events"), 1U);
}

// The kernel numbers channels by device, the event does not say of which.
TEST_F(Interrupt, PortsOfTheSameChannelOnTwoDevicesAreBothArmedAgain) {
  make_converter(7, "second");
  const UniqueFd second_writer = std::move(writer);
  const IOPortRef other = watched({{"device", "driver", "second"}});
  writer.reset(open_events(6));
  const IOPortRef port = watched();
  io_port_set_number(port.get(), 2);
  set_raw(250);
  send_events(0);
  EXPECT_EQ(reports(), (Words{"1 on", "2 off"}));
  EXPECT_EQ(read(attribute(7, "events/in_voltage0_thresh_rising_en")), "1");
  EXPECT_EQ(armed(), "300/201, enabled 1/1");
}

TEST_F(Interrupt, BeyondALimitTheLevelIsReadAgainAfterAWhile) {
  set_raw(105);
  const IOPortRef port = watched({{"device", "lower_limit", "110"},
                                  {"device", "upper_limit", "280"},
                                  {"device", "limit_timeout", "70"}});
  EXPECT_EQ(armed(), "1/0, enabled 0/0");
  EXPECT_EQ(timers(), (std::vector<guint>{70}));
  for (const int at_limit : {110, 105, 280, 290}) {
    set_raw(at_limit);
    expire(70);
    EXPECT_EQ(armed(), "1/0, enabled 0/0") << at_limit;
    EXPECT_EQ(timers(), (std::vector<guint>{70}));
  }
  EXPECT_EQ(reports(), (Words{"1 on", "1 off"}));
  set_raw(150);
  expire(70);
  EXPECT_EQ(timers(), std::vector<guint>{});
  EXPECT_EQ(armed(), "200/100, enabled 1/1");
  EXPECT_EQ(reports(), (Words{"1 on"}));
}

TEST_F(Interrupt, ALevelInNoRangeArmsNothingAndIsReadAgain) {
  set_raw(50);
  const IOPortRef port = watched();
  EXPECT_EQ(armed(), "1/0, enabled 0/0");
  EXPECT_EQ(readout(port), "undefined 50");
  set_raw(150);
  expire(kLimit);
  EXPECT_EQ(armed(), "200/100, enabled 1/1");
  EXPECT_EQ(reports(), (Words{"1 on"}));
}

TEST_F(Interrupt, ADocumentThatAsksForNoPauseGetsTheUsualOne) {
  set_raw(50);
  const IOPortRef port = watched({{"device", "limit_timeout", "0"}});
  EXPECT_EQ(timers(), (std::vector<guint>{kLimit}));
}

TEST_F(Interrupt, NewRangesMoveTheThresholds) {
  const IOPortRef port = watched();
  EXPECT_TRUE(io_port_set_supervised_range(port.get(), "closed", 140, 160, nullptr));
  EXPECT_EQ(armed(), "160/140, enabled 1/1");
  EXPECT_EQ(reports(), Words{});
}

TEST_F(Interrupt, AStateThatNewRangesBringIsReported) {
  const IOPortRef port = watched();
  send_events(0);
  reports();
  EXPECT_TRUE(io_port_set_supervised_range(port.get(), "open", 140, 300, nullptr));
  EXPECT_EQ(armed(), "300/140, enabled 1/1");
  expire(kLimit);
  EXPECT_EQ(reports(), (Words{"1 off"}));
  EXPECT_EQ(timers(), std::vector<guint>{});
}

TEST_F(Interrupt, NewRangesOfAPortThatIsNotWatchedArmNothing) {
  const IOPortRef port = make();
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_TRUE(io_port_set_supervised_range(port.get(), "closed", 140, 160, nullptr));
  EXPECT_EQ(armed(), "1/0, enabled 0/0");
}

// A level that moves from 150 to 250 while an event is served, at the last of these reads.
class MovingLevel : public Interrupt {
 protected:
  void expect_the_move_is_reported(const std::vector<std::string> &reads) {
    const IOPortRef port = watched();
    send_events(0);
    reports();
    set_raw(250);
    texts_to_come(reads);
    send_events(0);
    EXPECT_EQ(reports(), Words{});
    EXPECT_EQ(timers(), (std::vector<guint>{kLimit}));
    expire(kLimit);
    EXPECT_EQ(reports(), (Words{"1 off"}));
    EXPECT_EQ(timers(), std::vector<guint>{});
  }
};

TEST_F(MovingLevel, BeforeItsThresholdsAreSetIsReported) {
  expect_the_move_is_reported({"150\n", "250\n"});
}

TEST_F(MovingLevel, WhileItsThresholdsAreSetIsReported) {
  expect_the_move_is_reported({"150\n", "150\n", "250\n"});
}

TEST_F(Interrupt, SwitchedOffNothingIsReadAnyMore) {
  set_raw(50);
  const IOPortRef port = watched();
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_EQ(timers(), std::vector<guint>{});
}

}  // namespace
