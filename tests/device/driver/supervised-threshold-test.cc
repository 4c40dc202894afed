// Supervised inputs on a converter that raises events beyond thresholds.
#include <sys/stat.h>

#include <memory>

#include "support/device-manager.h"
#include "support/mock-iio.h"
#include "support/rights.h"
#include "support/supervised-test.h"

namespace {

constexpr int kPorts = 3;
constexpr int kIdlePercent = 5;
constexpr int kIdleTime = 1000;  // milliseconds
constexpr int kHysteresis = 5;

class Thresholds : public SupervisedTest {
 protected:
  void plug_in(const std::string &parameters = "") { iio_ = std::make_unique<MockIio>(parameters); }

  // Each port has a plain line of its own. Sections: the "device" element's further attributes.
  std::string port(int number, int channel, const std::string &device = "",
                   const std::string &ranges = all_ranges(), bool optional = false,
                   const std::string &driver = "mock-adc0") const {
    return port_element("loop" + std::to_string(number), number, "input", "iio-interrupt",
                        "<input pin='" + plain_.number_text(number) + "'/><device driver='" +
                            driver + "' channel='" + std::to_string(channel) + "' hysteresis='" +
                            std::to_string(kHysteresis) + "' cache_ad_value='false' " + device +
                            "/>" + ranges,
                        optional);
  }
  void supervise_all(int ports) {
    for (int i = 0; i < ports; ++i) {
      ASSERT_EQ(client_.set_supervised(i, true), "");
    }
    client_.forget_changes();
  }
  // Both sides of the channel's thresholds, as the kernel has them: {falling, rising}.
  static std::pair<int, int> thresholds(int channel) {
    return {MockIio::event_attribute(channel, "thresh_falling_value"),
            MockIio::event_attribute(channel, "thresh_rising_value")};
  }
  // Which sides are enabled: {falling, rising}.
  static std::pair<int, int> enabled(int channel) {
    return {MockIio::event_attribute(channel, "thresh_falling_en"),
            MockIio::event_attribute(channel, "thresh_rising_en")};
  }
  static bool becomes_enabled(int channel, std::pair<int, int> sides) {
    return wait_until([&] { return enabled(channel) == sides; });
  }
  // The port's state changed once more than before, to that state.
  ::testing::AssertionResult changes(int port, int count, const std::string &state,
                                     unsigned int level) {
    if (!wait_until([&] { return client_.count_changes(port) >= count; })) {
      return ::testing::AssertionFailure() << "change " << count << " is not reported";
    }
    return reads(port, state, level);
  }

  GpioSim plain_{"plain", {"", "", ""}};
  std::unique_ptr<MockIio> iio_;
};

TEST_F(Thresholds, AreSetAroundTheRangeThatTheLevelIsIn) {
  plug_in();
  MockIio::set_value(0, kClosed);
  start(port(0, 0));
  EXPECT_EQ(enabled(0), std::make_pair(0, 0));
  supervise_all(1);
  EXPECT_EQ(thresholds(0), std::make_pair(500 - kHysteresis, 1499 + kHysteresis));
  EXPECT_EQ(enabled(0), std::make_pair(1, 1));
  MockIio::set_value(0, kOpen);
  EXPECT_TRUE(reads(0, "open", kOpen));
  EXPECT_TRUE(wait_until(
      [] { return thresholds(0) == std::make_pair(1500 - kHysteresis, 2999 + kHysteresis); }));
  EXPECT_TRUE(becomes_enabled(0, {1, 1}));
  EXPECT_EQ(client_.set_supervised(0, false), "");
  EXPECT_EQ(enabled(0), std::make_pair(0, 0));
}

TEST_F(Thresholds, AreShiftedForTheConverter) {
  plug_in();
  MockIio::set_value(0, kClosed << 4);
  start(port(0, 0, "bitshift='4'"));
  supervise_all(1);
  EXPECT_EQ(thresholds(0), std::make_pair((500 - kHysteresis) << 4, (1499 + kHysteresis) << 4));
  MockIio::set_value(0, kCut << 4);
  EXPECT_TRUE(changes(0, 1, "cut", kCut));
}

TEST_F(Thresholds, RiseAndFallOnSeveralChannelsOfOneDevice) {
  plug_in();
  std::string ports;
  for (int i = 0; i < kPorts; ++i) {
    MockIio::set_value(i, kOpen);
    ports += port(i, i);
  }
  start(ports);
  supervise_all(kPorts);
  struct Step {
    int port;
    unsigned int level;
    const char *state;
  };
  constexpr Step steps[] = {{0, kCut, "cut"},       {1, kClosed, "closed"}, {2, kShort, "short"},
                            {0, kClosed, "closed"}, {2, kOpen, "open"},     {1, kCut, "cut"}};
  int seen[kPorts] = {};
  for (const auto &step : steps) {
    MockIio::set_value(step.port, static_cast<int>(step.level));
    EXPECT_TRUE(changes(step.port, ++seen[step.port], step.state, step.level));
  }
  for (int i = 0; i < kPorts; ++i) {
    EXPECT_EQ(client_.count_changes(i), seen[i]) << "port " << i;
  }
}

TEST_F(Thresholds, PortsThatShareAChannelBothFollowIt) {
  plug_in();
  MockIio::set_value(1, kOpen);
  start(port(0, 1) + port(1, 1));
  supervise_all(2);
  MockIio::set_value(1, kClosed);
  EXPECT_TRUE(changes(0, 1, "closed", kClosed));
  EXPECT_TRUE(changes(1, 1, "closed", kClosed));
}

// More events than the kernel's queue holds, from several channels at once.
TEST_F(Thresholds, BurstsEndInTheRightState) {
  plug_in();
  start(port(0, 0) + port(1, 1) + port(2, 2));
  supervise_all(kPorts);
  constexpr unsigned int levels[] = {kShort, kClosed, kOpen, kCut};
  constexpr int bursts = 25;
  constexpr int writes = 30;
  const char *const states[] = {"short", "closed", "open", "cut"};
  for (int burst = 0; burst < bursts; ++burst) {
    for (int i = 0; i < writes; ++i) {
      MockIio::set_value(i % kPorts, static_cast<int>(levels[(i * 7 + burst) % 4]));
    }
    for (int i = 0; i < kPorts; ++i) {
      const int last = (burst + i) % 4;
      MockIio::set_value(i, static_cast<int>(levels[last]));
    }
    for (int i = 0; i < kPorts; ++i) {
      const int last = (burst + i) % 4;
      ASSERT_TRUE(reads(i, states[last], levels[last])) << "burst " << burst << " port " << i;
      ASSERT_TRUE(becomes_enabled(i, {1, 1})) << "burst " << burst << " port " << i;
    }
  }
  // What was reported last is what the line reads: "open" alone is no active state.
  for (int i = 0; i < kPorts; ++i) {
    EXPECT_TRUE(reports(i, client_.readout(i).state != "open")) << "port " << i;
  }
  EXPECT_LE(daemon_.load_percent(kIdleTime), kIdlePercent);
}

TEST_F(Thresholds, AtALimitTheLevelIsReadAgainAfterAWhile) {
  plug_in();
  MockIio::set_value(0, 40);
  start(port(0, 0, "lower_limit='50' upper_limit='4000' limit_timeout='100'"));
  supervise_all(1);
  EXPECT_EQ(enabled(0), std::make_pair(0, 0));
  // No event tells of this one.
  MockIio::set_value(0, kClosed);
  EXPECT_TRUE(changes(0, 1, "closed", kClosed));
  EXPECT_TRUE(becomes_enabled(0, {1, 1}));
  MockIio::set_value(0, 4050);
  EXPECT_TRUE(changes(0, 2, "cut", 4050));
  EXPECT_TRUE(becomes_enabled(0, {0, 0}));
  MockIio::set_value(0, kOpen);
  EXPECT_TRUE(changes(0, 3, "open", kOpen));
}

TEST_F(Thresholds, OneThresholdWatchesOneSide) {
  plug_in();
  MockIio::set_value(0, 10);
  const std::string ranges =
      "<range state='closed' lower='0' upper='99'/><range state='open' lower='100' upper='4000'/>";
  start(port(0, 0, "one_threshold='true'", ranges));
  supervise_all(1);
  EXPECT_EQ(enabled(0), std::make_pair(0, 1));
  EXPECT_EQ(thresholds(0).second, 99 + kHysteresis);
  MockIio::set_value(0, 300);
  EXPECT_TRUE(reads(0, "open", 300));
  EXPECT_TRUE(becomes_enabled(0, {1, 0}));
  EXPECT_EQ(thresholds(0).first, 100 - kHysteresis);
  client_.forget_changes();
  MockIio::set_value(0, 20);
  EXPECT_TRUE(changes(0, 1, "closed", 20));
}

TEST_F(Thresholds, AConverterMayHaveOneEnableBitForBothSides) {
  plug_in("either=1");
  MockIio::set_value(0, kOpen);
  start(port(0, 0));
  supervise_all(1);
  EXPECT_EQ(MockIio::event_attribute(0, "thresh_either_en"), 1);
  MockIio::set_value(0, kClosed);
  EXPECT_TRUE(changes(0, 1, "closed", kClosed));
  MockIio::set_value(0, kCut);
  EXPECT_TRUE(changes(0, 2, "cut", kCut));
}

TEST_F(Thresholds, SharedSettingsReachTheConverter) {
  plug_in();
  start(port(0, 0,
             "shared_samplefreq='125' shared_thresh_either_period='7' integration_time='5000'"));
  EXPECT_EQ(read_number(MockIio::folder() + "in_voltage_sampling_frequency"), 125);
  EXPECT_EQ(read_number(MockIio::folder() + "events/in_voltage_thresh_either_period"), 7);
  EXPECT_EQ(read_text(MockIio::folder() + "in_proximity_integration_time"), "0.005000");
}

TEST_F(Thresholds, AFrequencyForTheWholeDeviceIsFoundAsWell) {
  plug_in("shared_frequency=1");
  start(port(0, 0, "shared_samplefreq='50'"));
  EXPECT_EQ(read_number(MockIio::folder() + "sampling_frequency"), 50);
}

TEST_F(Thresholds, AnAdcPortIsWatchedWithoutSupervision) {
  plug_in();
  MockIio::set_value(0, kOpen);
  start(port(0, 0, "mode='adc'"));
  EXPECT_FALSE(client_.state(0));
  EXPECT_NE(client_.set_supervised(0, true), "");
  client_.forget_changes();
  MockIio::set_value(0, kClosed);
  EXPECT_TRUE(reports(0, true));
  EXPECT_TRUE(client_.state(0));
}

TEST_F(Thresholds, TwoConvertersDoNotDisturbEachOther) {
  plug_in("devices=2");
  MockIio::set_value(0, kOpen, 0);
  MockIio::set_value(0, kOpen, 1);
  start(port(0, 0) + port(1, 0, "", all_ranges(), false, "mock-adc1"));
  supervise_all(2);
  MockIio::set_value(0, kClosed, 1);
  EXPECT_TRUE(changes(1, 1, "closed", kClosed));
  EXPECT_EQ(client_.readout(0), (Readout{.state = "open", .level = kOpen}));
  MockIio::set_value(0, kCut, 0);
  EXPECT_TRUE(reports(0, true));
  EXPECT_TRUE(reads(0, "cut", kCut));
  EXPECT_TRUE(reads(1, "closed", kClosed));
}

TEST_F(Thresholds, EventsThatSomebodyElseHasFailTheSetUp) {
  plug_in();
  const UniqueFd events = MockIio::take_events();
  ASSERT_TRUE(events);
  start(port(0, 0, "", all_ranges(), true));
  EXPECT_TRUE(Daemon::logged("Failed to open device: " + std::string(g_strerror(EBUSY))));
  EXPECT_TRUE(Daemon::logged("Failed to setup iio device."));
  EXPECT_TRUE(client_.ports().empty());
}

TEST_F(Thresholds, TheLastDroppedPortGivesTheEventsBack) {
  plug_in();
  MockIio::set_value(0, kOpen);
  start(port(0, 0, "", all_ranges(), true) + port(1, 1, "", all_ranges(), true));
  supervise_all(2);
  EXPECT_EQ(client_.drop("loop0"), std::vector<std::string>{"loop0"});
  EXPECT_EQ(enabled(0), std::make_pair(0, 0));
  EXPECT_FALSE(MockIio::take_events());
  MockIio::set_value(1, kClosed);
  EXPECT_TRUE(reads(1, "closed", kClosed));
  EXPECT_EQ(client_.drop("loop1"), std::vector<std::string>{"loop1"});
  EXPECT_TRUE(MockIio::take_events());
}

TEST_F(Thresholds, ADeviceThatGoesIsAnErrorAndCostsNothing) {
  plug_in();
  MockIio::set_value(0, kClosed);
  start(port(0, 0));
  supervise_all(1);
  MockIio::unplug();
  EXPECT_TRUE(wait_until([&] { return client_.readout(0).state.starts_with("error: "); }));
  EXPECT_LE(daemon_.load_percent(kIdleTime), kIdlePercent);
}

// The daemon opened everything as root and is the service account now, which may open nothing of
// the converter: its node and its attributes are root's.
class ThresholdsOfTheKernel : public Thresholds {
 protected:
  void expect_no_rights() const {
    for (const std::string &file :
         {MockIio::node(), MockIio::folder() + "events/in_voltage0_thresh_rising_en"}) {
      struct stat status {};
      EXPECT_EQ(stat(file.c_str(), &status), 0) << file;
      EXPECT_EQ(status.st_uid, 0U) << file;
      EXPECT_EQ(status.st_mode & (S_IWGRP | S_IWOTH), 0U) << file;
    }
  }
  // Two watched channels of a converter that goes away and comes back.
  void start_and_replug() {
    plug_in();
    start(port(0, 0) + port(1, 1));
    supervise_all(2);
    MockIio::unplug();
    EXPECT_TRUE(wait_until([] { return Daemon::logged("read Error: "); }));
    MockIio::plug();
  }
  void expect_both_watched() {
    for (const int channel : {0, 1}) {
      EXPECT_TRUE(becomes_enabled(channel, {1, 1})) << channel;
      MockIio::set_value(channel, kCut);
      EXPECT_TRUE(reads(channel, "cut", kCut));
    }
  }
};

TEST_F(ThresholdsOfTheKernel, ReadsThatFailCostNothing) {
  plug_in();
  MockIio::set_value(0, kOpen);
  MockIio::set_value(1, kOpen);
  start(port(0, 0) + port(1, 1));
  expect_no_rights();
  supervise_all(2);
  for (const int channel : {0, 1}) {
    MockIio::fail_reads(4);
    MockIio::set_value(channel, kCut);
    EXPECT_TRUE(wait_until([] { return MockIio::reads_to_fail() == 0; }));
    EXPECT_TRUE(reads(channel, "cut", kCut));
    EXPECT_TRUE(becomes_enabled(channel, {1, 1}));
    client_.forget_changes();
    MockIio::set_value(channel, kOpen);
    EXPECT_TRUE(changes(channel, 1, "open", kOpen));
  }
}

TEST_F(ThresholdsOfTheKernel, SwitchedOffAndOnAPortThatCouldNotBeReadIsBack) {
  plug_in();
  MockIio::set_value(0, kOpen);
  start(port(0, 0));
  MockIio::fail_reads(1);
  supervise_all(1);
  EXPECT_EQ(client_.set_supervised(0, false), "");
  EXPECT_EQ(client_.set_supervised(0, true), "");
  EXPECT_EQ(enabled(0), std::make_pair(1, 1));
  MockIio::set_value(0, kClosed);
  EXPECT_TRUE(changes(0, 1, "closed", kClosed));
}

TEST_F(ThresholdsOfTheKernel, AConverterThatIsBackIsUsedAsSoonAsTheAccountMay) {
  start_and_replug();
  EXPECT_TRUE(wait_until([] { return Daemon::log_count("mock-adc0 is back, but ") == 2; }));
  expect_no_rights();
  grant(MockIio::node());
  grant_tree(MockIio::folder());
  expect_both_watched();
  EXPECT_EQ(Daemon::log_count("mock-adc0 is back, but "), 2);  // once for each port
}

TEST_F(ThresholdsOfTheKernel, TheInstalledRulesAreEnoughForAConverterThatComesBack) {
  const DeviceManager manager;
  start_and_replug();
  expect_both_watched();
}

}  // namespace
