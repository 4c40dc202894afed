#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>

#include "allocations.h"
#include "backend-fixture.h"
#include "seams.h"
#include "support/fake-ioctl.h"

namespace {

// Any file that can be opened: what is sent to its descriptor goes to the fake.
constexpr const char *kDevice = "/dev/null";

class SpiAdcBackendTest : public BackendTest {
 protected:
  SpiAdcBackendTest() {
    fake_spidev() = {};
    seams() = {};
  }

  static std::vector<Property> device() {
    return {
        {"device", "device", kDevice}, {"device", "address", "0x18"}, {"device", "timeout", "50"}};
  }
  static std::vector<Property> range(const char *min, const char *max, const char *hysteresis) {
    return {{"range", "name", "any"},
            {"input", "active_min", min},
            {"input", "active_max", max},
            {"input", "hysteresis", hysteresis}};
  }
  static std::vector<Property> join(std::vector<Property> first,
                                    const std::vector<Property> &second) {
    first.insert(first.end(), second.begin(), second.end());
    return first;
  }

  IOPort *make(const std::vector<Property> &properties) {
    return make_port("spiadc", PORT_INPUT, properties);
  }
  // Set up and sampling.
  void run(const std::vector<Property> &properties) {
    EXPECT_TRUE(io_port_setup(make(join(device(), properties))));
    io_port_set_watch(port());
  }
  void run_usual_range() { run(range("1000", "2000", "50")); }

  static bool sample_once() { return g_main_context_iteration(nullptr, FALSE) != FALSE; }
  // The state after one more sample.
  bool after(int sample) {
    fake_spidev().answer_sample(sample);
    EXPECT_TRUE(sample_once());
    return io_port_get_state(port());
  }
};

TEST_F(SpiAdcBackendTest, ASampleIsOneMessageOfTwoTransfersWithAllElseZero) {
  run_usual_range();
  EXPECT_TRUE(sample_once());
  ASSERT_EQ(fake_spidev().messages.size(), 1U);
  const SpiMessage &message = fake_spidev().messages.front();
  EXPECT_EQ(message.request, static_cast<unsigned long>(SPI_IOC_MESSAGE(2)));
  EXPECT_GE(message.fd, 0);
  EXPECT_EQ(message.sent, (std::array<std::uint8_t, 2>{0x18, 0}));
  EXPECT_EQ(message.receive_buffer, (std::array<std::uint8_t, 2>{0, 0}));
  spi_ioc_transfer send{};
  send.tx_buf = message.transfers[0].tx_buf;
  send.len = 2;
  spi_ioc_transfer receive{};
  receive.rx_buf = message.transfers[1].rx_buf;
  receive.len = 2;
  EXPECT_EQ(memcmp(&message.transfers[0], &send, sizeof send), 0);
  EXPECT_EQ(memcmp(&message.transfers[1], &receive, sizeof receive), 0);
}

TEST_F(SpiAdcBackendTest, TheAddressIsItsLowByte) {
  run({{"device", "address", "0x1ff"}});
  EXPECT_TRUE(sample_once());
  EXPECT_EQ(fake_spidev().messages.front().sent[0], 0xFF);
}

TEST_F(SpiAdcBackendTest, NumbersMayBeDecimalHexadecimalOrOctal) {
  for (const auto &[text, byte] : {std::pair{"24", 24}, {"0x18", 24}, {"030", 24}, {"text", 0}}) {
    fake_spidev().messages.clear();
    run({{"device", "address", text}});
    EXPECT_TRUE(sample_once());
    EXPECT_EQ(fake_spidev().messages.front().sent[0], byte) << text;
  }
}

TEST_F(SpiAdcBackendTest, ASampleHasItsHighEightBitsFirst) {
  run(range("2748", "2748", "0"));  // 0xABC
  fake_spidev().answer = {0xAB, 0xCD};
  EXPECT_TRUE(sample_once());
  EXPECT_TRUE(io_port_get_state(port()));
}

TEST_F(SpiAdcBackendTest, TheIntervalIsTheTimeout) {
  run_usual_range();
  EXPECT_EQ(seams().intervals, std::vector<guint>{50});
}

TEST_F(SpiAdcBackendTest, AnIntervalThatIsNoneIsTenMillisecondsWithAWarning) {
  for (const char *timeout : {"soon", "", "0"}) {
    seams() = {};
    run({{"device", "timeout", timeout}});
    EXPECT_EQ(seams().intervals, std::vector<guint>{10});
    EXPECT_EQ(log.take_warnings(),
              std::vector<std::string>{
                  "Port terminal: no valid polling interval is given: polling every 10 ms"});
  }
}

TEST_F(SpiAdcBackendTest, AnInactiveInputBecomesActiveInsideTheNarrowedRange) {
  run_usual_range();
  EXPECT_FALSE(after(1049));
  EXPECT_TRUE(after(1050));
}

TEST_F(SpiAdcBackendTest, AnInactiveInputBecomesActiveBelowTheNarrowedUpperLimit) {
  run_usual_range();
  EXPECT_FALSE(after(1951));
  EXPECT_TRUE(after(1950));
}

TEST_F(SpiAdcBackendTest, AnActiveInputStaysActiveInTheWidenedRange) {
  run_usual_range();
  EXPECT_TRUE(after(1500));
  EXPECT_TRUE(after(950));
  EXPECT_TRUE(after(2050));
  EXPECT_FALSE(after(2051));
}

TEST_F(SpiAdcBackendTest, AnActiveInputEndsBelowTheWidenedRange) {
  run_usual_range();
  EXPECT_TRUE(after(1500));
  EXPECT_FALSE(after(949));
}

TEST_F(SpiAdcBackendTest, ASampleInEitherOfTwoRangesIsActive) {
  run(join(range("100", "200", "0"), range("1000", "1100", "0")));
  EXPECT_FALSE(after(500));
  EXPECT_TRUE(after(150));
  EXPECT_FALSE(after(500));
  EXPECT_TRUE(after(1050));
}

TEST_F(SpiAdcBackendTest, EachRangeHasItsOwnHysteresis) {
  run(join(range("100", "200", "50"), range("1000", "1100", "0")));
  EXPECT_FALSE(after(149));
  EXPECT_TRUE(after(150));
  EXPECT_TRUE(after(50));
  EXPECT_FALSE(after(999));
  EXPECT_TRUE(after(1000));
}

TEST_F(SpiAdcBackendTest, WithoutRangesTheInputIsInactive) {
  run({});
  EXPECT_FALSE(after(0));
  EXPECT_FALSE(after(4095));
}

TEST_F(SpiAdcBackendTest, InputPropertiesBeforeAnyRangeAreLoggedAndLost) {
  run(join({{"input", "active_min", "0"}, {"input", "active_max", "4095"}},
           range("10", "20", "0")));
  EXPECT_EQ(log.take_all(G_LOG_LEVEL_WARNING, "Spi ADC backend configured incorrectly"), 2U);
  EXPECT_FALSE(after(1000));
  EXPECT_TRUE(after(15));
}

TEST_F(SpiAdcBackendTest, ARangeElementBeginsOneRangePerAttribute) {
  run(join({{"range", "active_min", "0"}, {"range", "active_max", "4095"}}, {}));
  EXPECT_FALSE(after(1000)) << "what a range element says is not used";
  EXPECT_TRUE(after(0)) << "its ranges hold 0";
}

TEST_F(SpiAdcBackendTest, AnUnknownSectionIsLogged) {
  make({{"spi", "device", "/dev/spidev0.0"}});
  EXPECT_TRUE(log.took_warning("Could not parse backend data!\n"));
}

TEST_F(SpiAdcBackendTest, UnknownKeysAreIgnored) {
  make({{"device", "speed", "1"}, {"range", "any", "1"}, {"input", "minimum", "1"}});
  EXPECT_TRUE(log.empty());
}

TEST_F(SpiAdcBackendTest, AnInvertedInputIsActiveOutsideAllRanges) {
  run(join({{"device", "inverted", "true"}}, range("1000", "2000", "0")));
  EXPECT_TRUE(after(500));
  EXPECT_FALSE(after(1500));
}

TEST_F(SpiAdcBackendTest, AnInvertedInputHasItsHysteresisInTheRangeToo) {
  run(join({{"device", "inverted", "true"}}, range("1000", "2000", "50")));
  EXPECT_FALSE(after(950)) << "inactive at first, so in range";
  EXPECT_TRUE(after(949));
  EXPECT_TRUE(after(1049));
  EXPECT_FALSE(after(1050));
}

TEST_F(SpiAdcBackendTest, OnlyTrueInLowerCaseInverts) {
  run(join({{"device", "inverted", "TRUE"}}, range("1000", "2000", "0")));
  EXPECT_FALSE(after(500));
}

TEST_F(SpiAdcBackendTest, AFailedTransferIsASampleOfZero) {
  run(range("0", "10", "0"));
  fake_spidev().error = EIO;
  EXPECT_TRUE(after(3000));
  EXPECT_TRUE(log.took_warning("SPI_IOC_MESSAGE failed! : Input/output error"));
}

TEST_F(SpiAdcBackendTest, AFailedTransferIsASampleOfZeroWhateverItReceived) {
  run_usual_range();
  fake_spidev().error = EIO;
  fake_spidev().scribbles = true;
  EXPECT_FALSE(after(1500));
  EXPECT_TRUE(log.took_warning("SPI_IOC_MESSAGE failed! : Input/output error"));
}

TEST_F(SpiAdcBackendTest, SamplingGoesOnAfterAFailure) {
  run_usual_range();
  fake_spidev().error = EIO;
  EXPECT_FALSE(after(1500));
  fake_spidev().error = 0;
  EXPECT_TRUE(after(1500));
  EXPECT_TRUE(log.took_warning("SPI_IOC_MESSAGE failed! : Input/output error"));
}

TEST_F(SpiAdcBackendTest, OnlyChangesAreReported) {
  run_usual_range();
  for (const int sample : {0, 1500, 1600, 0, 0}) {
    (void)after(sample);
  }
  EXPECT_EQ(reported(), (States{true, false}));
}

TEST_F(SpiAdcBackendTest, AnActiveLowInputReportsTheInvertedState) {
  run_usual_range();
  io_port_restore_activelow(port(), true, true);
  (void)after(1500);
  EXPECT_EQ(reported(), States{false});
}

TEST_F(SpiAdcBackendTest, NoLimitOverflows) {
  run(join(range("-2147483648", "2147483647", "2147483647"), range("2147483647", "0", "1")));
  EXPECT_TRUE(after(0));
  EXPECT_TRUE(after(4095));
}

TEST_F(SpiAdcBackendTest, ARepeatedDeviceReplacesTheEarlierOne) {
  make({{"device", "device", "/nonexistent"}, {"device", "device", kDevice}});
  EXPECT_TRUE(io_port_setup(port()));
}

TEST_F(SpiAdcBackendTest, ADeviceThatDoesNotOpenFailsTheSetUp) {
  EXPECT_FALSE(io_port_setup(make({{"device", "device", "/nonexistent"}})));
  EXPECT_TRUE(log.took_warning("Failed to open /nonexistent: No such file or directory"));
}

TEST_F(SpiAdcBackendTest, AMissingDeviceFailsTheSetUp) {
  EXPECT_FALSE(io_port_setup(make({})));
  EXPECT_TRUE(log.took_warning("Failed to open : No such file or directory"));
}

TEST_F(SpiAdcBackendTest, ADeviceThatDidNotOpenIsSampledAsZero) {
  EXPECT_FALSE(io_port_setup(make(join(
      {{"device", "device", "/nonexistent"}, {"device", "timeout", "50"}}, range("0", "9", "0")))));
  io_port_set_watch(port());
  EXPECT_TRUE(sample_once());
  EXPECT_TRUE(fake_spidev().messages.empty());
  EXPECT_TRUE(log.took_warning("SPI_IOC_MESSAGE failed! : Bad file descriptor"));
  EXPECT_FALSE(io_port_get_state(port())) << "it is not set up";
  EXPECT_TRUE(log.took_warning("Failed to open /nonexistent: No such file or directory"));
}

TEST_F(SpiAdcBackendTest, AnOutputCannotBeSetUp) {
  make_port("spiadc", PORT_OUTPUT, device());
  EXPECT_FALSE(io_port_setup(port()));
  make_port("spiadc", PORT_CONFIGURABLE, device());
  EXPECT_FALSE(io_port_setup(port()));
  EXPECT_EQ(
      log.take_all(G_LOG_LEVEL_WARNING, "Port terminal: an SPI ADC port can only be an input"), 2U);
}

// Arming it anew would put its next sample off.
TEST_F(SpiAdcBackendTest, ARepeatedAnnouncementLeavesTheTimerThatRuns) {
  run_usual_range();
  io_port_set_watch(port());
  io_port_set_watch(port());
  EXPECT_EQ(seams().intervals, std::vector<guint>{50});
  EXPECT_TRUE(sample_once());
  EXPECT_EQ(fake_spidev().messages.size(), 1U);
}

TEST_F(SpiAdcBackendTest, ADroppedPortIsNoLongerSampledAndHoldsNoDescriptor) {
  run_usual_range();
  EXPECT_TRUE(sample_once());
  const int fd = fake_spidev().messages.front().fd;
  io_port_drop(port());
  EXPECT_EQ(fcntl(fd, F_GETFD), -1);
  EXPECT_FALSE(sample_once());
  io_port_set_watch(port());
  EXPECT_FALSE(sample_once());
}

TEST_F(SpiAdcBackendTest, APortThatWasNeverOpenedLeavesStandardInputOpen) {
  ASSERT_NE(fcntl(STDIN_FILENO, F_GETFD), -1);
  make({});
  io_port_drop(port());
  EXPECT_NE(fcntl(STDIN_FILENO, F_GETFD), -1);
}

TEST_F(SpiAdcBackendTest, ADroppedPortCanBeSetUpAgain) {
  run_usual_range();
  io_port_drop(port());
  EXPECT_TRUE(io_port_setup(port()));
  io_port_set_watch(port());
  EXPECT_TRUE(after(1500));
}

TEST_F(SpiAdcBackendTest, ASampleAllocatesNothing) {
  run_usual_range();
  (void)after(0);
  fake_spidev().messages.reserve(10);
  allocations = 0;
  EXPECT_FALSE(after(100));
  EXPECT_EQ(allocations, 0);
}

}  // namespace
