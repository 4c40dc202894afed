#include "support/device-test.h"

#include <iostream>

namespace {

constexpr std::size_t kShownLog = 8000;

// The end of a long log is where the failure is.
std::string end_of_log() {
  const std::string log = Daemon::log();
  return log.size() <= kShownLog ? log : "..." + log.substr(log.size() - kShownLog);
}

}  // namespace

void DeviceTest::TearDown() {
  if (daemon_.running()) {
    expect_clean_stop();
  }
  if (HasFailure()) {
    std::cout << "--- The daemon's log\n" << end_of_log() << "\n---\n";
  }
}

void DeviceTest::start(const std::string &ports) {
  Daemon::install(ports);
  daemon_.start();
}

void DeviceTest::restart() {
  expect_clean_stop();
  daemon_.start();
}

void DeviceTest::expect_clean_stop() {
  EXPECT_EQ(daemon_.stop(), 0);
}

::testing::AssertionResult DeviceTest::reports(int port, bool state) {
  if (wait_until([&] { return client_.last_reported(port) == (state ? 1 : 0); })) {
    return ::testing::AssertionSuccess();
  }
  return ::testing::AssertionFailure()
         << "port " << port << " last reported " << client_.last_reported(port);
}

std::string port_element(const std::string &name, int number, const std::string &type,
                         const std::string &backend, const std::string &sections, bool optional) {
  return "<port name='" + name + "'" + (optional ? " optional='true'" : "") + "><port_type type='" +
         type + "'/><port_no nbr='" + std::to_string(number) +
         "'/><properties ioport='true'/><backend name='" + backend + "'>" + sections +
         "</backend></port>";
}
