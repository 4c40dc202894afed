// One GPIO character device through libgpiod 2.
#include <gpiod.h>

#include <cerrno>
#include <memory>

#include "base/glib-ptr.h"
#include "platform/host/ugpio-host.h"

namespace {

using ChipPtr = std::unique_ptr<gpiod_chip, GlibDeleter<gpiod_chip_close>>;
using InfoPtr = std::unique_ptr<gpiod_chip_info, GlibDeleter<gpiod_chip_info_free>>;

}  // namespace

std::optional<UgpioHostLine> ugpio_host_find_on_chip(const std::string &device, const char *name) {
  const ChipPtr chip(gpiod_chip_open(device.c_str()));
  if (!chip) {
    // The device is there; what is missing is its place in sysfs, and not the line.
    errno = errno == ENOENT ? ENODEV : errno;
    return std::nullopt;
  }
  const int offset = gpiod_chip_get_line_offset_from_name(chip.get(), name);
  const InfoPtr info(offset >= 0 ? gpiod_chip_get_info(chip.get()) : nullptr);
  if (!info) {
    return std::nullopt;
  }
  return UgpioHostLine{
      .chip = gpiod_chip_info_get_name(info.get()),
      .label = gpiod_chip_info_get_label(info.get()),
      .lines = static_cast<unsigned int>(gpiod_chip_info_get_num_lines(info.get())),
      .offset = static_cast<unsigned int>(offset)};
}
