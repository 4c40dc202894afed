// One GPIO character device through libgpiod 1.
#include <gpiod.h>

#include <memory>

#include "base/glib-ptr.h"
#include "platform/host/ugpio-host.h"

namespace {

using ChipPtr = std::unique_ptr<gpiod_chip, GlibDeleter<gpiod_chip_close>>;

}  // namespace

std::optional<UgpioHostLine> ugpio_host_find_on_chip(const std::string &device, const char *name) {
  const ChipPtr chip(gpiod_chip_open(device.c_str()));
  gpiod_line *line = chip ? gpiod_chip_find_line(chip.get(), name) : nullptr;
  if (!line) {
    return std::nullopt;
  }
  return UgpioHostLine{.chip = gpiod_chip_name(chip.get()),
                       .label = gpiod_chip_label(chip.get()),
                       .lines = gpiod_chip_num_lines(chip.get()),
                       .offset = gpiod_line_offset(line)};
}
