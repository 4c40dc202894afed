#include "support/iio-bench.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <filesystem>

#include "base/glib-ptr.h"
#include "supervised/iio-sysfs.h"

namespace {

std::string folder(int device) {
  return "sys/bus/iio/devices/iio:device" + std::to_string(device) + "/";
}

std::string node(int device) {
  return "dev/iio:device" + std::to_string(device);
}

std::vector<std::string> open_files() {
  std::vector<std::string> files;
  for (const auto &entry : std::filesystem::directory_iterator("/proc/self/fd")) {
    std::error_code error;
    files.push_back(std::filesystem::read_symlink(entry, error).string());
  }
  return files;
}

}  // namespace

IioBench::IioBench() {
  iio_set_root(root_);
  std::filesystem::create_directories(path("dev"));
  for (const int pin : {1, 2, 3, 4}) {
    make_line(pin);
  }
}

IioBench::~IioBench() {
  iio_set_root("");
}

void IioBench::make_device(int number, const char *name) const {
  write(folder(number) + "name", std::string(name) + "\n");
}

std::string IioBench::attribute(int device, const std::string &name) const {
  return folder(device) + name;
}

void IioBench::make_node(int number) const {
  EXPECT_EQ(mkfifo(path(node(number)).c_str(), 0600), 0);
}

// For reading as well, so that opening never waits for the daemon.
int IioBench::open_node(int number) const {
  return open(path(node(number)).c_str(), O_RDWR | O_NONBLOCK | O_CLOEXEC);
}

std::string IioBench::readout(const IOPortRef &port) {
  SupervisedRangeState state = SUPERVISED_STATE_OPEN;
  std::uint32_t level = 0;
  Error error;
  if (io_port_get_supervised_readout(port.get(), &state, &level, error.out())) {
    return std::string(supervised_range_state2string(state)) + " " + std::to_string(level);
  }
  return "error " + std::to_string(error.get()->code) + ": " + error.message();
}

std::size_t IioBench::descriptors(const std::string &name) const {
  const auto files = open_files();
  return static_cast<std::size_t>(std::count(files.begin(), files.end(), path(name)));
}

std::size_t IioBench::descriptors() const {
  const auto files = open_files();
  return static_cast<std::size_t>(std::count_if(files.begin(), files.end(), [&](const auto &file) {
    return file.compare(0, root_.size(), root_) == 0;
  }));
}
