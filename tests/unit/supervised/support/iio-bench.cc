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

// Empty for a descriptor that is closed.
std::string file_of(const std::filesystem::path &descriptor) {
  std::error_code error;
  return std::filesystem::read_symlink(descriptor, error).string();
}

std::vector<std::string> open_files() {
  std::vector<std::string> files;
  for (const auto &entry : std::filesystem::directory_iterator("/proc/self/fd")) {
    files.push_back(file_of(entry));
  }
  return files;
}

std::vector<GPollFD> polled() {
  constexpr int most = 64;
  std::vector<GPollFD> descriptors(most);
  GMainContext *loop = g_main_context_default();
  gint ignored = 0;
  EXPECT_TRUE(g_main_context_acquire(loop));
  g_main_context_prepare(loop, &ignored);
  const int count = g_main_context_query(loop, G_MAXINT, &ignored, descriptors.data(), most);
  g_main_context_release(loop);
  EXPECT_LE(count, most);
  descriptors.resize(static_cast<std::size_t>(count));
  return descriptors;
}

}  // namespace

IioBench::IioBench() {
  iio_set_root(root_);
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
  std::filesystem::create_directories(path("dev"));
  EXPECT_EQ(mkfifo(path(node(number)).c_str(), 0600), 0);
}

// For reading as well, so that opening never waits for the daemon.
int IioBench::open_node(int number) const {
  return open(path(node(number)).c_str(), O_RDWR | O_NONBLOCK | O_CLOEXEC);
}

void IioBench::make_buffered_converter() const {
  make_device(0, "other");
  make_device(2, "buffer");
  make_device(5, "adc");
  write("sys/bus/iio/devices/trigger4/name", "pulse\n");
  write("sys/bus/iio/devices/trigger4/sampling_frequency", "");
  write(attribute(5, "trigger/current_trigger"), "\n");
  write(attribute(2, "scan_elements/in_voltage3_en"), "");
  write(attribute(2, "scan_elements/in_voltage3_type"), "le:u12/16>>0\n");
  write(attribute(2, "buffer/enable"), "");
  make_node(2);
}

void IioBench::make_threshold_converter(int number, const char *name) const {
  make_device(number, name);
  for (const char *channel : {"in_voltage0", "in_voltage1"}) {
    write(attribute(number, std::string(channel) + "_raw"), "150\n");
    for (const char *file : {"rising_value", "falling_value", "rising_en", "falling_en"}) {
      write(attribute(number, std::string("events/") + channel + "_thresh_" + file), "");
    }
  }
  make_node(number);
  make_events(number);
}

void IioBench::make_events(int number) const {
  EXPECT_EQ(mkfifo(path(node(number) + ".events").c_str(), 0600), 0);
}

int IioBench::open_events(int number) const {
  return open(path(node(number) + ".events").c_str(), O_RDWR | O_NONBLOCK | O_CLOEXEC);
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

std::vector<std::string> IioBench::watched_files() {
  std::vector<std::string> files;
  for (const GPollFD &descriptor : polled()) {
    files.push_back(file_of("/proc/self/fd/" + std::to_string(descriptor.fd)));
  }
  std::sort(files.begin(), files.end());
  return files;
}
