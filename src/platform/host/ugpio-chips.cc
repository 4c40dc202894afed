// Line names, by the GPIO character devices.
#include <gpiod.h>

#include <cerrno>
#include <map>
#include <memory>
#include <string_view>

#include "base/glib-ptr.h"
#include "platform/host/ugpio-host.h"

namespace {

constexpr int kDecimal = 10;
constexpr const char *kDevices = "/dev";
constexpr std::string_view kChipPrefix = "gpiochip";

// The chips' devices by their number, so that the order of the folder decides nothing.
std::map<guint64, std::string> chip_devices() {
  std::map<guint64, std::string> chips;
  const GDirPtr devices(g_dir_open(kDevices, 0, nullptr));
  while (const char *device = devices ? g_dir_read_name(devices.get()) : nullptr) {
    const std::string name = device;
    guint64 number = 0;
    if (name.starts_with(kChipPrefix) &&
        g_ascii_string_to_unsigned(name.c_str() + kChipPrefix.size(), kDecimal, 0, G_MAXUINT64,
                                   &number, nullptr)) {
      chips.emplace(number, name);
    }
  }
  return chips;
}

using ChipPtr = std::unique_ptr<gpiod_chip, GlibDeleter<gpiod_chip_close>>;

// Nothing, with errno: ENOENT when the chip has no such line.
std::optional<UgpioHostLine> find_on_chip(const std::string &chip_name, const char *line_name) {
  const ChipPtr chip(gpiod_chip_open_by_name(chip_name.c_str()));
  gpiod_line *line = chip ? gpiod_chip_find_line(chip.get(), line_name) : nullptr;
  if (!line) {
    return std::nullopt;
  }
  return UgpioHostLine{.chip = gpiod_chip_name(chip.get()),
                       .label = gpiod_chip_label(chip.get()),
                       .lines = gpiod_chip_num_lines(chip.get()),
                       .offset = gpiod_line_offset(line)};
}

}  // namespace

// libgpiod's own search over all chips gives up at the first one that it may not open.
std::optional<UgpioHostLine> ugpio_host_find_line(const char *name) {
  int reason = ENOENT;
  for (const auto &[number, device] : chip_devices()) {
    if (auto line = find_on_chip(device, name)) {
      return line;
    }
    if (errno != ENOENT) {
      reason = errno;
    }
  }
  errno = reason;
  return std::nullopt;
}
