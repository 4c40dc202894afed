// Supervised inputs on a converter that the kernel samples into a buffer at a timer's pace.
#include <fcntl.h>

#include <algorithm>
#include <memory>

#include "support/mock-iio.h"
#include "support/supervised-test.h"

namespace {

constexpr int kChannel = 3;
constexpr int kIdlePercent = 10;
constexpr int kIdleTime = 1000;  // milliseconds

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

// A thousand samples a second, ten seconds long: every transition is reported, once.
TEST_F(SupervisedIio, NoTransitionIsLostAtAKilohertz) {
  MockIio::set_value(kChannel, kOpen);
  supervise("1000");
  ASSERT_TRUE(reads(0, "open", kOpen));
  client_.forget_changes();
  const gint64 end = g_get_monotonic_time() + 10 * G_TIME_SPAN_SECOND;
  int transitions = 0;
  gint64 slowest = 0;
  for (bool closed = true; g_get_monotonic_time() < end; closed = !closed) {
    const gint64 begin = g_get_monotonic_time();
    MockIio::set_value(kChannel, static_cast<int>(closed ? kClosed : kOpen));
    ++transitions;
    ASSERT_TRUE(wait_until([&] { return client_.count_changes(0) >= transitions; }))
        << "transition " << transitions;
    ASSERT_EQ(client_.last_reported(0), closed ? 1 : 0);
    slowest = std::max(slowest, g_get_monotonic_time() - begin);
  }
  EXPECT_EQ(client_.count_changes(0), transitions);
  RecordProperty("transitions", transitions);
  RecordProperty("slowest_us", static_cast<int>(slowest));
  EXPECT_GT(transitions, 50);
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

TEST_F(SupervisedIio, SamplesThatNobodyWantsCostNothing) {
  supervise("1000");
  EXPECT_EQ(client_.set_supervised(0, false), "");
  EXPECT_LE(daemon_.load_percent(kIdleTime), kIdlePercent);
  sim_.pull(kInput, true);
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
