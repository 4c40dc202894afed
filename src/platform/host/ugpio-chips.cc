// Line names, by the GPIO character devices.
#include <gpiod.h>

#include <cerrno>
#include <memory>

#include "base/glib-ptr.h"
#include "platform/host/ugpio-host.h"

namespace {

constexpr const char *kDevices = "/dev";
constexpr const char *kChipPrefix = "gpiochip";

using ChipPtr = std::unique_ptr<gpiod_chip, GlibDeleter<gpiod_chip_close>>;

std::optional<UgpioHostLine> find_on_chip(const char *chip_name, const char *line_name) {
  const ChipPtr chip(gpiod_chip_open_by_name(chip_name));
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
  const GDirPtr devices(g_dir_open(kDevices, 0, nullptr));
  while (const char *device = devices ? g_dir_read_name(devices.get()) : nullptr) {
    if (!g_str_has_prefix(device, kChipPrefix)) {
      continue;
    }
    if (auto line = find_on_chip(device, name)) {
      return line;
    }
  }
  errno = ENOENT;
  return std::nullopt;
}
