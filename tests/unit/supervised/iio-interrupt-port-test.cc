// Set-up, readouts and pins of ports on the converter that watches thresholds by itself.
#include <atomic>
#include <thread>

#include "iio-interrupt-fixture.h"
#include "port/ioport-private.h"

namespace {

using Words = std::vector<std::string>;

constexpr guint kRecovery = 1000;

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
  const IOPortRef port = make_port(BACKEND_IIO_INTERRUPT, PORT_INPUT,
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
  const IOPortRef port = make_port(BACKEND_IIO_INTERRUPT, PORT_INPUT, {{"input", "pin", "1"}});
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
    const IOPortRef port = make_port(BACKEND_IIO_INTERRUPT, PORT_OUTPUT,
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
      BACKEND_IIO_INTERRUPT, PORT_INPUT,
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
  expect_control_pins_die_for_an_output(
      make(), "supervised-iio-interrupt-backend.*iio_int_set_control_pins");
}

}  // namespace
