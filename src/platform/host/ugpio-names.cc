// From a chip's character device to the chip's numbers in sysfs. The two name chips differently;
// what they share is the device that the chip belongs to, and the chip's label and size.
#include <cerrno>
#include <filesystem>
#include <system_error>

#include "base/glib-ptr.h"
#include "platform/host/ugpio-host.h"

namespace {

constexpr int kDecimal = 10;

using std::filesystem::path;

std::optional<unsigned int> read_number(const path &file) {
  const auto text = ugpio_host_read_file(file.string());
  guint64 number = 0;
  if (!text ||
      !g_ascii_string_to_unsigned(text->c_str(), kDecimal, 0, G_MAXUINT, &number, nullptr)) {
    return std::nullopt;
  }
  return static_cast<unsigned int>(number);
}

// A chip without a device of its own is its own device.
bool same_device(const path &character_device, const path &owner) {
  return owner == character_device || owner == character_device.parent_path();
}

bool is_chip_of(const path &chip, const UgpioHostLine &line, const path &character_device) {
  std::error_code error;
  const path owner = canonical(chip / "device", error);
  return !error && same_device(character_device, owner) &&
         ugpio_host_read_file((chip / "label").string()) == line.label &&
         read_number(chip / "ngpio") == line.lines;
}

std::optional<unsigned int> fail(int code) {
  errno = code;
  return std::nullopt;
}

}  // namespace

std::optional<unsigned int> ugpio_host_line_number(const UgpioHostLine &line) {
  std::error_code error;
  const path character_device =
      canonical(path(ugpio_host_root()) / "bus/gpio/devices" / line.chip, error);
  const path chips = path(ugpio_host_root()) / "class/gpio";
  const GDirPtr directory(g_dir_open(chips.c_str(), 0, nullptr));
  if (error || !directory) {
    return fail(ENODEV);
  }
  std::optional<unsigned int> base;
  while (const char *name = g_dir_read_name(directory.get())) {
    if (!g_str_has_prefix(name, "gpiochip") || !is_chip_of(chips / name, line, character_device)) {
      continue;
    }
    if (base) {
      return fail(ENOTUNIQ);
    }
    base = read_number(chips / name / "base");
  }
  return base ? std::optional(*base + line.offset) : fail(ENODEV);
}
