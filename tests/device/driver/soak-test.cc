// A thousand mixed requests: the daemon is as big afterwards as it was before.
#include "support/mock-iio.h"
#include "support/mock-spi.h"
#include "support/rights.h"
#include "support/supervised-test.h"

namespace {

constexpr int kKinds = 24;  // of requests
constexpr int kWarmUp = 10 * kKinds;
constexpr int kRequests = 40 * kKinds;
constexpr long kGrowthKb = 64;
constexpr int kSampled = 2;  // channels of the converters
constexpr int kWatched = 5;
constexpr unsigned int kCommand = 0x11;
constexpr unsigned int kNoPort = 99;
constexpr std::size_t kPorts = 7;

class Soak : public SupervisedTest {
 protected:
  enum Number { PORT_IN, PORT_OUT, PORT_TERMINAL, PORT_SPI, PORT_INTERRUPT, PORT_ADC, PORT_IIO };
  // Lines of the plain chip.
  enum PlainLine {
    PLAIN_IN,
    PLAIN_OUT,
    PLAIN_TERMINAL_IN,
    PLAIN_TERMINAL_OUT,
    PLAIN_TERMINAL_CTRL,
    PLAIN_INTERRUPT,
    PLAIN_IIO,
    PLAIN_IIO_IO_CTRL,
    PLAIN_IIO_SIO_CTRL
  };

  void SetUp() override {
    MockSpi::set_sample(0, kCommand, kOpen);
    MockSpi::set_sample(1, kCommand, kOpen);
    MockIio::set_value(kSampled, kOpen, 1);
    plain_.export_low(PLAIN_IIO_SIO_CTRL);
    start(gpio_ports() + spi_ports() + iio_ports());
    // For what is dropped and comes back.
    grant_tree("/sys/class/gpio/gpio" + plain_.number_text(PLAIN_IN));
    grant(MockSpi::node(1));
  }
  std::string pin(const std::string &section, int line) const {
    return "<" + section + " pin='" + plain_.number_text(line) + "'/>";
  }
  std::string gpio_ports() const {
    return port_element("in", PORT_IN, "input", "gpio", pin("input", PLAIN_IN), true) +
           port_element("out", PORT_OUT, "output", "gpio", pin("output", PLAIN_OUT)) +
           port_element("terminal", PORT_TERMINAL, "io_ctrl", "gpio",
                        pin("input", PLAIN_TERMINAL_IN) + pin("output", PLAIN_TERMINAL_OUT) +
                            pin("io_ctrl", PLAIN_TERMINAL_CTRL));
  }
  std::string spi_ports() const {
    return port_element("spi", PORT_SPI, "input", "spi",
                        input_pins() + "<device path='" + MockSpi::node(0) +
                            "'/><address value='11'/>" + all_ranges()) +
           port_element("adc", PORT_ADC, "input", "spiadc",
                        "<device device='" + MockSpi::node(1) +
                            "' address='17' timeout='50'/><range n='1'/><input active_min='1000' "
                            "active_max='1500'/>",
                        true);
  }
  std::string iio_ports() const {
    return port_element("interrupt", PORT_INTERRUPT, "input", "iio-interrupt",
                        pin("input", PLAIN_INTERRUPT) + "<device driver='mock-adc0' channel='" +
                            std::to_string(kWatched) + "' cache_ad_value='false'/>" +
                            all_ranges()) +
           port_element("iio", PORT_IIO, "input", "iio",
                        pin("input", PLAIN_IIO) + pin("io_ctrl", PLAIN_IIO_IO_CTRL) +
                            pin("sio_ctrl", PLAIN_IIO_SIO_CTRL) +
                            "<device name='mock-adc1' adc='mock-adc1' hrtimer='" +
                            TimerTrigger::kName + "' freq='50' channel='" +
                            std::to_string(kSampled) + "'/>" + all_ranges());
  }

  // Drops the port and takes it in again, which makes its record and its watch anew.
  void drop_and_refresh(const std::string &name) {
    EXPECT_EQ(client_.drop(name), std::vector<std::string>{name});
    EXPECT_EQ(client_.refresh(), "");
  }

  // The requests differ from one to the next, and meet each port in every state.
  void request(int i) {
    const bool odd = (i / kKinds) % 2 == 1;
    const int kind = i % kKinds;
    if (kind < 8) {
      plain_request(kind, odd);
    } else if (kind < 17) {
      supervised_request(kind, odd);
    } else {
      other_request(kind, odd);
    }
  }
  void plain_request(int kind, bool odd) {
    switch (kind) {
      case 0:
        plain_.pull(PLAIN_IN, odd);
        break;
      case 1:
        EXPECT_EQ(client_.set_state(PORT_OUT, odd), "");
        break;
      case 2:
        EXPECT_EQ(client_.state(PORT_OUT), odd);
        break;
      case 3:
        EXPECT_EQ(client_.set_direction(PORT_TERMINAL, odd ? "output" : "input"), "");
        break;
      case 4:
        EXPECT_EQ(client_.set_state(PORT_TERMINAL, true).empty(), odd);
        break;
      case 5:
        MockSpi::set_sample(1, kCommand, odd ? kClosed : kOpen);
        break;
      case 6:
        (void)client_.state(PORT_ADC);
        break;
      default:
        (void)client_.start_sequence(PORT_OUT, {{!odd, 1}, {odd, 0}});
    }
  }
  void supervised_request(int kind, bool odd) {
    switch (kind) {
      case 8:
        EXPECT_EQ(client_.set_supervised(PORT_SPI, odd), "");
        break;
      case 9:
        EXPECT_EQ(client_.readout(PORT_SPI).level, kOpen);
        break;
      case 10:
        EXPECT_EQ(client_.set_supervised(PORT_INTERRUPT, odd), "");
        break;
      case 11:
        MockIio::set_value(kWatched, static_cast<int>(odd ? kClosed : kCut));
        break;
      case 12:
        EXPECT_EQ(client_.readout(PORT_INTERRUPT).state, odd ? "closed" : "cut");
        break;
      case 13:
        EXPECT_EQ(client_.set_supervised(PORT_IIO, odd), "");
        break;
      case 14:
        MockIio::set_value(kSampled, static_cast<int>(odd ? kClosed : kOpen), 1);
        break;
      case 15:
        EXPECT_TRUE(!odd || reads(PORT_IIO, "closed", kClosed));
        break;
      default:
        EXPECT_EQ(client_.set_range(PORT_SPI, "cut", 3000, odd ? 4000 : 4095), "");
    }
  }
  void other_request(int kind, bool odd) {
    switch (kind) {
      case 17:
        EXPECT_NE(client_.set_range(PORT_SPI, "cut", 10, 5), "");
        break;
      case 18:
        EXPECT_NE(client_.set_state(kNoPort, true), "");
        break;
      case 19:
        EXPECT_EQ(client_.set_activelow(PORT_IN, true, odd), "");
        break;
      case 20:
        drop_and_refresh("adc");
        break;
      case 21:
        drop_and_refresh("in");
        break;
      case 22:
        EXPECT_EQ(client_.ports().size(), kPorts);
        break;
      default:
        EXPECT_EQ(client_.state(PORT_IN), (plain_.level(PLAIN_IN)) != odd);
    }
  }
  void run(int requests) {
    for (int i = 0; i < requests && !HasFailure(); ++i) {
      request(i);
    }
    run_loop_for(G_TIME_SPAN_SECOND / 2);
    client_.forget_changes();
  }

  TimerTrigger trigger_;
  GpioSim plain_{"plain", {"", "", "", "", "", "", "", "", ""}};
  MockIio iio_{"devices=2"};
  MockSpi spi_;
};

TEST_F(Soak, ManyMixedRequestsLeaveTheDaemonAsItWas) {
  run(kWarmUp);
  const ProcessUse before = daemon_.use();
  const gint64 begin = g_get_monotonic_time();
  run(kRequests);
  const gint64 took = g_get_monotonic_time() - begin;
  const ProcessUse after = daemon_.use();
  RecordProperty("memory_before_kb", static_cast<int>(before.memory_kb));
  RecordProperty("memory_after_kb", static_cast<int>(after.memory_kb));
  RecordProperty("descriptors", after.descriptors);
  RecordProperty("milliseconds", static_cast<int>(took / G_TIME_SPAN_MILLISECOND));
  EXPECT_EQ(after.descriptors, before.descriptors);
  EXPECT_LE(after.memory_kb, before.memory_kb + kGrowthKb);
}

}  // namespace
