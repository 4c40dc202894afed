// Supervised inputs on a converter that the kernel samples into a buffer at a timer's pace.
#include <fcntl.h>

#include <memory>

#include "support/mock-iio.h"
#include "support/rights.h"
#include "support/supervised-test.h"

namespace {

constexpr int kChannel = 3;
constexpr int kIdlePercent = 10;
constexpr int kIdleTime = 1000;  // milliseconds
constexpr gulong kPace = 60000;  // microseconds that a level stays
constexpr int kScansOfALevel = 20;
constexpr gint64 kPacedTime = 10 * G_TIME_SPAN_SECOND;
constexpr int kLeastHertz = 260;
constexpr int kMostHertz = 1010;

class IioTest : public SupervisedTest {
 protected:
  std::string document(const std::string &frequency = "100", int shift = 0, bool optional = false) {
    return port_element("loop", 0, "input", "iio",
                        input_pins() + "<device name='mock-adc0' adc='mock-adc0' hrtimer='" +
                            TimerTrigger::kName + "' freq='" + frequency + "' shift='" +
                            std::to_string(shift) + "' channel='" + std::to_string(kChannel) +
                            "'/>" + all_ranges(),
                        optional);
  }
  // A daemon that supervises the line, with this converter.
  void supervise(const std::string &frequency = "100", int shift = 0) {
    start(document(frequency, shift));
    ASSERT_EQ(client_.set_supervised(0, true), "");
  }
  void plug_in(const std::string &parameters) { iio_ = std::make_unique<MockIio>(parameters); }

  TimerTrigger trigger_;
  std::unique_ptr<MockIio> iio_;
};

// --- Every format that a converter may deliver ---

struct Format {
  const char *name;
  const char *parameters;
  unsigned int value;
  unsigned int level;
  int shift = 0;
};

// Printed by GoogleTest in place of the bytes of the struct.
void PrintTo(const Format &format,  // NOLINT(readability-identifier-naming)
             std::ostream *out) {
  *out << format.parameters;
}

class SupervisedIioFormat : public IioTest, public testing::WithParamInterface<Format> {};

TEST_P(SupervisedIioFormat, IsDecoded) {
  const Format &format = GetParam();
  plug_in(format.parameters);
  MockIio::set_value(kChannel, static_cast<int>(format.value));
  MockIio::set_value(kChannel - 1, 1);
  supervise("100", format.shift);
  const char *state = format.level < 500 ? "short" : format.level < 1500 ? "closed" : "open";
  EXPECT_TRUE(reads(0, format.level < 3000 ? state : "undefined", format.level));
}

// The bits around the value are ones, which must not count.
constexpr Format kFormats[] = {
    {"OneByte", "realbits=8 storagebits=8 noise=1", 0xA5, 0xA5},
    {"OneByteShifted", "realbits=5 storagebits=8 shift=3 noise=1", 0x15, 0x15},
    {"TwoBytesLittleEndian", "endian=le realbits=12 storagebits=16 shift=4 noise=1", 0xABC, 0xABC},
    {"TwoBytesBigEndian", "endian=be realbits=12 storagebits=16 shift=4 noise=1", 0xABC, 0xABC},
    {"TwoBytesBigEndianUnshifted", "endian=be realbits=10 storagebits=16 noise=1", 0x3A5, 0x3A5},
    {"WithAnExtraShift", "endian=le realbits=10 storagebits=16 noise=1", 0x3FF, 0xFF, 2},
    {"FourBytesLittleEndian", "endian=le realbits=24 storagebits=32 shift=8 noise=1", 0x123456,
     0x123456},
    {"FourBytesBigEndian", "endian=be realbits=24 storagebits=32 shift=8 noise=1", 0x123456,
     0x123456},
    {"FourWholeBytes", "endian=be realbits=32 storagebits=32", 0xDEADBEEF, 0xDEADBEEF},
};
INSTANTIATE_TEST_SUITE_P(Every, SupervisedIioFormat, testing::ValuesIn(kFormats),
                         [](const auto &format) { return format.param.name; });

// --- Life with a converter ---

class SupervisedIio : public IioTest {
 protected:
  SupervisedIio() { plug_in("endian=be realbits=12 storagebits=16 shift=4"); }
};

TEST_F(SupervisedIio, TheDaemonMakesTheTriggerAndStartsTheBuffer) {
  MockIio::set_value(kChannel, kOpen);
  start(document("250"));
  EXPECT_TRUE(TimerTrigger::frequency().starts_with("250."));
  EXPECT_EQ(read_text(MockIio::folder() + "trigger/current_trigger"), TimerTrigger::kName);
  EXPECT_EQ(read_number(MockIio::folder() + "scan_elements/in_voltage3_en"), 1);
  EXPECT_EQ(read_number(MockIio::folder() + "buffer/enable"), 1);
  // Nothing is read before the line is supervised.
  EXPECT_EQ(client_.readout(0), (Readout{.state = "short", .level = 0}));
  EXPECT_EQ(client_.set_supervised(0, true), "");
  EXPECT_TRUE(reads(0, "open", kOpen));
}

TEST_F(SupervisedIio, ATriggerThatIsThereAlreadyIsUsedAtTheDocumentsPace) {
  TimerTrigger::make();
  MockIio::set_value(kChannel, kClosed);
  supervise("50");
  EXPECT_TRUE(TimerTrigger::frequency().starts_with("50."));
  EXPECT_TRUE(reads(0, "closed", kClosed));
}

TEST_F(SupervisedIio, ARestartTakesTheRunningBufferOver) {
  MockIio::set_value(kChannel, kClosed);
  supervise();
  EXPECT_TRUE(reads(0, "closed", kClosed));
  restart();
  EXPECT_TRUE(reads(0, "closed", kClosed));
  daemon_.kill_hard();
  MockIio::set_value(kChannel, kOpen);
  daemon_.start();
  EXPECT_TRUE(reads(0, "open", kOpen));
}

// Lets the level be for a while. When the host has no time for the guest the kernel misses samples,
// and nobody can report a level that was never sampled.
void keep_level() {
  const int enough = MockIio::scans() + kScansOfALevel;
  do {
    g_usleep(kPace);
  } while (MockIio::scans() < enough);
}

// A thousand samples a second, ten seconds long, and a level that changes at a pace of its own,
// whatever has been reported yet: every transition is reported, once.
TEST_F(SupervisedIio, NoTransitionIsLostAtAKilohertz) {
  MockIio::set_value(kChannel, kOpen);
  supervise("1000");
  ASSERT_TRUE(reads(0, "open", kOpen));
  client_.forget_changes();
  MockIio::forget_scans();
  const gint64 begin = g_get_monotonic_time();
  int transitions = 0;
  gint64 took = 0;
  for (; took < kPacedTime; took = g_get_monotonic_time() - begin) {
    MockIio::set_value(kChannel, static_cast<int>(transitions % 2 == 0 ? kClosed : kOpen));
    ++transitions;
    keep_level();
  }
  const auto hertz = static_cast<int>(MockIio::scans() * G_TIME_SPAN_SECOND / took);
  RecordProperty("transitions", transitions);
  RecordProperty("hertz", hertz);
  EXPECT_TRUE(wait_until([&] { return client_.count_changes(0) >= transitions; }));
  client_.catch_up();
  EXPECT_EQ(client_.count_changes(0), transitions);
  for (std::size_t i = 0; i < client_.changes().size(); ++i) {
    ASSERT_EQ(client_.changes()[i].state, i % 2 == 0) << "transition " << i;
  }
  // A timer that fell back to the kernel's tick would fire 250 times a second at most; a host with
  // little time for the guest costs samples too.
  EXPECT_GT(hertz, kLeastHertz);
  EXPECT_LE(hertz, kMostHertz);
}

TEST_F(SupervisedIio, ADeviceInUseFailsTheSetUpAndParksThePort) {
  const UniqueFd user(open(MockIio::node().c_str(), O_RDONLY | O_CLOEXEC));
  ASSERT_TRUE(user);
  start(document("100", 0, true));
  EXPECT_TRUE(Daemon::logged("Failed to open device: " + std::string(g_strerror(EBUSY))));
  EXPECT_TRUE(Daemon::logged("Failed to setup iio device."));
  EXPECT_TRUE(client_.ports().empty());
}

TEST_F(SupervisedIio, ADeviceThatGoesReadsUndefinedAndCostsNothing) {
  MockIio::set_value(kChannel, kClosed);
  supervise();
  ASSERT_TRUE(reads(0, "closed", kClosed));
  MockIio::unplug();
  EXPECT_TRUE(wait_until([&] { return client_.readout(0).state == "undefined"; }));
  EXPECT_LE(daemon_.load_percent(kIdleTime), kIdlePercent);
}

// Whose node and attributes are root's, as the kernel has it.
TEST_F(SupervisedIio, AConverterThatIsBackIsUsedAsSoonAsTheAccountMay) {
  MockIio::set_value(kChannel, kClosed);
  supervise();
  ASSERT_TRUE(reads(0, "closed", kClosed));
  MockIio::unplug();
  EXPECT_TRUE(wait_until([&] { return client_.readout(0).state == "undefined"; }));
  MockIio::plug();
  EXPECT_TRUE(wait_until([] { return Daemon::logged("mock-adc0 is back, but "); }));
  MockIio::set_value(kChannel, kOpen);
  grant(MockIio::node());
  grant_tree(MockIio::folder());
  grant_tree(TimerTrigger::folder());
  EXPECT_TRUE(reads(0, "open", kOpen));
  EXPECT_EQ(Daemon::log_count("mock-adc0 is back, but "), 1);
}

// The kernel keeps the oldest samples while nobody reads.
TEST_F(SupervisedIio, SamplesThatWereQueuedWhileNobodyWatchedAreNoNews) {
  MockIio::set_value(kChannel, kOpen);
  start(document("100"));
  for (int round = 0; round < 3; ++round) {
    MockIio::set_value(kChannel, kOpen);
    keep_level();
    MockIio::set_value(kChannel, kClosed);
    client_.forget_changes();
    EXPECT_EQ(client_.set_supervised(0, true), "");
    EXPECT_TRUE(reads(0, "closed", kClosed));
    client_.catch_up();
    ASSERT_EQ(client_.count_changes(0), 1) << "round " << round;
    EXPECT_TRUE(client_.changes().front().state);
    EXPECT_EQ(client_.set_supervised(0, false), "");
  }
}

TEST_F(SupervisedIio, SamplesThatNobodyWantsCostNothing) {
  supervise("1000");
  EXPECT_EQ(client_.set_supervised(0, false), "");
  EXPECT_LE(daemon_.load_percent(kIdleTime), kIdlePercent);
  sim_.pull(LINE_INPUT, true);
  EXPECT_TRUE(reports(0, true));
}

// A converter of another kind than the board was designed for.
TEST_F(SupervisedIio, ASignedConverterEndsTheDaemonAtItsStart) {
  iio_.reset();
  plug_in("sign=s realbits=12 storagebits=16 shift=4");
  Daemon::install(document());
  EXPECT_EQ(daemon_.run_to_end(), -1);
  EXPECT_TRUE(Daemon::logged("assertion failed: (backend->iio_type.sign == 'u')"));
}

}  // namespace
