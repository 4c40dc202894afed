// Levels that cannot be read and converters that fail, and how they come back.
#include "base/glib-ptr.h"
#include "iio-interrupt-fixture.h"

namespace {

using Words = std::vector<std::string>;

constexpr guint kLimit = 1000;

const Property kFresh = {"device", "cache_ad_value", "false"};

TEST_F(Interrupt, ARawValueThatCannotBeReadIsAnErrorUntilItCan) {
  const IOPortRef port = watched({kFresh});
  send_events(0);
  for (const char *text : {"", "nonsense\n", "99999999999\n"}) {
    write(attribute(6, "in_voltage0_raw"), text);
    reports();
    send_events(0);
    EXPECT_TRUE(was_logged("critical: Couldn't read adc value for Line\n")) << text;
    EXPECT_EQ(readout(port), "error 0: Failed to read " + path(attribute(6, "in_voltage0_raw")));
    EXPECT_FALSE(io_port_get_state(port.get()));
    EXPECT_EQ(reports(), (Words{"1 on"}));
    set_raw(150);
    expire_all();
    EXPECT_EQ(readout(port), "closed 150");
    EXPECT_EQ(reports(), (Words{"1 on"}));
    EXPECT_EQ(armed(), "200/100, enabled 1/1");
    EXPECT_EQ(timers(), std::vector<guint>{});
  }
}

TEST_F(Interrupt, ACachedReadoutIsTheStoredValueWhateverHappensToTheDevice) {
  const IOPortRef port = watched();
  send_events(0);
  remove(attribute(6, "in_voltage0_raw"));
  send_events(0);
  EXPECT_EQ(readout(port), "closed 150");
  writer.reset();
  iterate();
  EXPECT_EQ(readout(port), "closed 150");
}

TEST_F(Interrupt, AFreshReadoutIsReadFromTheDeviceWhateverHappenedToItsWatch) {
  const IOPortRef port = watched({kFresh});
  writer.reset();
  iterate();
  set_raw(250);
  EXPECT_EQ(readout(port), "open 250");
}

// What was opened as root is all that the service account will ever get: here opening it anew would
// fail.
TEST_F(Interrupt, AReadThatFailsCostsNothingThatIsOpen) {
  const IOPortRef first = watched();
  const IOPortRef second = watched({{"device", "channel", "1"}});
  const std::size_t open = descriptors();
  remove("dev/iio:device6");
  for (const int channel : {0, 1}) {
    write(attribute(6, "events/in_voltage" + std::to_string(channel) + "_thresh_rising_value"), "");
    texts_to_come({"", ""});
    send_events(channel);
    EXPECT_EQ(descriptors(), open);
    expire_all();
    EXPECT_EQ(armed(channel), "200/100, enabled 1/1");
  }
  set_raw(250, 1);
  send_events(1);
  EXPECT_EQ(armed(1), "300/201, enabled 1/1");
  EXPECT_EQ(descriptors(), open);
}

TEST_F(Interrupt, ALevelIsReadAgainAfterPausesThatGrowAndIsLoggedOnce) {
  const IOPortRef port = watched();
  remove(attribute(6, "in_voltage0_raw"));
  send_events(0);
  EXPECT_TRUE(was_logged("critical: Couldn't read adc value for Line\n"));
  logged();
  for (const guint pause : {1000, 2000, 4000, 8000, 16000, 16000}) {
    EXPECT_EQ(timers(), (std::vector<guint>{pause}));
    expire_all();
  }
  EXPECT_EQ(logged(), Words{});
  set_raw(150);
  expire_all();
  EXPECT_EQ(armed(), "200/100, enabled 1/1");
  remove(attribute(6, "in_voltage0_raw"));
  send_events(0);
  EXPECT_EQ(timers(), (std::vector<guint>{1000}));
}

TEST_F(Interrupt, SwitchingSupervisionOffAndOnReadsTheLevelAtOnce) {
  const IOPortRef port = watched();
  remove(attribute(6, "in_voltage0_raw"));
  send_events(0);
  set_raw(250);
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_EQ(timers(), std::vector<guint>{});
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_EQ(armed(), "300/201, enabled 1/1");
  EXPECT_EQ(timers(), std::vector<guint>{});
}

TEST_F(Interrupt, AnEventTellsThatTheLineCannotBeRead) {
  const IOPortRef port = watched({kFresh});
  add_supervised_event(port);
  send_events(0);
  EXPECT_EQ(reports(), (Words{"event closed", "1 on"}));
  remove(attribute(6, "in_voltage0_raw"));
  send_events(0);
  EXPECT_EQ(reports(), (Words{"event undefined", "1 on"}));
  set_raw(150);
  expire_all();
  EXPECT_EQ(reports(), (Words{"event closed", "1 on"}));
  EXPECT_EQ(timers(), std::vector<guint>{});
}

TEST_F(Interrupt, ALevelThatCouldNotBeReadForAMomentIsToldAgain) {
  const IOPortRef port = watched();
  send_events(0);
  EXPECT_EQ(reports(), (Words{"1 on"}));
  texts_to_come({"nonsense\n"});
  send_events(0);
  EXPECT_EQ(reports(), (Words{"1 on"}));
  EXPECT_EQ(armed(), "200/100, enabled 1/1");
  EXPECT_EQ(readout(port), "closed 150");
  expire(kLimit);
  EXPECT_EQ(reports(), (Words{"1 on"}));
  EXPECT_EQ(timers(), std::vector<guint>{});
}

TEST_F(Interrupt, AnEventTellsThatALevelBeyondALimitCannotBeReadAnyMore) {
  set_raw(110);
  const IOPortRef port = watched({kFresh, {"device", "lower_limit", "120"}});
  add_supervised_event(port);
  expire(kLimit);
  EXPECT_EQ(reports(), (Words{"event closed", "1 on"}));
  remove(attribute(6, "in_voltage0_raw"));
  expire(kLimit);
  EXPECT_EQ(reports(), (Words{"event undefined", "1 on"}));
  EXPECT_TRUE(was_logged("critical: Unable to read from port Line\n"));
}

// The file may be a folder as well: it can be opened, and no threshold be written.
TEST_F(Interrupt, ThresholdsThatCannotBeSetAreTriedAgainAndTheLevelIsReadMeanwhile) {
  for (const char *side : {"rising", "falling"}) {
    block(attribute(6, std::string("events/in_voltage0_thresh_") + side + "_en"));
  }
  const IOPortRef port = watched();
  EXPECT_TRUE(was_logged("critical: Failed to open sysfs path '" +
                         path(attribute(6, "events/in_voltage0_thresh_rising_en")) +
                         "': Is a directory"));
  EXPECT_TRUE(was_logged("warning: Port line: no thresholds can be set with " +
                         path(attribute(6, "events/in_voltage0_")) + "..."));
  EXPECT_EQ(timers(), (std::vector<guint>{1000}));
  expire_all();
  EXPECT_EQ(reports(), (Words{"1 on"}));
  set_raw(250);
  EXPECT_EQ(timers(), (std::vector<guint>{2000}));
  expire_all();
  EXPECT_EQ(reports(), (Words{"1 off"}));
}

TEST_F(Interrupt, AShortRecordEndsTheWatchForASecondAndNothingIsOpenedAnew) {
  const IOPortRef port = watched();
  send_events(0);
  reports();
  remove("dev/iio:device6");
  EXPECT_EQ(::write(writer.get(), "short", 5), 5);
  iterate();
  EXPECT_TRUE(was_logged("critical: read Error: Input/output error"));
  EXPECT_EQ(reports(), (Words{"1 on"}));
  EXPECT_EQ(descriptors("dev/iio:device6.events"), 2U);  // the test has one
  expire_all();
  EXPECT_EQ(reports(), (Words{"1 on"}));
  set_raw(250);
  send_events(0);
  EXPECT_EQ(reports(), (Words{"1 off"}));
}

TEST_F(Interrupt, ALostDeviceIsLookedForByAllItsPorts) {
  const IOPortRef first = watched({kFresh});
  const IOPortRef second = watched({kFresh, {"device", "channel", "1"}});
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
  EXPECT_EQ(readout(first).substr(0, 7), "error 0");
  logged();
  expire_all();
  EXPECT_EQ(logged(), Words{});

  remove("dev");
  write("dev/dummy", "");
  make_converter(6, "comparator");
  expire_all();
  EXPECT_EQ(timers(), std::vector<guint>{});
  EXPECT_TRUE(was_logged("warning: Port line: comparator is back"));
  EXPECT_EQ(reports().size(), 2U);
  EXPECT_EQ(armed(0), "200/100, enabled 1/1");
  EXPECT_EQ(armed(1), "200/100, enabled 1/1");
  EXPECT_EQ(descriptors("dev/iio:device6.events"), 2U);  // the test has one
  set_raw(250, 1);
  send_events(1);
  EXPECT_EQ(readout(second), "open 250");
}

TEST_F(Interrupt, ADeviceThatVanishesBetweenTwoEventsIsLookedForByItsNextRead) {
  const IOPortRef port = watched();
  std::filesystem::rename(path("sys/bus/iio/devices/iio:device6"),
                          path("sys/bus/iio/devices/iio:device9"));
  send_events(0);
  make_node(9);
  make_events(9);
  expire_all();
  EXPECT_TRUE(was_logged("warning: Port line: comparator is back"));
  EXPECT_EQ(descriptors("dev/iio:device6.events"), 1U);  // the test's
  EXPECT_EQ(read(attribute(9, "events/in_voltage0_thresh_rising_value")), "200");
}

TEST_F(Interrupt, WhatWasOpenStaysUntilTheDeviceThatIsBackCouldBeOpened) {
  const IOPortRef port = watched();
  writer.reset();
  iterate();
  remove("dev/iio:device6");
  remove("dev/iio:device6.events");
  make_node(6);
  expire_all();
  EXPECT_EQ(descriptors("dev/iio:device6.events (deleted)"), 1U);
  EXPECT_EQ(timers(), (std::vector<guint>{2000}));
  make_events(6);
  expire_all();
  EXPECT_EQ(descriptors("dev/iio:device6.events (deleted)"), 0U);
  EXPECT_EQ(armed(), "200/100, enabled 1/1");
}

TEST_F(Interrupt, SupervisionMayBeSwitchedWhileTheDeviceIsLost) {
  const IOPortRef port = watched();
  writer.reset();
  iterate();
  remove("sys/bus/iio/devices/iio:device6/name");
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_EQ(timers(), std::vector<guint>{});
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_EQ(timers(), (std::vector<guint>{1000}));
  make_device(6, "comparator");
  expire_all();
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
  expire_all();
  EXPECT_EQ(readout(first), "closed 150");
  EXPECT_EQ(descriptors("dev/iio:device6.events"), 2U);  // the test has one
}

}  // namespace
