// The daemon opens everything as root and then is "pcd": what it can still do, and what happens to
// what it opens anew.
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <sstream>

#include "support/device-manager.h"
#include "support/mock-iio.h"
#include "support/mock-spi.h"
#include "support/rights.h"
#include "support/supervised-test.h"

namespace {

constexpr int kSampled = 2;  // channels of the converter
constexpr int kWatched = 5;
constexpr unsigned int kCommand = 0x11;

// One message that holds both.
bool logged_together(const std::string &one, const std::string &other) {
  std::istringstream log(Daemon::log());
  for (std::string line; std::getline(log, line);) {
    if (line.find(one) != std::string::npos && line.find(other) != std::string::npos) {
      return true;
    }
  }
  return false;
}

class Privileges : public SupervisedTest {
 protected:
  enum Number { PORT_IN, PORT_OUT, PORT_ADC, PORT_SPI, PORT_IIO, PORT_INTERRUPT };
  // Lines of the plain chip.
  enum PlainLine {
    PLAIN_IN,
    PLAIN_OUT,
    PLAIN_IIO,
    PLAIN_IIO_IO_CTRL,
    PLAIN_IIO_SIO_CTRL,
    PLAIN_INTERRUPT
  };

  void SetUp() override { MockIio::set_value(kSampled, kOpen); }

  std::string all_backends() const {
    return port_element("in", PORT_IN, "input", "gpio",
                        "<input pin='" + plain_.number_text(PLAIN_IN) + "'/>", true) +
           port_element("out", PORT_OUT, "output", "gpio",
                        "<output pin='" + plain_.number_text(PLAIN_OUT) + "'/>") +
           port_element("adc", PORT_ADC, "input", "spiadc",
                        "<device device='" + MockSpi::node(0) +
                            "' address='17' timeout='50'/><range n='1'/><input active_min='1000' "
                            "active_max='2000'/>",
                        true) +
           port_element("spi", PORT_SPI, "input", "spi",
                        input_pins() + "<device path='" + MockSpi::node(1) +
                            "'/><address value='11'/>" + all_ranges(),
                        true) +
           port_element("iio", PORT_IIO, "input", "iio",
                        "<input pin='" + plain_.number_text(PLAIN_IIO) + "'/><io_ctrl pin='" +
                            plain_.number_text(PLAIN_IIO_IO_CTRL) + "'/><sio_ctrl pin='" +
                            plain_.number_text(PLAIN_IIO_SIO_CTRL) +
                            "'/><device name='mock-adc0' adc='mock-adc0' hrtimer='" +
                            TimerTrigger::kName + "' freq='100' channel='" +
                            std::to_string(kSampled) + "'/>" + all_ranges(),
                        true) +
           port_element("interrupt", PORT_INTERRUPT, "input", "iio-interrupt",
                        "<input pin='" + plain_.number_text(PLAIN_INTERRUPT) +
                            "'/><device driver='mock-adc1' channel='" + std::to_string(kWatched) +
                            "' hysteresis='5' cache_ad_value='false'/>" + all_ranges(),
                        true);
  }

  void start_all() {
    plain_.export_low(PLAIN_IIO_SIO_CTRL);
    start(all_backends());
  }
  bool in_service(const std::string &name) {
    const auto names = client_.ports();
    return std::find(names.begin(), names.end(), name) != names.end();
  }
  void drop_all() {
    for (const char *name : {"in", "adc", "spi", "iio", "interrupt"}) {
      EXPECT_EQ(client_.drop(name), std::vector<std::string>{name});
    }
    client_.forget_changes();
  }
  static void grant_lines(const GpioSim &sim, const std::vector<int> &lines) {
    for (const int line : lines) {
      grant_tree("/sys/class/gpio/gpio" + sim.number_text(line));
    }
  }
  // All ports but the output, the buffered one at what its converter was set to.
  void expect_inputs_work(unsigned int level, const std::string &state) {
    for (const char *name : {"in", "adc", "spi", "iio", "interrupt"}) {
      EXPECT_TRUE(in_service(name)) << name;
    }
    plain_.pull(PLAIN_IN, true);
    EXPECT_TRUE(reports(PORT_IN, true));
    MockSpi::set_sample(0, kCommand, 1500);
    EXPECT_TRUE(reports(PORT_ADC, true));
    MockSpi::set_sample(1, kCommand, kOpen);
    for (const int port : {PORT_SPI, PORT_IIO, PORT_INTERRUPT}) {
      EXPECT_EQ(client_.set_supervised(port, true), "");
    }
    expect_path(true);
    EXPECT_TRUE(plain_.level(PLAIN_IIO_SIO_CTRL));
    EXPECT_TRUE(reads(PORT_SPI, "open", kOpen));
    EXPECT_TRUE(reads(PORT_IIO, state, level));
    MockIio::set_value(kWatched, kCut, 1);
    EXPECT_TRUE(reads(PORT_INTERRUPT, "cut", kCut));
  }
  std::string status_line(const std::string &field) const {
    std::istringstream status(
        read_text("/proc/" + std::to_string(daemon_.pid()) + "/status").value_or(""));
    for (std::string line; std::getline(status, line);) {
      if (line.starts_with(field + ":\t")) {
        return line.substr(field.size() + 2);
      }
    }
    return "(none)";
  }

  TimerTrigger trigger_;
  MockIio iio_{"devices=2"};
  MockSpi spi_;
  GpioSim plain_{"plain", {"", "", "", "", "", ""}};
};

TEST_F(Privileges, TheDaemonIsTheServiceAccountWithItsGroups) {
  start_all();
  EXPECT_EQ(status_line("Uid"), "200\t200\t200\t200");
  EXPECT_EQ(status_line("Gid"), "200\t200\t200\t200");
  EXPECT_EQ(status_line("Groups"), "200 201 ");
  EXPECT_EQ(status_line("CapEff"), "0000000000000000");
  EXPECT_EQ(status_line("CapPrm"), "0000000000000000");
}

TEST_F(Privileges, EveryBackendWorksOnAfterTheDrop) {
  start_all();
  EXPECT_EQ(client_.set_state(PORT_OUT, true), "");
  EXPECT_TRUE(plain_.level(PLAIN_OUT));
  expect_inputs_work(kOpen, "open");
}

TEST_F(Privileges, SettingsAreSavedAndStayTheAccounts) {
  start_all();
  EXPECT_EQ(client_.set_activelow(PORT_IN, true, true), "");
  const std::string file = "/etc/portd/portd.conf";
  EXPECT_TRUE(wait_until([&] {
    return read_text(file).value_or("").find("input_activelow=true") != std::string::npos;
  }));
  struct stat status {};
  ASSERT_EQ(stat(file.c_str(), &status), 0);
  EXPECT_EQ(status.st_uid, getpwnam("pcd")->pw_uid);
}

// Nobody has given the account any rights: each port that comes back says what it may not do.
TEST_F(Privileges, ARefreshWithoutRightsSaysWhatIsMissing) {
  start_all();
  drop_all();
  EXPECT_EQ(client_.refresh(), "");
  const std::string denied = g_strerror(EACCES);
  const std::string lines = "/sys/class/gpio/";
  for (const std::string &what :
       {lines + "unexport", lines + "gpio" + plain_.number_text(PLAIN_IN) + "/direction",
        lines + "gpio" + sim_.number_text(LINE_SIO_CTRL) + "/active_low",
        lines + "gpio" + plain_.number_text(PLAIN_IIO_SIO_CTRL) + "/active_low", MockSpi::node(0),
        MockIio::node(1)}) {
    EXPECT_TRUE(logged_together(what, denied)) << what;
  }
  for (const char *name : {"adc", "spi", "iio", "interrupt"}) {
    EXPECT_FALSE(in_service(name)) << name;
  }
  // What was not dropped works on.
  EXPECT_EQ(client_.set_state(PORT_OUT, true), "");
  EXPECT_TRUE(plain_.level(PLAIN_OUT));
}

// Its lines alone are not enough for a buffered converter.
TEST_F(Privileges, ARefreshOfABufferedConverterSaysWhatIsMissing) {
  start_all();
  EXPECT_EQ(client_.drop("iio"), std::vector<std::string>{"iio"});
  grant_lines(plain_, {PLAIN_IIO, PLAIN_IIO_IO_CTRL, PLAIN_IIO_SIO_CTRL});
  EXPECT_EQ(client_.refresh(), "");
  const std::string denied = g_strerror(EACCES);
  for (const std::string &what :
       {TimerTrigger::folder() + "sampling_frequency", MockIio::folder() + "buffer/enable",
        std::string("Failed to open device: ")}) {
    EXPECT_TRUE(logged_together(what, denied)) << what;
  }
  EXPECT_FALSE(in_service("iio"));
}

TEST_F(Privileges, WithRightsFromTheDeviceManagerARefreshWorks) {
  start_all();
  drop_all();
  // The account could not give the lines back, so they are there to be used again.
  grant_lines(plain_,
              {PLAIN_IN, PLAIN_IIO, PLAIN_IIO_IO_CTRL, PLAIN_IIO_SIO_CTRL, PLAIN_INTERRUPT});
  grant_lines(sim_, {LINE_INPUT, LINE_IO_CTRL, LINE_SIO_CTRL});
  grant_tree(TimerTrigger::folder());
  for (const int device : {0, 1}) {
    grant(MockSpi::node(device));
    grant(MockIio::node(device));
    grant_tree(MockIio::folder(device));
  }
  MockIio::set_value(kSampled, kClosed);
  EXPECT_EQ(client_.refresh(), "");
  expect_inputs_work(kClosed, "closed");
}

TEST_F(Privileges, TheInstalledRulesAreEnoughForARefresh) {
  const DeviceManager manager;
  start_all();
  DeviceManager::settle();
  drop_all();
  MockIio::set_value(kSampled, kClosed);
  EXPECT_EQ(client_.refresh(), "");
  expect_inputs_work(kClosed, "closed");
}

TEST_F(Privileges, TheInstalledRulesAreEnoughForAnOutputThatIsRefreshed) {
  const DeviceManager manager;
  start(port_element("out", 0, "output", "gpio",
                     "<output pin='" + plain_.number_text(PLAIN_OUT) + "'/>", true));
  DeviceManager::settle();
  EXPECT_EQ(client_.drop("out"), std::vector<std::string>{"out"});
  EXPECT_EQ(client_.refresh(), "");
  EXPECT_EQ(client_.set_state(0, true), "");
  EXPECT_TRUE(plain_.level(PLAIN_OUT));
}

}  // namespace
