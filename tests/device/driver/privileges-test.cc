// The daemon opens everything as root and then is "pcd": what it can still do, and what happens to
// what it opens anew.
#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <memory>
#include <sstream>

#include "support/mock-iio.h"
#include "support/mock-spi.h"
#include "support/supervised-test.h"

namespace {

constexpr int kSampled = 2;  // channels of the converter
constexpr int kWatched = 5;
constexpr unsigned int kCommand = 0x11;
constexpr mode_t kGroupMayWrite = 0664;

// What a rule of the device manager does: the service's group may read and write.
void grant(const std::string &path) {
  const group *hardware = getgrnam("hardware");
  ASSERT_TRUE(hardware);
  EXPECT_EQ(chown(path.c_str(), 0, hardware->gr_gid), 0) << path;
  EXPECT_EQ(chmod(path.c_str(), kGroupMayWrite), 0) << path;
}

// All attributes below a folder of sysfs.
void grant_tree(const std::string &folder) {
  for (const auto &entry :
       std::filesystem::recursive_directory_iterator(std::filesystem::canonical(folder))) {
    if (entry.is_regular_file() &&
        (entry.status().permissions() & std::filesystem::perms::owner_write) !=
            std::filesystem::perms::none) {
      grant(entry.path());
    }
  }
}

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
  enum Number { kIn, kOut, kAdc, kSpi, kIio, kInterrupt };

  void SetUp() override { MockIio::set_value(kSampled, kOpen); }

  std::string all_backends() const {
    return port_element("in", kIn, "input", "gpio", "<input pin='" + plain_.number_text(0) + "'/>",
                        true) +
           port_element("out", kOut, "output", "gpio",
                        "<output pin='" + plain_.number_text(1) + "'/>") +
           port_element("adc", kAdc, "input", "spiadc",
                        "<device device='" + MockSpi::node(0) +
                            "' address='17' timeout='50'/><range n='1'/><input active_min='1000' "
                            "active_max='2000'/>",
                        true) +
           port_element("spi", kSpi, "input", "spi",
                        input_pins() + "<device path='" + MockSpi::node(1) +
                            "'/><address value='11'/>" + all_ranges(),
                        true) +
           port_element("iio", kIio, "input", "iio",
                        "<input pin='" + plain_.number_text(2) + "'/><io_ctrl pin='" +
                            plain_.number_text(3) + "'/><sio_ctrl pin='" + plain_.number_text(4) +
                            "'/><device name='mock-adc0' adc='mock-adc0' hrtimer='" +
                            TimerTrigger::kName + "' freq='100' channel='" +
                            std::to_string(kSampled) + "'/>" + all_ranges(),
                        true) +
           port_element("interrupt", kInterrupt, "input", "iio-interrupt",
                        "<input pin='" + plain_.number_text(5) +
                            "'/><device driver='mock-adc1' channel='" + std::to_string(kWatched) +
                            "' hysteresis='5' cache_ad_value='false'/>" + all_ranges(),
                        true);
  }

  void start_all() {
    plain_.export_low(4);
    start(all_backends());
  }
  bool in_service(const std::string &name) {
    const auto names = client_.ports();
    return std::find(names.begin(), names.end(), name) != names.end();
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
  plain_.pull(0, true);
  EXPECT_TRUE(reports(kIn, true));
  EXPECT_EQ(client_.set_state(kOut, true), "");
  EXPECT_TRUE(plain_.level(1));
  MockSpi::set_sample(0, kCommand, 1500);
  EXPECT_TRUE(reports(kAdc, true));
  MockSpi::set_sample(1, kCommand, kOpen);
  for (const int port : {kSpi, kIio, kInterrupt}) {
    EXPECT_EQ(client_.set_supervised(port, true), "");
  }
  expect_path(true);
  EXPECT_TRUE(reads(kSpi, "open", kOpen));
  EXPECT_TRUE(reads(kIio, "open", kOpen));
  MockIio::set_value(kWatched, kCut, 1);
  EXPECT_TRUE(reads(kInterrupt, "cut", kCut));
}

TEST_F(Privileges, SettingsAreSavedAndStayTheAccounts) {
  start_all();
  EXPECT_EQ(client_.set_activelow(kIn, true, true), "");
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
  for (const char *name : {"in", "adc", "spi", "iio", "interrupt"}) {
    EXPECT_EQ(client_.drop(name), std::vector<std::string>{name});
  }
  EXPECT_EQ(client_.refresh(), "");
  const std::string denied = g_strerror(EACCES);
  const std::string lines = "/sys/class/gpio/";
  for (const std::string &what :
       {lines + "unexport", lines + "gpio" + plain_.number_text(0) + "/direction",
        lines + "gpio" + sim_.number_text(kSioCtrl) + "/active_low", MockSpi::node(0),
        MockIio::node(1)}) {
    EXPECT_TRUE(logged_together(what, denied)) << what;
  }
  EXPECT_FALSE(in_service("adc"));
  EXPECT_FALSE(in_service("spi"));
  EXPECT_FALSE(in_service("iio"));
  EXPECT_FALSE(in_service("interrupt"));
  // What was not dropped works on.
  EXPECT_EQ(client_.set_state(kOut, true), "");
  EXPECT_TRUE(plain_.level(1));
}

TEST_F(Privileges, WithRightsFromTheDeviceManagerARefreshWorks) {
  start_all();
  for (const char *name : {"adc", "interrupt"}) {
    EXPECT_EQ(client_.drop(name), std::vector<std::string>{name});
  }
  grant(MockSpi::node(0));
  grant(MockIio::node(1));
  grant_tree(MockIio::folder(1));
  // The account could not give the line back, so it is there to be used again.
  grant_tree("/sys/class/gpio/gpio" + plain_.number_text(5));
  EXPECT_EQ(client_.refresh(), "");
  EXPECT_TRUE(in_service("adc"));
  EXPECT_TRUE(in_service("interrupt"));
  MockSpi::set_sample(0, kCommand, 1500);
  EXPECT_TRUE(reports(kAdc, true));
  EXPECT_EQ(client_.set_supervised(kInterrupt, true), "");
  MockIio::set_value(kWatched, kClosed, 1);
  EXPECT_TRUE(reads(kInterrupt, "closed", kClosed));
}

}  // namespace
