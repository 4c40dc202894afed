// Inputs made of a voltage that an SPI converter measures.
#include <cerrno>

#include "support/device-test.h"
#include "support/mock-spi.h"

namespace {

constexpr int kConverter = 0;
constexpr unsigned int kCommand = 0x1F;
constexpr unsigned int kOtherCommand = 0x2E;

class SpiAdc : public DeviceTest {
 protected:
  static std::string ranges(const std::string &inverted = "false") {
    return "<device device='" + MockSpi::node(kConverter) +
           "' address='0x1f' timeout='20' inverted='" + inverted +
           "'/><range n='1'/><input active_min='1000' active_max='2000' hysteresis='50'/>"
           "<range n='2'/><input active_min='3000' active_max='3500'/>";
  }
  // What the port reports once two samples of this value were taken.
  int after(unsigned int sample) {
    MockSpi::set_sample(kConverter, kCommand, sample);
    // The first of them may have been under way already.
    EXPECT_TRUE(MockSpi::next_messages(kConverter, 2));
    return client_.state(0) ? 1 : 0;
  }

  MockSpi spi_;
};

TEST_F(SpiAdc, BoundariesShiftByTheHysteresis) {
  MockSpi::set_sample(kConverter, kCommand, 0);
  start(port_element("adc", 0, "input", "spiadc", ranges()));
  EXPECT_EQ(after(1049), 0);
  EXPECT_EQ(after(1050), 1);
  EXPECT_EQ(after(1000), 1);
  EXPECT_EQ(after(950), 1);
  EXPECT_EQ(after(949), 0);
  EXPECT_EQ(after(1000), 0);
  EXPECT_EQ(after(1951), 0);
  EXPECT_EQ(after(1950), 1);
  EXPECT_EQ(after(2000), 1);
  EXPECT_EQ(after(2050), 1);
  EXPECT_EQ(after(2051), 0);
  EXPECT_EQ(client_.count_changes(0), 4);
}

TEST_F(SpiAdc, ASecondRangeAndTheWholeScale) {
  MockSpi::set_sample(kConverter, kCommand, 0);
  start(port_element("adc", 0, "input", "spiadc", ranges()));
  EXPECT_EQ(after(2999), 0);
  EXPECT_EQ(after(3000), 1);
  EXPECT_EQ(after(3500), 1);
  EXPECT_EQ(after(3501), 0);
  EXPECT_EQ(after(0xFFF), 0);
}

TEST_F(SpiAdc, AnInvertedInputIsActiveOutsideItsRanges) {
  MockSpi::set_sample(kConverter, kCommand, 1500);
  start(port_element("adc", 0, "input", "spiadc", ranges("true")));
  EXPECT_EQ(after(1500), 0);
  EXPECT_EQ(after(2500), 1);
}

TEST_F(SpiAdc, AFailedTransferCountsAsZeroAndIsOverWithTheFailure) {
  MockSpi::set_sample(kConverter, kCommand, 1500);
  start(port_element("adc", 0, "input", "spiadc", ranges()));
  EXPECT_TRUE(reports(0, true));
  MockSpi::set_error(kConverter, EIO);
  EXPECT_TRUE(reports(0, false));
  EXPECT_TRUE(Daemon::logged("SPI_IOC_MESSAGE failed! : "));
  MockSpi::set_error(kConverter, 0);
  EXPECT_TRUE(reports(0, true));
}

TEST_F(SpiAdc, TheKernelSeesACommandThatIsSentAndAnAnswerThatIsRead) {
  MockSpi::set_sample(kConverter, kCommand, 0xABC);
  start(port_element("adc", 0, "input", "spiadc", ranges()));
  EXPECT_TRUE(MockSpi::next_messages(kConverter, 1));
  EXPECT_EQ(MockSpi::last_message(kConverter),
            "tx 1f 00 | len 2 speed 1000000 bits 8 delay 0 cs_change 0\n"
            "rx ab c0 | len 2 speed 1000000 bits 8 delay 0 cs_change 0");
}

TEST_F(SpiAdc, TwoPortsShareAConverter) {
  MockSpi::set_sample(kConverter, kCommand, 1500);
  MockSpi::set_sample(kConverter, kOtherCommand, 500);
  const std::string other = "<device device='" + MockSpi::node(kConverter) +
                            "' address='46' timeout='20'/><range n='1'/>"
                            "<input active_min='1000' active_max='2000'/>";
  start(port_element("adc", 0, "input", "spiadc", ranges()) +
        port_element("other", 1, "input", "spiadc", other));
  EXPECT_TRUE(reports(0, true));
  EXPECT_FALSE(client_.state(1));
  MockSpi::set_sample(kConverter, kOtherCommand, 1000);
  EXPECT_TRUE(reports(1, true));
  EXPECT_EQ(client_.count_changes(0), 1);
}

TEST_F(SpiAdc, AnOptionalPortWithoutItsConverterIsParked) {
  EXPECT_EQ(spi_.unload(), 0);
  start(port_element("adc", 0, "input", "spiadc", ranges(), true));
  EXPECT_TRUE(Daemon::logged("Failed to open " + MockSpi::node(kConverter)));
  EXPECT_TRUE(client_.ports().empty());
}

}  // namespace
