#include "support/mock-iio.h"

#include <fcntl.h>
#include <glib.h>
#include <gtest/gtest.h>
#include <linux/iio/events.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>

#include "support/files.h"

namespace {

constexpr const char *kDevices = "/sys/bus/iio/devices";
constexpr const char *kPlugged = "/sys/module/mock_iio/parameters/plugged";
constexpr const char *kFailingReads = "/sys/module/mock_iio/parameters/failing_reads";
constexpr const char *kScans = "/sys/module/mock_iio/parameters/scans";
constexpr const char *kTriggers = "/sys/kernel/config/iio/triggers/hrtimer/";

std::string entry_called(const std::string &name) {
  for (const auto &entry : std::filesystem::directory_iterator(kDevices)) {
    if (read_text(entry.path() / "name") == name) {
      return entry.path().filename();
    }
  }
  ADD_FAILURE() << "there is no " << name;
  return "?";
}

std::string entry_of(int device) {
  return entry_called("mock-adc" + std::to_string(device));
}

}  // namespace

MockIio::MockIio(const std::string &parameters) : module_("mock-iio", parameters) {}

// A running buffer keeps the module in use; without its converters there is none.
MockIio::~MockIio() {
  unplug();
}

void MockIio::set_value(int channel, int value, int device) {
  write_text(folder(device) + "in_voltage" + std::to_string(channel) + "_raw",
             std::to_string(value));
}

std::string MockIio::folder(int device) {
  return std::string(kDevices) + "/" + entry_of(device) + "/";
}

std::string MockIio::node(int device) {
  return "/dev/" + entry_of(device);
}

int MockIio::event_attribute(int channel, const std::string &name, int device) {
  return static_cast<int>(
      read_number(folder(device) + "events/in_voltage" + std::to_string(channel) + "_" + name));
}

UniqueFd MockIio::take_events(int device) {
  const UniqueFd file(open(node(device).c_str(), O_RDONLY | O_CLOEXEC));
  int events = -1;
  return UniqueFd(ioctl(file.get(), IIO_GET_EVENT_FD_IOCTL, &events) == 0 ? events : -1);
}

void MockIio::fail_reads(int count) {
  write_text(kFailingReads, std::to_string(count));
}

int MockIio::reads_to_fail() {
  return static_cast<int>(read_number(kFailingReads));
}

int MockIio::scans() {
  return static_cast<int>(read_number(kScans));
}

void MockIio::forget_scans() {
  write_text(kScans, "0");
}

void MockIio::unplug() {
  write_text(kPlugged, "0");
}

void MockIio::plug() {
  write_text(kPlugged, "1");
}

TimerTrigger::~TimerTrigger() {
  const std::string folder = std::string(kTriggers) + kName;
  EXPECT_TRUE(rmdir(folder.c_str()) == 0 || errno == ENOENT) << g_strerror(errno);
}

void TimerTrigger::make() {
  make_folder(std::string(kTriggers) + kName);
}

std::string TimerTrigger::folder() {
  return std::string(kDevices) + "/" + entry_called(kName) + "/";
}

std::string TimerTrigger::frequency() {
  return read_text(folder() + "sampling_frequency").value_or("(none)");
}
