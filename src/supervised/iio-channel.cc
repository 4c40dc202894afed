#include "supervised/iio-channel.h"

#include <algorithm>
#include <array>
#include <limits>
#include <utility>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "port/port-error.h"
#include "supervised/iio-sysfs.h"
#include "supervised/range-property.h"

namespace {

constexpr int kDecimal = 10;
constexpr std::int32_t kValueBits = 32;
constexpr double kMicrosecondsPerSecond = 1000000.0;
constexpr int kIntegrationTimeText = 14;

// The start of the paths of the channel's attributes.
std::string attribute_prefix(const IioChannel &channel, int device, const char *subfolder) {
  const std::string name =
      channel.channel_name ? *channel.channel_name : "voltage" + std::to_string(channel.channel);
  std::string prefix = iio_folder(IIO_KIND_DEVICE, device) + subfolder + "in_" + name + "_";
  return channel.chan_extend_name ? prefix + *channel.chan_extend_name + "_" : prefix;
}

// --- The level ---

std::int32_t shift_value(std::int32_t value, std::int32_t distance) {
  return distance <= 0 ? value : value >> std::min(distance, kValueBits - 1);
}

// The number at the start of the text.
std::optional<std::int32_t> parse_value(const std::string &text) {
  using Limits = std::numeric_limits<std::int32_t>;
  char *end = nullptr;
  const gint64 number = g_ascii_strtoll(text.c_str(), &end, kDecimal);
  if (end == text.c_str() || number < Limits::min() || number > Limits::max()) {
    return std::nullopt;
  }
  return static_cast<std::int32_t>(number);
}

void set_raw_path(IioChannel *channel, std::string path) {
  const std::lock_guard lock(channel->raw_path_lock);
  channel->raw_path.swap(path);
}

std::string get_raw_path(IioChannel *channel) {
  const std::lock_guard lock(channel->raw_path_lock);
  return channel->raw_path;
}

// --- Settings of the device ---

// A setting that all channels of the device share.
struct SharedSetting {
  std::string path;
  const char *name;
  std::string text;
};

std::string seconds_text(std::int32_t microseconds) {
  std::array<char, kIntegrationTimeText + 1> seconds{};
  return g_ascii_formatd(seconds.data(), seconds.size(), "%f",
                         microseconds / kMicrosecondsPerSecond);
}

std::vector<SharedSetting> shared_settings(const IioChannel &channel, int device) {
  constexpr const char *frequency = "in_voltage_sampling_frequency";
  constexpr const char *period = "in_voltage_thresh_either_period";
  constexpr const char *time = "in_proximity_integration_time";
  const std::string folder = iio_folder(IIO_KIND_DEVICE, device);
  std::vector<SharedSetting> settings;
  if (channel.shared_samplefreq) {
    const bool for_voltages = g_file_test((folder + frequency).c_str(), G_FILE_TEST_EXISTS);
    settings.push_back({folder + (for_voltages ? frequency : "sampling_frequency"), frequency,
                        *channel.shared_samplefreq});
  }
  if (channel.shared_thresh_either_period) {
    settings.push_back({folder + "events/" + period, period, *channel.shared_thresh_either_period});
  }
  if (channel.integration_time > 0) {
    settings.push_back({folder + time, time, seconds_text(channel.integration_time)});
  }
  return settings;
}

// False: there is no such file.
bool write_shared(const SharedSetting &setting) {
  const SysfsWrite result = sysfs_write(setting.path, setting.text);
  if (result == SysfsWrite::kNotClosed) {
    log_critical("Couldn't close %s", setting.name);
  }
  return result != SysfsWrite::kNotOpened;
}

bool set_text_property(IioChannel *channel, std::string_view key, const char *value) {
  if (key == "driver") {
    channel->driver = value;
  } else if (key == "channel_name") {
    channel->channel_name = value;
  } else if (key == "chan_extend_name") {
    channel->chan_extend_name = value;
  } else if (key == "shared_samplefreq") {
    channel->shared_samplefreq = value;
  } else if (key == "shared_thresh_either_period") {
    channel->shared_thresh_either_period = value;
  } else {
    return false;
  }
  return true;
}

}  // namespace

bool iio_channel_set_property(IioChannel *channel, std::string_view key, const char *value) {
  if (key == "channel") {
    channel->channel = property_unsigned(value);
  } else if (key == "hysteresis") {
    channel->rules.hysteresis = property_unsigned(value);
  } else if (key == "bitshift") {
    channel->rules.bitshift = property_signed(value);
  } else if (key == "one_threshold") {
    channel->rules.one_threshold = std::string_view(value) == "true";
  } else if (key == "integration_time") {
    channel->integration_time = property_signed(value);
  } else {
    return set_text_property(channel, key, value);
  }
  return true;
}

std::vector<std::string> iio_channel_attributes(const IioChannel &channel, int device) {
  auto paths = threshold_paths(attribute_prefix(channel, device, "events/"));
  for (auto &setting : shared_settings(channel, device)) {
    paths.push_back(std::move(setting.path));
  }
  return paths;
}

bool iio_channel_open(IioChannel *channel, int device, IOPort *port) {
  const std::string prefix = attribute_prefix(*channel, device, "events/");
  ThresholdFiles files = open_threshold_files(prefix);
  if (!has_thresholds(files)) {
    io_port_note_fault(port, "no thresholds can be set with %s...", prefix.c_str());
    log_warning("Port %s: no thresholds can be set with %s...", io_port_describe(port),
                prefix.c_str());
  }
  const auto settings = shared_settings(*channel, device);
  const auto missing = std::find_if_not(settings.begin(), settings.end(), write_shared);
  if (missing != settings.end()) {
    io_port_note_fault(port, "there is no %s", missing->path.c_str());
    return false;
  }
  channel->device = device;
  channel->files = std::move(files);
  set_raw_path(channel, attribute_prefix(*channel, device, "") + "raw");
  (void)write_threshold(channel->files.falling_value, 0);
  (void)write_threshold(channel->files.rising_value, 1);
  disable_thresholds(&channel->files);
  return true;
}

bool iio_channel_read(IioChannel *channel, GError **error) {
  const std::string path = get_raw_path(channel);
  const auto text = path.empty() ? std::nullopt : sysfs_read(path);
  const auto raw = text ? parse_value(*text) : std::nullopt;
  if (!raw) {
    g_set_error(error, io_supervised_error_quark(), IO_SUPERVISED_ERROR_GENERIC,
                "Failed to read %s", path.empty() ? "the level: no device" : path.c_str());
    return false;
  }
  channel->value = shift_value(*raw, channel->rules.bitshift);
  return true;
}

bool iio_channel_is_readable(IioChannel *channel) {
  Error ignored;
  const auto text = sysfs_read(get_raw_path(channel), ignored.out());
  return text && parse_value(*text);
}
