// The converter that is sampled into a buffer.
#include <unistd.h>

#include <atomic>
#include <filesystem>
#include <thread>

#include "base/unique-fd.h"
#include "port/ioport-private.h"
#include "supervised/iio-sysfs.h"
#include "support/iio-bench.h"

namespace {

using Words = std::vector<std::string>;

const std::string kTrigger = "sys/bus/iio/devices/trigger4/";
const std::string kTimer = "sys/kernel/config/iio/triggers/hrtimer/pulse";

// A converter whose low level is closed (100 to 200) and whose high level is cut (3000 to 4000).
class Iio : public IioBench {
 protected:
  Iio() { make_buffered_converter(); }

  void set_type(const char *type) const {
    write(attribute(2, "scan_elements/in_voltage3_type"), std::string(type) + "\n");
  }

  static std::vector<Property> properties() {
    return {
        {"input", "pin", "1"},        {"io_ctrl", "pin", "2"},    {"sio_ctrl", "pin", "3"},
        {"device", "name", "buffer"}, {"device", "adc", "adc"},   {"device", "hrtimer", "pulse"},
        {"device", "freq", "12.50"},  {"device", "channel", "3"}, {"range", "state", "closed"},
        {"range", "lower", "100"},    {"range", "upper", "200"},  {"range", "state", "cut"},
        {"range", "lower", "3000"},   {"range", "upper", "4000"}};
  }

  static IOPortRef make(const std::vector<Property> &more = {}) {
    auto all = properties();
    all.insert(all.end(), more.begin(), more.end());
    return make_port(BACKEND_IIO, PORT_INPUT, all);
  }

  IOPortRef watched() {
    IOPortRef port = make();
    io_port_restore_supervised(port.get(), true);
    EXPECT_TRUE(io_port_setup(port.get()));
    writer.reset(open_node(2));
    io_port_set_watch(port.get());
    return port;
  }

  void sample(unsigned int level) {
    const unsigned char bytes[] = {static_cast<unsigned char>(level),
                                   static_cast<unsigned char>(level >> 8)};
    EXPECT_EQ(::write(writer.get(), bytes, sizeof bytes), 2);
    iterate();
  }

  UniqueFd writer;
};

TEST_F(Iio, SetsUpTheTimerTheTriggerAndTheBuffer) {
  const IOPortRef port = make();
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_TRUE(std::filesystem::is_directory(path(kTimer)));
  EXPECT_EQ(read(kTrigger + "sampling_frequency"), "12.50");
  EXPECT_EQ(read(attribute(5, "trigger/current_trigger")), "pulse");
  EXPECT_EQ(read(attribute(2, "scan_elements/in_voltage3_en")), "1");
  EXPECT_EQ(read(attribute(2, "buffer/enable")), "1");
  EXPECT_EQ(descriptors("dev/iio:device2"), 1U);
  EXPECT_EQ(logged(), (Words{"info: Init pin: (null)", "info: Init pin: (null)"}));
}

TEST_F(Iio, ATriggerThatIsChosenAlreadyIsLeftAlone) {
  write(attribute(5, "trigger/current_trigger"), "pulse\n");
  EXPECT_TRUE(io_port_setup(make().get()));
  EXPECT_EQ(read(attribute(5, "trigger/current_trigger")), "pulse\n");
}

TEST_F(Iio, ADeviceWithOneChannelMayNotNumberIt) {
  write(attribute(2, "scan_elements/in_voltage_en"), "");
  write(attribute(2, "scan_elements/in_voltage_type"), "be:u12/16>>4\n");
  EXPECT_TRUE(io_port_setup(make().get()));
  EXPECT_EQ(read(attribute(2, "scan_elements/in_voltage_en")), "1");
  EXPECT_EQ(read(attribute(2, "scan_elements/in_voltage3_en")), "");
}

TEST_F(Iio, ADeviceThatIsMissingFailsTheSetUp) {
  remove("sys/bus/iio/devices/iio:device5");
  EXPECT_FALSE(io_port_setup(make().get()));
  EXPECT_TRUE(was_logged("critical: Failed to find device name: 2 -1"));
  EXPECT_TRUE(was_logged("critical: Failed to setup iio device."));
}

TEST_F(Iio, WithoutAnyConverterTheSetUpFails) {
  remove("sys/bus/iio");
  EXPECT_FALSE(io_port_setup(make().get()));
  EXPECT_TRUE(was_logged("critical: Failed to find device name: -1 -1"));
}

TEST_F(Iio, AFolderWithAnOddNameIsPassedOver) {
  write("sys/bus/iio/devices/iio:devicex/name", "buffer\n");
  EXPECT_TRUE(io_port_setup(make().get()));
}

TEST_F(Iio, AMissingTriggerFailsTheSetUp) {
  remove("sys/bus/iio/devices/trigger4");
  EXPECT_FALSE(io_port_setup(make().get()));
  EXPECT_TRUE(was_logged("critical: Failed to find trigger"));
}

TEST_F(Iio, ATypeThatCannotBeReadFailsTheSetUp) {
  for (const char *type : {"", "garbage", "le:u12", "le:u12/0>>0"}) {
    set_type(type);
    logged();
    EXPECT_FALSE(io_port_setup(make().get())) << type;
    EXPECT_TRUE(was_logged("critical: Failed to find device type: " +
                           path(attribute(2, "scan_elements/in_voltage3_type"))));
  }
  remove(attribute(2, "scan_elements/in_voltage3_type"));
  EXPECT_FALSE(io_port_setup(make().get()));
}

TEST_F(Iio, ANodeThatCannotBeOpenedFailsTheSetUp) {
  remove("dev/iio:device2");
  EXPECT_FALSE(io_port_setup(make().get()));
  EXPECT_TRUE(was_logged("critical: Failed to open device: No such file or directory"));
}

TEST_F(Iio, APortWithNothingButPinsIsRefused) {
  const IOPortRef port =
      make_port(BACKEND_IIO, PORT_INPUT, {{"input", "pin", "1"}, {"sio_ctrl", "pin", "3"}});
  EXPECT_FALSE(io_port_setup(port.get()));
  EXPECT_EQ(readout(port), "undefined 0");
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  iterate();
}

TEST_F(Iio, ARefusedAttributeIsLoggedAndSetUpGoesOn) {
  block(attribute(2, "buffer/enable"));
  EXPECT_TRUE(io_port_setup(make().get()));
  EXPECT_TRUE(was_logged("critical: Failed to open sysfs path '" +
                         path(attribute(2, "buffer/enable")) + "': Is a directory"));
}

TEST_F(Iio, AnOutputNeedsNoConverter) {
  const IOPortRef port = make_port(BACKEND_IIO, PORT_OUTPUT, {{"output", "pin", "4"}});
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_TRUE(io_port_set_state(port.get(), true));
  EXPECT_TRUE(line(4));
}

TEST_F(Iio, BeforeTheFirstSampleTheLevelIsZero) {
  const IOPortRef port =
      make({{"range", "state", "short"}, {"range", "lower", "0"}, {"range", "upper", "5"}});
  EXPECT_EQ(readout(port), "short 0");
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_EQ(readout(port), "short 0");
}

TEST_F(Iio, ActionThreadsMayAskWhileSamplesCome) {
  const IOPortRef port = watched();
  sample(150);
  std::atomic<bool> done = false;
  std::thread reader([&] {
    while (!done) {
      const std::string now = readout(port);
      EXPECT_TRUE(now == "closed 150" || now == "undefined 150") << now;
    }
  });
  for (int round = 0; round < 200; ++round) {
    EXPECT_EQ(::write(writer.get(), "x", 1), 1);
    iterate();
    sample(150);
  }
  done = true;
  reader.join();
}

TEST_F(Iio, ChangesOfTheSampledStateAreReported) {
  const IOPortRef port = watched();
  sample(150);
  EXPECT_EQ(reports(), (Words{"1 on"}));
  EXPECT_EQ(readout(port), "closed 150");
  sample(160);
  EXPECT_EQ(reports(), Words{});
  EXPECT_EQ(readout(port), "closed 160");
  sample(3500);
  EXPECT_EQ(reports(), (Words{"1 on"}));
  sample(10);
  EXPECT_EQ(reports(), (Words{"1 on"}));
  EXPECT_EQ(readout(port), "undefined 10");
}

TEST_F(Iio, TheExtraShiftComesLast) {
  const IOPortRef port = make({{"device", "shift", "2"}});
  io_port_restore_supervised(port.get(), true);
  EXPECT_TRUE(io_port_setup(port.get()));
  writer.reset(open_node(2));
  io_port_set_watch(port.get());
  sample(0x3FF);
  EXPECT_EQ(readout(port), "undefined 255");
}

TEST_F(Iio, NothingIsReadWithoutSupervision) {
  const IOPortRef port = watched();
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  reports();
  sample(150);
  EXPECT_EQ(readout(port), "undefined 0");
  EXPECT_EQ(reports(), Words{});
}

// The kernel's buffer is full of what the line was when it was last free.
TEST_F(Iio, SamplesThatWereQueuedWhileNobodyWatchedAreNoNews) {
  const IOPortRef port = watched();
  const std::string queued(10000, '\x0d');
  for (int round = 0; round < 2; ++round) {
    EXPECT_TRUE(io_port_set_supervised(port.get(), false));
    EXPECT_EQ(::write(writer.get(), queued.data(), queued.size()), 10000);
    reports();
    EXPECT_TRUE(io_port_set_supervised(port.get(), true));
    iterate();
    EXPECT_EQ(reports(), Words{});
    sample(150);
    EXPECT_EQ(reports(), (Words{"1 on"}));
    EXPECT_EQ(readout(port), "closed 150");
  }
}

TEST_F(Iio, AShortSampleReadsUndefinedAndTheNextOneCounts) {
  const IOPortRef port = watched();
  sample(150);
  reports();
  EXPECT_EQ(::write(writer.get(), "x", 1), 1);
  iterate();
  EXPECT_TRUE(was_logged("critical: read Error: Input/output error"));
  EXPECT_TRUE(was_logged("critical: Readout failed: Input/output error"));
  EXPECT_EQ(reports(), (Words{"1 on"}));
  sample(150);
  EXPECT_EQ(reports(), (Words{"1 on"}));
}

TEST_F(Iio, AnEventTellsThatASampleCouldNotBeRead) {
  const IOPortRef port = watched();
  add_supervised_event(port);
  sample(150);
  EXPECT_EQ(reports(), (Words{"event closed", "1 on"}));
  EXPECT_EQ(::write(writer.get(), "x", 1), 1);
  iterate();
  EXPECT_EQ(reports(), (Words{"event undefined", "1 on"}));
  EXPECT_EQ(readout(port), "undefined 150");
  EXPECT_EQ(::write(writer.get(), "x", 1), 1);
  iterate();
  EXPECT_EQ(reports(), Words{});
  sample(160);
  EXPECT_EQ(reports(), (Words{"event closed", "1 on"}));
}

// The last writer of a FIFO going away looks as a device does that goes away: POLLHUP, end of file.
TEST_F(Iio, ALostDeviceReadsUndefinedAndIsLookedForAfterPausesThatGrow) {
  const IOPortRef port = watched();
  sample(150);
  reports();
  writer.reset();
  iterate();
  EXPECT_TRUE(was_logged("critical: read Error: No such device"));
  EXPECT_EQ(reports(), (Words{"1 on"}));
  EXPECT_EQ(readout(port), "undefined 150");
  EXPECT_EQ(io_port_get_supervised_state(port.get()), SUPERVISED_STATE_UNDEFINED);
  EXPECT_FALSE(g_main_context_iteration(nullptr, FALSE));

  remove("sys/bus/iio/devices/iio:device2");
  logged();
  for (const guint pause : {1000, 2000, 4000, 8000, 16000, 16000}) {
    EXPECT_EQ(timers(), (std::vector<guint>{pause}));
    expire_all();
  }
  EXPECT_EQ(logged(), Words{});

  make_device(2, "buffer");
  write(attribute(2, "scan_elements/in_voltage3_en"), "");
  write(attribute(2, "buffer/enable"), "");
  writer.reset(open_node(2));
  expire_all();
  EXPECT_EQ(logged(), (Words{"warning: Port line: buffer is back"}));
  EXPECT_EQ(timers(), std::vector<guint>{});
  EXPECT_EQ(read(attribute(2, "buffer/enable")), "1");
  EXPECT_EQ(readout(port), "undefined 150");
  sample(150);
  EXPECT_EQ(reports(), (Words{"1 on"}));
  EXPECT_EQ(readout(port), "closed 150");
}

TEST_F(Iio, WhatWasOpenStaysUntilTheDeviceThatIsBackCouldBeOpened) {
  const IOPortRef port = watched();
  writer.reset();
  remove("dev/iio:device2");
  iterate();
  expire_all();
  EXPECT_TRUE(was_logged("critical: Failed to open device: No such file or directory"));
  EXPECT_EQ(descriptors("dev/iio:device2 (deleted)"), 1U);
  make_node(2);
  writer.reset(open_node(2));
  expire_all();
  EXPECT_EQ(descriptors("dev/iio:device2 (deleted)"), 0U);
  sample(150);
  EXPECT_EQ(readout(port), "closed 150");
}

// The kernel lets one user at a time have the device.
TEST_F(Iio, SetUpAnewThePortGivesItsDeviceBackFirst) {
  const IOPortRef port = watched();
  remove("dev/iio:device2");
  EXPECT_FALSE(io_port_setup(port.get()));
  EXPECT_EQ(descriptors("dev/iio:device2 (deleted)"), 1U);  // the test's
}

TEST_F(Iio, AReadThatFailsCostsNothingThatIsOpen) {
  const IOPortRef port = watched();
  sample(150);
  remove("dev/iio:device2");
  const std::size_t open = descriptors();
  break_reads("dev/iio:device2 (deleted)");
  sample(160);
  EXPECT_TRUE(was_logged("critical: read Error: Input/output error"));
  EXPECT_TRUE(was_logged("critical: Readout failed: Input/output error"));
  EXPECT_EQ(readout(port), "undefined 150");
  EXPECT_FALSE(g_main_context_iteration(nullptr, FALSE));
  logged();
  for (const guint pause : {1000, 2000}) {
    EXPECT_EQ(timers(), (std::vector<guint>{pause}));
    expire_all();
  }
  EXPECT_EQ(logged(), Words{});
  mend_lines();
  expire_all();
  EXPECT_EQ(descriptors(), open);
  sample(170);
  EXPECT_EQ(readout(port), "closed 170");
}

TEST_F(Iio, ADeviceWhoseSamplesEndIsLost) {
  remove("dev/iio:device2");
  write("dev/iio:device2", std::string_view("\x96\0", 2));
  const IOPortRef port = make();
  io_port_restore_supervised(port.get(), true);
  EXPECT_TRUE(io_port_setup(port.get()));
  io_port_set_watch(port.get());
  iterate();
  EXPECT_EQ(reports(), Words{});
  EXPECT_TRUE(was_logged("critical: read Error: No such device"));
  EXPECT_EQ(readout(port), "undefined 0");
  EXPECT_EQ(timers(), (std::vector<guint>{1000}));
  EXPECT_FALSE(g_main_context_iteration(nullptr, FALSE));
}

TEST_F(Iio, SupervisionMayBeSwitchedWhileTheDeviceIsLost) {
  const IOPortRef port = watched();
  sample(150);
  writer.reset();
  iterate();
  EXPECT_EQ(timers(), (std::vector<guint>{1000}));
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_EQ(timers(), std::vector<guint>{});
  writer.reset(open_node(2));
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  sample(160);
  EXPECT_EQ(readout(port), "closed 160");
}

TEST_F(Iio, WithoutSupervisionALossIsForgotten) {
  const IOPortRef port = watched();
  sample(150);
  writer.reset();
  iterate();
  EXPECT_EQ(readout(port), "undefined 150");
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_EQ(readout(port), "closed 150");
}

TEST_F(Iio, ADroppedPortHoldsNothingAndComesBackAgainAndAgain) {
  const IOPortRef port = make();
  EXPECT_TRUE(io_port_set_supervised_range(port.get(), "closed", 1, 2, nullptr));
  io_port_restore_supervised(port.get(), true);
  for (int round = 0; round < 50; ++round) {
    ASSERT_TRUE(io_port_setup(port.get()));
    writer.reset(open_node(2));
    io_port_set_watch(port.get());
    sample(2);
    ASSERT_EQ(readout(port), "closed 2");
    writer.reset();
    io_port_drop(port.get());
    iterate();
    ASSERT_EQ(descriptors(), 0U);
    ASSERT_EQ(timers(), std::vector<guint>{});
  }
}

using IioDeath = Iio;

TEST_F(IioDeath, AConverterOfAnotherKindEndsTheDaemon) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  const std::pair<const char *, const char *> cases[] = {
      {"le:s12/16>>4", "backend->iio_type.sign == 'u'"},
      {"le:u40/32>>4", "backend->iio_type.bits <= 32"},
      {"le:u12/64>>4", "backend->iio_type.size <= 32"},
      {"le:u12/12>>0", "backend->iio_type.size % 8 == 0"},
  };
  for (const auto &[type, message] : cases) {
    set_type(type);
    EXPECT_DEATH(io_port_setup(make().get()), message) << type;
  }
}

TEST_F(IioDeath, TheControlPinsOfAnOutputAreAProgrammingError) {
  expect_control_pins_die_for_an_output(make(), "supervised-iio-backend.*iio_set_control_pins");
}

TEST_F(Iio, OnlyTwoKindsOfEntriesAreKnown) {
  EXPECT_EQ(iio_find_number("buffer", IIO_KIND_DEVICE), 2);
  EXPECT_EQ(iio_find_number("pulse", IIO_KIND_TRIGGER), 4);
  EXPECT_EQ(iio_find_number("pulse", IIO_KIND_DEVICE), -1);
  EXPECT_EQ(iio_find_number("pulse", 2), -1);
  EXPECT_EQ(iio_find_number("", IIO_KIND_DEVICE), -1);
}

TEST_F(Iio, AttributesAreCutAtTheirLastNewline) {
  write("attribute", "one\ntwo\nthree");
  EXPECT_EQ(sysfs_read(path("attribute")), "one\ntwo");
  write("attribute", "one");
  EXPECT_EQ(sysfs_read(path("attribute")), "one");
}

TEST_F(Iio, FlagsAreOneDigit) {
  write("flag", "");
  EXPECT_EQ(sysfs_write_number(path("flag"), 1), SysfsWrite::kDone);
  EXPECT_EQ(read("flag"), "1");
  EXPECT_EQ(sysfs_write_number(path("flag"), 10), SysfsWrite::kDone);
  EXPECT_EQ(read("flag"), "1");
  EXPECT_EQ(sysfs_write(path("nowhere/flag"), "1"), SysfsWrite::kNotOpened);
}

}  // namespace
