// Some thousand mixed requests: the daemon is as big afterwards as it was before.
#include "support/mock-iio.h"
#include "support/mock-spi.h"
#include "support/supervised-test.h"

namespace {

constexpr int kWarmUp = 200;
constexpr int kRequests = 2000;
constexpr long kGrowthKb = 256;
constexpr int kWatched = 5;
constexpr unsigned int kCommand = 0x11;
constexpr unsigned int kNoPort = 99;

class Soak : public SupervisedTest {
 protected:
  enum Number { kIn, kOut, kTerminal, kSpi, kInterrupt };

  void SetUp() override {
    MockSpi::set_sample(0, kCommand, kOpen);
    start(port_element("in", kIn, "input", "gpio", pin("input", 0)) +
          port_element("out", kOut, "output", "gpio", pin("output", 1)) +
          port_element("terminal", kTerminal, "io_ctrl", "gpio",
                       pin("input", 2) + pin("output", 3) + pin("io_ctrl", 4)) +
          port_element("spi", kSpi, "input", "spi",
                       input_pins() + "<device path='" + MockSpi::node(0) +
                           "'/><address value='11'/>" + all_ranges()) +
          port_element("interrupt", kInterrupt, "input", "iio-interrupt",
                       pin("input", 5) + "<device driver='mock-adc0' channel='" +
                           std::to_string(kWatched) + "' cache_ad_value='false'/>" + all_ranges()));
  }
  std::string pin(const std::string &section, int line) const {
    return "<" + section + " pin='" + plain_.number_text(line) + "'/>";
  }

  // The requests differ from one to the next, and meet each port in every state.
  void request(int i) {
    const bool odd = (i / 16) % 2 == 1;
    switch (i % 16) {
      case 0:
        plain_.pull(0, odd);
        break;
      case 1:
        EXPECT_EQ(client_.set_state(kOut, odd), "");
        break;
      case 2:
        EXPECT_EQ(client_.state(kOut), odd);
        break;
      case 3:
        EXPECT_EQ(client_.set_direction(kTerminal, odd ? "output" : "input"), "");
        break;
      case 4:
        EXPECT_EQ(client_.set_state(kTerminal, true).empty(), odd);
        break;
      case 5:
        EXPECT_EQ(client_.set_supervised(kSpi, odd), "");
        break;
      case 6:
        EXPECT_EQ(client_.readout(kSpi).level, kOpen);
        break;
      case 7:
        EXPECT_EQ(client_.set_supervised(kInterrupt, odd), "");
        break;
      case 8:
        MockIio::set_value(kWatched, static_cast<int>(odd ? kClosed : kCut));
        break;
      case 9:
        EXPECT_EQ(client_.readout(kInterrupt).state, odd ? "closed" : "cut");
        break;
      case 10:
        EXPECT_EQ(client_.set_range(kSpi, "cut", 3000, odd ? 4000 : 4095), "");
        break;
      case 11:
        EXPECT_NE(client_.set_range(kSpi, "cut", 10, 5), "");
        break;
      case 12:
        EXPECT_NE(client_.set_state(kNoPort, true), "");
        break;
      case 13:
        EXPECT_EQ(client_.ports().size(), 5U);
        break;
      case 14:
        (void)client_.start_sequence(kOut, {{!odd, 1}, {odd, 0}});
        break;
      default:
        EXPECT_EQ(client_.set_activelow(kIn, true, odd), "");
    }
  }
  void run(int requests) {
    for (int i = 0; i < requests && !HasFailure(); ++i) {
      request(i);
    }
    run_loop_for(G_TIME_SPAN_SECOND / 2);
    client_.forget_changes();
  }

  GpioSim plain_{"plain", {"", "", "", "", "", ""}};
  MockIio iio_;
  MockSpi spi_;
};

TEST_F(Soak, ManyMixedRequestsLeaveTheDaemonAsItWas) {
  run(kWarmUp);
  const ProcessUse before = daemon_.use();
  const gint64 begin = g_get_monotonic_time();
  run(kRequests);
  const gint64 took = g_get_monotonic_time() - begin;
  const ProcessUse after = daemon_.use();
  EXPECT_EQ(after.descriptors, before.descriptors);
  EXPECT_LE(after.memory_kb, before.memory_kb + kGrowthKb);
  RecordProperty("memory_before_kb", static_cast<int>(before.memory_kb));
  RecordProperty("memory_after_kb", static_cast<int>(after.memory_kb));
  RecordProperty("descriptors", after.descriptors);
  RecordProperty("milliseconds", static_cast<int>(took / G_TIME_SPAN_MILLISECOND));
}

}  // namespace
