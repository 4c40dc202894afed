// The converter that watches thresholds by itself.
#include <linux/iio/events.h>
#include <unistd.h>

#include <atomic>
#include <thread>

#include "base/glib-ptr.h"
#include "base/unique-fd.h"
#include "supervised/iio-thresholds.h"
#include "supervised/supervised-backends.h"
#include "support/fake-ioctl.h"
#include "support/iio-bench.h"

namespace {

using Words = std::vector<std::string>;

constexpr guint kLimit = 1000;
constexpr guint kRecovery = 1000;

// A converter with channels 0 and 1. Its level is closed from 100 to 200, open from 201 to 300.
class Interrupt : public IioBench {
 protected:
  Interrupt() {
    fake_spidev() = {};
    make_converter(6, "comparator");
  }

  void make_converter(int device, const char *name) {
    make_threshold_converter(device, name);
    writer.reset(open_events(device));
  }

  std::string node(int device) const { return path("dev/iio:device" + std::to_string(device)); }

  static IOPortRef make(const std::vector<Property> &more = {}, PortType type = PORT_INPUT) {
    std::vector<Property> all = {{"input", "pin", "1"},
                                 {"io_ctrl", "pin", "2"},
                                 {"sio_ctrl", "pin", "3"},
                                 {"device", "driver", "comparator"}};
    if (type == PORT_CONFIGURABLE) {
      all.push_back({"output", "pin", "4"});
    }
    all.insert(all.end(), more.begin(), more.end());
    for (const Property &property : std::vector<Property>{{"range", "state", "closed"},
                                                          {"range", "lower", "100"},
                                                          {"range", "upper", "200"},
                                                          {"range", "state", "open"},
                                                          {"range", "lower", "201"},
                                                          {"range", "upper", "300"}}) {
      all.push_back(property);
    }
    return make_port(kIioInterruptKind, type, all);
  }

  static IOPortRef watched(const std::vector<Property> &more = {}) {
    IOPortRef port = make(more);
    io_port_restore_supervised(port.get(), true);
    EXPECT_TRUE(io_port_setup(port.get()));
    io_port_set_watch(port.get());
    return port;
  }

  void set_raw(int value, int channel = 0) const {
    write(attribute(6, "in_voltage" + std::to_string(channel) + "_raw"),
          std::to_string(value) + "\n");
  }

  std::string event_file(const char *name, int channel = 0) const {
    return read(attribute(6, "events/in_voltage" + std::to_string(channel) + "_thresh_" + name));
  }

  // "RISING/FALLING, enabled RISING/FALLING"
  std::string armed(int channel = 0) const {
    return event_file("rising_value", channel) + "/" + event_file("falling_value", channel) +
           ", enabled " + event_file("rising_en", channel) + "/" +
           event_file("falling_en", channel);
  }

  void send_events(int channel, int count = 1) {
    for (int i = 0; i < count; ++i) {
      const iio_event_data event = {.id = static_cast<__u16>(channel), .timestamp = 0};
      EXPECT_EQ(::write(writer.get(), &event, sizeof event), 16);
    }
    iterate();
  }

  UniqueFd writer;
};

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

TEST_F(Interrupt, ALevelThatMovesBeforeItsThresholdsAreSetIsReported) {
  const IOPortRef port = watched();
  send_events(0);
  reports();
  set_raw(250);
  texts_to_come({"150\n", "250\n"});
  send_events(0);
  EXPECT_EQ(reports(), Words{});
  EXPECT_EQ(timers(), (std::vector<guint>{kLimit}));
  expire(kLimit);
  EXPECT_EQ(reports(), (Words{"1 off"}));
  EXPECT_EQ(timers(), std::vector<guint>{});
}

TEST_F(Interrupt, ALevelThatMovesWhileItsThresholdsAreSetIsReported) {
  const IOPortRef port = watched();
  send_events(0);
  reports();
  set_raw(250);
  texts_to_come({"150\n", "150\n", "250\n"});
  send_events(0);
  EXPECT_EQ(reports(), Words{});
  EXPECT_EQ(timers(), (std::vector<guint>{kLimit}));
  expire(kLimit);
  EXPECT_EQ(reports(), (Words{"1 off"}));
  EXPECT_EQ(timers(), std::vector<guint>{});
}

TEST_F(Interrupt, SwitchedOffNothingIsReadAnyMore) {
  set_raw(50);
  const IOPortRef port = watched();
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_EQ(timers(), std::vector<guint>{});
}

TEST_F(Interrupt, ARawValueThatCannotBeReadReadsUndefinedUntilItCan) {
  const IOPortRef port = watched();
  for (const char *text : {"", "nonsense\n", "99999999999\n"}) {
    write(attribute(6, "in_voltage0_raw"), text);
    send_events(0);
    EXPECT_TRUE(was_logged("critical: Couldn't read adc value for Line\n")) << text;
    EXPECT_EQ(readout(port).substr(0, 9), "undefined");
    EXPECT_FALSE(io_port_get_state(port.get()));
    logged();
    set_raw(150);
    reports();
    expire(kRecovery);
    EXPECT_EQ(readout(port), "closed 150");
    EXPECT_EQ(reports(), (Words{"1 on"}));
    EXPECT_EQ(armed(), "200/100, enabled 1/1");
  }
}

TEST_F(Interrupt, AnEventTellsThatTheLineCannotBeRead) {
  const IOPortRef port = watched();
  add_supervised_event(port);
  send_events(0);
  EXPECT_EQ(reports(), (Words{"event closed", "1 on"}));
  remove(attribute(6, "in_voltage0_raw"));
  send_events(0);
  EXPECT_EQ(reports(), (Words{"event undefined", "1 on"}));
  set_raw(150);
  expire(kRecovery);
  EXPECT_EQ(reports(), (Words{"event closed", "1 on"}));
  EXPECT_EQ(timers(), std::vector<guint>{});
}

TEST_F(Interrupt, ALevelThatCouldNotBeReadForAMomentIsToldAgain) {
  const IOPortRef port = watched();
  add_supervised_event(port);
  send_events(0);
  reports();
  texts_to_come({"nonsense\n"});
  send_events(0);
  EXPECT_EQ(reports(), (Words{"event undefined", "1 on"}));
  EXPECT_EQ(armed(), "200/100, enabled 1/1");
  EXPECT_EQ(readout(port), "closed 150");
  expire(kLimit);
  EXPECT_EQ(reports(), (Words{"event closed", "1 on"}));
  EXPECT_EQ(timers(), std::vector<guint>{});
}

TEST_F(Interrupt, AnEventTellsThatALevelBeyondALimitCannotBeReadAnyMore) {
  set_raw(110);
  const IOPortRef port = watched({{"device", "lower_limit", "120"}});
  add_supervised_event(port);
  expire(kLimit);
  EXPECT_EQ(reports(), (Words{"event closed", "1 on"}));
  remove(attribute(6, "in_voltage0_raw"));
  expire(kLimit);
  EXPECT_EQ(reports(), (Words{"event undefined", "1 on"}));
  EXPECT_TRUE(was_logged("critical: Unable to read from port Line\n"));
}

TEST_F(Interrupt, AShortRecordEndsTheWatchUntilTheDeviceIsOpenedAnew) {
  const IOPortRef port = watched();
  send_events(0);
  reports();
  EXPECT_EQ(::write(writer.get(), "short", 5), 5);
  iterate();
  EXPECT_TRUE(was_logged("critical: read Error: Input/output error"));
  EXPECT_EQ(readout(port).substr(0, 9), "undefined");
  EXPECT_EQ(reports(), (Words{"1 on"}));
  EXPECT_EQ(descriptors("dev/iio:device6.events"), 1U);
  expire(kRecovery);
  EXPECT_EQ(reports(), (Words{"1 on"}));
  set_raw(250);
  send_events(0);
  EXPECT_EQ(reports(), (Words{"1 off"}));
}

TEST_F(Interrupt, ALostDeviceIsLookedForByAllItsPorts) {
  const IOPortRef first = watched();
  const IOPortRef second = watched({{"device", "channel", "1"}});
  send_events(0);
  send_events(1);
  reports();
  writer.reset();
  iterate();
  EXPECT_TRUE(was_logged("critical: read Error: No such device"));
  EXPECT_EQ(reports().size(), 2U);
  EXPECT_EQ(timers().size(), 2U);
  EXPECT_FALSE(g_main_context_iteration(nullptr, FALSE));
  remove("sys/bus/iio/devices/iio:device6");
  logged();
  expire(kRecovery);
  EXPECT_EQ(logged(), Words{});
  EXPECT_EQ(readout(first), "undefined 150");

  remove("dev");
  write("dev/dummy", "");
  make_converter(6, "comparator");
  expire(kRecovery);
  EXPECT_EQ(timers(), std::vector<guint>{});
  EXPECT_EQ(reports().size(), 2U);
  EXPECT_EQ(armed(0), "200/100, enabled 1/1");
  EXPECT_EQ(armed(1), "200/100, enabled 1/1");
  set_raw(250, 1);
  send_events(1);
  EXPECT_EQ(readout(second), "open 250");
}

TEST_F(Interrupt, SupervisionMayBeSwitchedWhileTheDeviceIsLost) {
  const IOPortRef port = watched();
  writer.reset();
  iterate();
  remove("sys/bus/iio/devices/iio:device6/name");
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_EQ(timers(), std::vector<guint>{});
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_EQ(timers(), (std::vector<guint>{kRecovery}));
  EXPECT_EQ(readout(port), "undefined 150");
  make_device(6, "comparator");
  expire(kRecovery);
  EXPECT_EQ(armed(), "200/100, enabled 1/1");
}

TEST_F(Interrupt, APortThatWasNotWatchedWhenItsDeviceFailedGetsEventsAgain) {
  const IOPortRef first = watched();
  const IOPortRef second = make({{"device", "channel", "1"}});
  EXPECT_TRUE(io_port_setup(second.get()));
  io_port_set_number(second.get(), 2);
  EXPECT_EQ(::write(writer.get(), "short", 5), 5);
  iterate();
  reports();
  EXPECT_TRUE(io_port_set_supervised(second.get(), true));
  set_raw(250, 1);
  send_events(1);
  EXPECT_EQ(reports(), (Words{"2 off"}));
  EXPECT_EQ(armed(1), "300/201, enabled 1/1");
  expire(kRecovery);
  EXPECT_EQ(readout(first), "closed 150");
  EXPECT_EQ(descriptors("dev/iio:device6.events"), 2U);  // the test has one
}

TEST_F(Interrupt, WithoutSupervisionALossIsForgotten) {
  const IOPortRef cached = watched();
  const IOPortRef fresh = watched({{"device", "cache_ad_value", "false"}});
  writer.reset();
  iterate();
  EXPECT_EQ(readout(cached), "undefined 150");
  EXPECT_EQ(readout(fresh), "undefined 150");
  EXPECT_TRUE(io_port_set_supervised(cached.get(), false));
  EXPECT_TRUE(io_port_set_supervised(fresh.get(), false));
  EXPECT_EQ(readout(cached), "closed 150");
  set_raw(250);
  EXPECT_EQ(readout(fresh), "open 250");
}

TEST_F(Interrupt, ReadoutsAreCachedUnlessTheDocumentSaysOtherwise) {
  const IOPortRef cached = make();
  EXPECT_TRUE(io_port_setup(cached.get()));
  EXPECT_EQ(readout(cached), "undefined 0");
  const IOPortRef fresh = make({{"device", "cache_ad_value", "false"}});
  EXPECT_TRUE(io_port_setup(fresh.get()));
  EXPECT_EQ(readout(fresh), "closed 150");
  set_raw(250);
  EXPECT_EQ(readout(fresh), "open 250");
  EXPECT_EQ(readout(cached), "undefined 0");
  remove(attribute(6, "in_voltage0_raw"));
  EXPECT_EQ(readout(fresh), "error 0: Failed to read " + path(attribute(6, "in_voltage0_raw")));
}

TEST_F(Interrupt, TheStateOfASupervisedPortIsMeasured) {
  const IOPortRef port = watched();
  EXPECT_TRUE(io_port_get_state(port.get()));
  set_raw(250);
  EXPECT_FALSE(io_port_get_state(port.get()));
  set_line(1, true);
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_TRUE(io_port_get_state(port.get()));
}

TEST_F(Interrupt, AnAdcPortIsAlwaysWatchedByRangesOfItsOwn) {
  const IOPortRef port = make({{"device", "mode", "adc"},
                               {"range", "state", "cut"},
                               {"range", "lower", "160"},
                               {"range", "upper", "140"}});
  EXPECT_FALSE(io_port_is_supervisable(port.get()));
  EXPECT_FALSE(io_port_set_supervised(port.get(), true));
  EXPECT_TRUE(io_port_setup(port.get()));
  io_port_set_watch(port.get());
  EXPECT_EQ(armed(), "200/100, enabled 1/1");
  EXPECT_TRUE(io_port_range_list(port.get()).empty());
  EXPECT_TRUE(io_port_get_state(port.get()));
  set_raw(250);
  send_events(0);
  EXPECT_EQ(reports(), (Words{"1 off"}));
  EXPECT_FALSE(io_port_get_state(port.get()));
}

TEST_F(Interrupt, TheModeCountsForTheRangesAfterIt) {
  const IOPortRef port = make_port(kIioInterruptKind, PORT_INPUT,
                                   {{"range", "state", "closed"},
                                    {"range", "lower", "1"},
                                    {"range", "upper", "2"},
                                    {"device", "mode", "adc"},
                                    {"range", "state", "open"},
                                    {"range", "lower", "3"},
                                    {"range", "upper", "4"}});
  EXPECT_EQ(io_port_range_list(port.get()), (SupervisedRanges{{SUPERVISED_STATE_CLOSED, 2, 1}}));
}

TEST_F(Interrupt, SharedSettingsAreWrittenAtSetUp) {
  write(attribute(6, "sampling_frequency"), "");
  write(attribute(6, "events/in_voltage_thresh_either_period"), "");
  write(attribute(6, "in_proximity_integration_time"), "");
  const IOPortRef port = make({{"device", "shared_samplefreq", "860"},
                               {"device", "shared_thresh_either_period", "0.01"},
                               {"device", "integration_time", "185000"}});
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_EQ(read(attribute(6, "sampling_frequency")), "860");
  EXPECT_EQ(read(attribute(6, "events/in_voltage_thresh_either_period")), "0.01");
  EXPECT_EQ(read(attribute(6, "in_proximity_integration_time")), "0.185000");

  write(attribute(6, "in_voltage_sampling_frequency"), "");
  EXPECT_TRUE(io_port_setup(make({{"device", "shared_samplefreq", "128"}}).get()));
  EXPECT_EQ(read(attribute(6, "in_voltage_sampling_frequency")), "128");
  EXPECT_EQ(read(attribute(6, "sampling_frequency")), "860");
}

TEST_F(Interrupt, ASharedSettingWithoutItsFileFailsTheSetUp) {
  for (const char *key : {"shared_samplefreq", "shared_thresh_either_period", "integration_time"}) {
    logged();
    EXPECT_FALSE(io_port_setup(make({{"device", key, "5"}}).get())) << key;
    EXPECT_TRUE(was_logged("critical: Failed to setup iio device."));
  }
  EXPECT_TRUE(io_port_setup(make({{"device", "integration_time", "0"}}).get()));
}

TEST_F(Interrupt, AMissingDeviceFailsTheSetUp) {
  EXPECT_FALSE(io_port_setup(make({{"device", "driver", "unknown"}}).get()));
  EXPECT_TRUE(was_logged("critical: Failed to find device name"));
  EXPECT_TRUE(was_logged("critical: Failed to setup sysfs"));
  EXPECT_TRUE(was_logged("critical: Failed to setup iio device."));
}

TEST_F(Interrupt, ADeviceWithoutEventsFailsTheSetUp) {
  remove("dev/iio:device6.events");
  EXPECT_FALSE(io_port_setup(make().get()));
  EXPECT_TRUE(was_logged("critical: Failed to open device: No such file or directory"));
  EXPECT_TRUE(was_logged("critical: Failed to open backend->device"));
  remove("dev/iio:device6");
  EXPECT_FALSE(io_port_setup(make().get()));
  EXPECT_TRUE(
      was_logged("critical: Failed to open device " + node(6) + ": No such file or directory"));
}

TEST_F(Interrupt, APortWithNothingButAPinIsRefusedAndHarmless) {
  const IOPortRef port = make_port(kIioInterruptKind, PORT_INPUT, {{"input", "pin", "1"}});
  EXPECT_FALSE(io_port_setup(port.get()));
  EXPECT_EQ(readout(port), "undefined 0");
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  io_port_set_watch(port.get());
  EXPECT_EQ(timers(), std::vector<guint>{});
}

TEST_F(Interrupt, BeforeAnythingIsReadTheLevelIsZero) {
  const Property device = {"device", "driver", "unknown"};
  for (const bool set_up : {false, true}) {
    const IOPortRef port = set_up ? make() : make({device});
    EXPECT_EQ(io_port_setup(port.get()), set_up);
    EXPECT_TRUE(io_port_set_supervised_range(port.get(), "short", 0, 5, nullptr));
    EXPECT_EQ(readout(port), "short 0");
  }
  const IOPortRef fresh = make({device, {"device", "cache_ad_value", "false"}});
  EXPECT_FALSE(io_port_setup(fresh.get()));
  EXPECT_EQ(readout(fresh), "error 0: Failed to read the level: no device");
}

TEST_F(Interrupt, ActionThreadsMayReadWhileTheDeviceIsFoundAnew) {
  const IOPortRef port = watched();
  std::atomic<bool> done = false;
  std::thread reader([&] {
    while (!done) {
      EXPECT_TRUE(io_port_get_state(port.get()));
      const std::string now = readout(port);
      EXPECT_TRUE(now == "closed 150" || now == "undefined 150") << now;
    }
  });
  for (int round = 0; round < 20; ++round) {
    EXPECT_EQ(::write(writer.get(), "short", 5), 5);
    iterate();
    expire(kRecovery);
  }
  done = true;
  reader.join();
  EXPECT_EQ(readout(port), "closed 150");
}

TEST_F(Interrupt, AnOutputNeedsNoConverter) {
  for (const char *mode : {"adc", "supervised"}) {
    const IOPortRef port = make_port(kIioInterruptKind, PORT_OUTPUT,
                                     {{"output", "pin", "4"}, {"device", "mode", mode}});
    EXPECT_TRUE(io_port_setup(port.get()));
    EXPECT_TRUE(io_port_set_state(port.get(), true));
    EXPECT_TRUE(io_port_get_state(port.get()));
    io_port_set_watch(port.get());
    io_port_drop(port.get());
  }
}

TEST_F(Interrupt, ThePinThatLeadsToTheConverterIsOptional) {
  const IOPortRef port = make_port(
      kIioInterruptKind, PORT_INPUT,
      {{"input", "pin", "1"}, {"io_ctrl", "pin", "2"}, {"device", "driver", "comparator"}});
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_TRUE(line(2));
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_FALSE(line(2));
}

TEST_F(Interrupt, APullUpMayStayOnWhileSupervised) {
  const IOPortRef port = make({{"device", "pullup_when_supervised", "true"}}, PORT_CONFIGURABLE);
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_TRUE(line(2) && !line(3));
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_TRUE(line(2) && line(3));
  EXPECT_TRUE(io_port_set_direction(port.get(), false));
  EXPECT_TRUE(!line(2) && !line(3));
  EXPECT_EQ(armed(), "200/100, enabled 0/0");
  EXPECT_TRUE(io_port_set_direction(port.get(), true));
  EXPECT_TRUE(line(2) && line(3));
  EXPECT_EQ(armed(), "200/100, enabled 1/1");
}

TEST_F(Interrupt, APullUpStaysOnWhenTheMeasuredPathCannotBeLeft) {
  const IOPortRef port = make({{"device", "pullup_when_supervised", "true"}});
  io_port_restore_supervised(port.get(), true);
  EXPECT_TRUE(io_port_setup(port.get()));
  break_line(3);
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_TRUE(was_logged("critical: Failed to set sioctrl pin"));
  EXPECT_TRUE(line(2) && line(3));
}

TEST_F(Interrupt, ADroppedPortHoldsNothingAndComesBackAgainAndAgain) {
  const IOPortRef port = make({{"device", "lower_limit", "120"}});
  io_port_restore_supervised(port.get(), true);
  EXPECT_TRUE(io_port_set_supervised_range(port.get(), "closed", 130, 180, nullptr));
  for (int round = 0; round < 50; ++round) {
    set_raw(150);
    ASSERT_TRUE(io_port_setup(port.get()));
    io_port_set_watch(port.get());
    ASSERT_EQ(armed(), "180/130, enabled 1/1");
    set_raw(110);
    send_events(0);
    ASSERT_EQ(timers().size(), 1U);
    reports();
    io_port_drop(port.get());
    iterate();
    ASSERT_EQ(descriptors(), 1U);  // the test's own
    ASSERT_EQ(timers(), std::vector<guint>{});
    ASSERT_EQ(armed(), "180/130, enabled 0/0");
  }
}

TEST_F(Interrupt, TheControlPinsOfAnOutputAreAProgrammingError) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  const IOPortRef port = make();
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_DEATH(
      {
        io_port_set_type(port.get(), PORT_OUTPUT);
        supervised_iio_interrupt_backend_functions(port.get())->set_direction(port.get(), true);
      },
      "supervised-iio-interrupt-backend.*iio_int_set_control_pins.*port->type == PORT_INPUT");
}

}  // namespace
