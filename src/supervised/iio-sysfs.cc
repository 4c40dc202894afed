#include "supervised/iio-sysfs.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <string_view>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "base/unique-fd.h"

namespace {

constexpr const char *kDevices = "/sys/bus/iio/devices/";
constexpr int kDecimal = 10;

std::string &root() {
  static std::string path;
  return path;
}

const char *prefix_of(int kind) {
  switch (kind) {
    case IIO_KIND_DEVICE:
      return "iio:device";
    case IIO_KIND_TRIGGER:
      return "trigger";
    default:
      return nullptr;
  }
}

std::optional<int> number_after(const char *entry, std::string_view prefix) {
  guint64 number = 0;
  Error error;
  if (!g_ascii_string_to_unsigned(entry + prefix.size(), kDecimal, 0, G_MAXINT, &number,
                                  error.out())) {
    log_critical("Failed to find device number for device %s: %s", entry, error.message());
    return std::nullopt;
  }
  return static_cast<int>(number);
}

bool entry_is_called(int kind, int number, const std::string &name) {
  return sysfs_read(iio_folder(kind, number) + "name") == name;
}

}  // namespace

void iio_set_root(std::string root_path) {
  root() = std::move(root_path);
}

std::string iio_path(const std::string &absolute) {
  return root() + absolute;
}

std::optional<std::string> sysfs_read(const std::string &path) {
  Error error;
  auto text = sysfs_read(path, error.out());
  if (!text) {
    log_critical("Failed to read sysfs path '%s': %s", path.c_str(), error.message());
  }
  return text;
}

std::optional<std::string> sysfs_read(const std::string &path, GError **error) {
  char *contents = nullptr;
  if (!g_file_get_contents(path.c_str(), &contents, nullptr, error)) {
    return std::nullopt;
  }
  const GCharPtr owner(contents);
  const std::string_view text = contents;
  return std::string(text.substr(0, text.rfind('\n')));
}

SysfsWrite sysfs_write(const std::string &path, const std::string &text) {
  UniqueFd file(open(path.c_str(), O_WRONLY | O_TRUNC | O_CLOEXEC));
  if (!file) {
    log_critical("Failed to open sysfs path '%s': %s", path.c_str(), g_strerror(errno));
    return SysfsWrite::kNotOpened;
  }
  const bool written = write(file.get(), text.data(), text.size()) >= 0;
  if (!written) {
    log_critical("Failed to write sysfs path '%s': %s", path.c_str(), g_strerror(errno));
  }
  if (close(file.release()) != 0) {
    log_critical("Failed to close sysfs path '%s': %s", path.c_str(), g_strerror(errno));
    return SysfsWrite::kNotClosed;
  }
  return written ? SysfsWrite::kDone : SysfsWrite::kNotWritten;
}

SysfsWrite sysfs_write_number(const std::string &path, int number) {
  return sysfs_write(path, std::to_string(number).substr(0, 1));
}

std::string iio_entry(int kind, int number) {
  return prefix_of(kind) + std::to_string(number);
}

std::string iio_folder(int kind, int number) {
  return iio_path(kDevices) + iio_entry(kind, number) + "/";
}

int iio_find_number(const std::string &name, int kind) {
  const char *prefix = prefix_of(kind);
  if (!prefix) {
    log_at(G_LOG_LEVEL_DEBUG, "Unknown device_type: %d", kind);
    return -1;
  }
  Error error;
  const GDirPtr devices(g_dir_open(iio_path(kDevices).c_str(), 0, error.out()));
  if (!devices) {
    log_critical("Failed to open sysfs path: %s\n", error.message());
    return -1;
  }
  while (const char *entry = g_dir_read_name(devices.get())) {
    if (!g_str_has_prefix(entry, prefix)) {
      continue;
    }
    const auto number = number_after(entry, prefix);
    if (number && entry_is_called(kind, *number, name)) {
      return *number;
    }
  }
  return -1;
}

bool iio_is_device(int number, const std::string &name) {
  Error ignored;
  return sysfs_read(iio_folder(IIO_KIND_DEVICE, number) + "name", ignored.out()) == name;
}
