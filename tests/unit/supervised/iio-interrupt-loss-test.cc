// Levels that cannot be read and converters that fail, and how they come back.
#include "base/glib-ptr.h"
#include "iio-interrupt-fixture.h"

namespace {

using Words = std::vector<std::string>;

constexpr guint kLimit = 1000;
constexpr guint kRecovery = 1000;

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

}  // namespace
