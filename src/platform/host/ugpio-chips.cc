// Line names, by the GPIO character devices.
#include <cerrno>
#include <filesystem>
#include <map>
#include <string_view>
#include <utility>

#include "base/glib-ptr.h"
#include "platform/host/ugpio-host.h"

namespace {

constexpr int kDecimal = 10;
constexpr std::string_view kChipPrefix = "gpiochip";

std::string device_directory = "/dev";

// The chips' devices by their number, so that the order of the folder decides nothing.
std::map<guint64, std::string> chip_devices() {
  std::map<guint64, std::string> chips;
  const GDirPtr devices(g_dir_open(device_directory.c_str(), 0, nullptr));
  while (const char *device = devices ? g_dir_read_name(devices.get()) : nullptr) {
    const std::string name = device;
    guint64 number = 0;
    if (name.starts_with(kChipPrefix) &&
        g_ascii_string_to_unsigned(name.c_str() + kChipPrefix.size(), kDecimal, 0, G_MAXUINT64,
                                   &number, nullptr)) {
      chips.emplace(number, std::filesystem::path(device_directory) / name);
    }
  }
  return chips;
}

}  // namespace

void ugpio_host_set_device_directory(std::string directory) {
  device_directory = std::move(directory);
}

// libgpiod's own search over all chips gives up at the first one that it may not open.
std::optional<UgpioHostLine> ugpio_host_find_line(const char *name) {
  int reason = ENOENT;
  for (const auto &[number, device] : chip_devices()) {
    if (auto line = ugpio_host_find_on_chip(device, name)) {
      return line;
    }
    if (errno != ENOENT) {
      reason = errno;
    }
  }
  errno = reason;
  return std::nullopt;
}
