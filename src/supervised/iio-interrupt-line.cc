#include "supervised/iio-interrupt-line.h"

#include <fcntl.h>
#include <glib/gstdio.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <limits>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "port/port-error.h"
#include "supervised/iio-interrupt-data.h"
#include "supervised/iio-sysfs.h"
#include "supervised/supervised-utils.h"

namespace {

constexpr int kDecimal = 10;
constexpr std::int32_t kValueBits = 32;
constexpr guint kRecoveryInterval = 1000;  // milliseconds between two looks for a lost device
constexpr double kMicrosecondsPerSecond = 1000000.0;
constexpr int kIntegrationTimeText = 14;

// --- Attributes ---

std::string channel_prefix(const IioIntSupervisedData &data, const char *subfolder) {
  std::string prefix =
      iio_folder(IIO_KIND_DEVICE, data.device) + subfolder + "in_" + *data.channel_name + "_";
  return data.chan_extend_name ? prefix + *data.chan_extend_name + "_" : prefix;
}

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

void set_raw_path(IioIntSupervisedData *data, std::string path) {
  const std::lock_guard lock(data->raw_path_lock);
  data->raw_path.swap(path);
}

std::string get_raw_path(IioIntSupervisedData *data) {
  const std::lock_guard lock(data->raw_path_lock);
  return data->raw_path;
}

bool read_value(IioIntSupervisedData *data, GError **error) {
  const std::string path = get_raw_path(data);
  const auto text = path.empty() ? std::nullopt : sysfs_read(path);
  const auto raw = text ? parse_value(*text) : std::nullopt;
  if (!raw) {
    g_set_error(error, io_supervised_error_quark(), IO_SUPERVISED_ERROR_GENERIC,
                "Failed to read %s", path.empty() ? "the level: no device" : path.c_str());
    return false;
  }
  data->value = shift_value(*raw, data->rules.bitshift);
  return true;
}

// --- Set-up ---

// Writes a setting that all channels of the device share. False: there is no such file.
bool write_shared(const std::string &path, const char *name, const std::string &text) {
  const int fd = open(path.c_str(), O_WRONLY | O_TRUNC | O_CLOEXEC);
  if (fd < 0) {
    log_critical("Failed to open sysfs path '%s': %s", path.c_str(), g_strerror(errno));
    return false;
  }
  if (write(fd, text.data(), text.size()) < 0) {
    log_critical("Failed to write sysfs: %s", g_strerror(errno));
  }
  if (!g_close(fd, nullptr)) {
    log_critical("Couldn't close %s", name);
  }
  return true;
}

bool write_sample_frequency(const IioIntSupervisedData &data, const std::string &folder) {
  if (!data.shared_samplefreq) {
    return true;
  }
  const std::string for_voltages = folder + "in_voltage_sampling_frequency";
  const bool has_own = g_file_test(for_voltages.c_str(), G_FILE_TEST_EXISTS);
  return write_shared(has_own ? for_voltages : folder + "sampling_frequency",
                      "in_voltage_sampling_frequency", *data.shared_samplefreq);
}

bool write_integration_time(const IioIntSupervisedData &data, const std::string &folder) {
  if (data.integration_time <= 0) {
    return true;
  }
  std::array<char, kIntegrationTimeText + 1> seconds{};
  g_ascii_formatd(seconds.data(), seconds.size(), "%f",
                  data.integration_time / kMicrosecondsPerSecond);
  return write_shared(folder + "in_proximity_integration_time", "in_proximity_integration_time",
                      seconds.data());
}

bool write_shared_settings(const IioIntSupervisedData &data) {
  const std::string folder = iio_folder(IIO_KIND_DEVICE, data.device);
  constexpr const char *period = "in_voltage_thresh_either_period";
  return write_sample_frequency(data, folder) &&
         (!data.shared_thresh_either_period ||
          write_shared(folder + "events/" + period, period, *data.shared_thresh_either_period)) &&
         write_integration_time(data, folder);
}

bool find_device(IioIntSupervisedData *data) {
  data->device = iio_find_number(data->driver, IIO_KIND_DEVICE);
  if (data->device < 0) {
    log_critical("Failed to find device name");
    log_critical("Failed to setup sysfs");
  }
  return data->device >= 0;
}

bool open_int_device(IioIntSupervisedData *data) {
  data->int_device.reset();
  data->int_device = int_device_get(iio_path("/dev/") + iio_entry(IIO_KIND_DEVICE, data->device));
  if (!data->int_device) {
    log_critical("Failed to open backend->device");
  }
  return data->int_device != nullptr;
}

void open_attributes(IioIntSupervisedData *data, const IOPort *port) {
  if (!data->channel_name) {
    data->channel_name = "voltage" + std::to_string(data->channel);
  }
  set_raw_path(data, channel_prefix(*data, "") + "raw");
  const std::string prefix = channel_prefix(*data, "events/");
  data->files = open_threshold_files(prefix);
  if (!data->files.rising_value && !data->files.falling_value) {
    log_warning("Port %s: the kernel has no thresholds %s...", io_port_describe(port),
                prefix.c_str());
  }
}

bool connect(IOPort *port) {
  IioIntSupervisedData *data = iio_int_data(port);
  if (!find_device(data) || !open_int_device(data)) {
    return false;
  }
  open_attributes(data, port);
  if (!write_shared_settings(*data)) {
    return false;
  }
  write_threshold(data->files.falling_value, 0);
  write_threshold(data->files.rising_value, 1);
  disable_thresholds(&data->files);
  return true;
}

// --- Thresholds ---

gboolean read_again(gpointer user_data);
gboolean recover(gpointer user_data);

// A document that asks for no pause at all would keep the main loop from sleeping.
void read_later(IOPort *port, IioIntSupervisedData *data) {
  const guint pause = data->limit_timeout != 0 ? data->limit_timeout : kDefaultLimitTimeout;
  data->limit_timer = Source(g_timeout_add(pause, read_again, port));
}

void look_for_device(IOPort *port, IioIntSupervisedData *data) {
  data->lost = true;
  data->limit_timer.reset();
  data->recovery = Source(g_timeout_add(kRecoveryInterval, recover, port));
}

bool get_ranges(IOPort *port, const IioIntSupervisedData &data, SupervisedRanges *ranges) {
  if (data.adc_mode) {
    *ranges = data.own_ranges;
    return true;
  }
  return io_port_get_supervised_ranges(port, ranges);
}

bool holds(const SupervisedRange &range, std::int32_t value) {
  const auto level = static_cast<std::uint32_t>(value);
  return range.lower <= level && level <= range.upper;
}

// The last range that holds the level, or none.
const SupervisedRange *find_range(const SupervisedRanges &ranges, std::int32_t value) {
  const auto found = std::find_if(ranges.rbegin(), ranges.rend(),
                                  [&](const auto &range) { return holds(range, value); });
  return found == ranges.rend() ? nullptr : &*found;
}

bool at_limit(const IioIntSupervisedData &data, std::int32_t value) {
  return (data.lower_limit != kNoLimit && value <= data.lower_limit) ||
         (data.upper_limit != kNoLimit && value >= data.upper_limit);
}

// A level that has moved on while its thresholds were set crosses none of them any more, and a
// state that was new only to the thresholds is one that nobody was told.
bool must_look_again(IioIntSupervisedData *data, const SupervisedRange &range) {
  const bool untold =
      data->last_state != SUPERVISED_STATE_UNDEFINED && data->last_state != range.state;
  return untold || !read_value(data, nullptr) || !holds(range, data->value);
}

// Where no threshold can be set the level is read again after a while: it would be the last one
// that is ever read otherwise.
void arm(IOPort *port) {
  IioIntSupervisedData *data = iio_int_data(port);
  SupervisedRanges ranges;
  if (!get_ranges(port, *data, &ranges) || !read_value(data, nullptr)) {
    log_critical("Couldn't read adc value for %s\n", io_port_get_name(port).value_or("").c_str());
    look_for_device(port, data);
    return;
  }
  // What was reported last is that the line could not be read.
  const bool readable_again = data->lost.exchange(false);
  data->recovery.reset();
  const SupervisedRange *range = find_range(ranges, data->value);
  if (!range || at_limit(*data, data->value)) {
    read_later(port, data);
    return;
  }
  data->limit_timer.reset();
  apply_thresholds(&data->files, plan_thresholds(*range, data->rules));
  if (readable_again || must_look_again(data, *range)) {
    read_later(port, data);
  }
}

// Reports what the line is now; undefined, with an error, when it can't be read. Whoever is told
// may ask for a readout, which must not answer from an older value then.
void report_line(IOPort *port, GError **error) {
  SupervisedRangeState state = SUPERVISED_STATE_UNDEFINED;
  std::uint32_t level = 0;
  iio_int_data(port)->lost = !iio_int_readout(port, true, &state, &level, error);
  supervised_report_state(port, state);
}

gboolean read_again(gpointer user_data) {
  auto *port = static_cast<IOPort *>(user_data);
  iio_int_data(port)->limit_timer.forget();
  Error error;
  report_line(port, error.out());
  if (error) {
    log_critical("Unable to read from port %s\n", io_port_get_name(port).value_or("").c_str());
  }
  arm(port);
  return G_SOURCE_REMOVE;
}

void on_event(IOPort *port) {
  Error error;
  report_line(port, error.out());
  if (error) {
    log_critical("Readout failed: %s", error.message());
  }
  arm(port);
}

void on_lost(IOPort *port) {
  look_for_device(port, iio_int_data(port));
  supervised_report_state(port, SUPERVISED_STATE_UNDEFINED);
}

void disable(IOPort *port) {
  disable_thresholds(&iio_int_data(port)->files);
}

void watch_events(IOPort *port, const IioIntSupervisedData &data) {
  int_device_watch(data.int_device, {.port = port,
                                     .channel = data.channel,
                                     .disable = disable,
                                     .handle = on_event,
                                     .lost = on_lost});
}

void unwatch_events(IOPort *port, const IioIntSupervisedData &data) {
  if (data.int_device) {
    int_device_unwatch(data.int_device, port);
  }
}

// Only a device that is there again is worth the messages of a set-up.
bool reconnect(IOPort *port) {
  const IioIntSupervisedData *data = iio_int_data(port);
  if (iio_find_number(data->driver, IIO_KIND_DEVICE) < 0) {
    return false;
  }
  unwatch_events(port, *data);
  return connect(port);
}

gboolean recover(gpointer user_data) {
  auto *port = static_cast<IOPort *>(user_data);
  IioIntSupervisedData *data = iio_int_data(port);
  if (!reconnect(port)) {
    return G_SOURCE_CONTINUE;
  }
  data->recovery.forget();
  watch_events(port, *data);
  on_event(port);
  return G_SOURCE_REMOVE;
}

}  // namespace

bool iio_int_setup_line(IOPort *port) {
  IioIntSupervisedData *data = iio_int_data(port);
  data->lost = false;
  data->value = 0;
  if (connect(port)) {
    return true;
  }
  log_critical("Failed to setup iio device.");
  return false;
}

void iio_int_release_line(IOPort *port) {
  IioIntSupervisedData *data = iio_int_data(port);
  iio_int_set_threshold_watch(port, false);
  data->int_device.reset();
  data->files = {};
}

bool iio_int_readout(IOPort *port, bool fresh, SupervisedRangeState *state, std::uint32_t *level,
                     GError **error) {
  IioIntSupervisedData *data = iio_int_data(port);
  *state = SUPERVISED_STATE_UNDEFINED;
  if (fresh && !read_value(data, error)) {
    return false;
  }
  *level = static_cast<std::uint32_t>(data->value.load());
  if (data->adc_mode) {
    *state = supervised_classify(data->own_ranges, *level);
    return true;
  }
  return supervised_classify_for_port(port, *level, state, error);
}

void iio_int_set_threshold_watch(IOPort *port, bool on) {
  IioIntSupervisedData *data = iio_int_data(port);
  data->limit_timer.reset();
  data->recovery.reset();
  data->lost = false;
  if (!on) {
    disable(port);
    unwatch_events(port, *data);
    return;
  }
  data->last_state = SUPERVISED_STATE_UNDEFINED;
  // A device that fails tells its watched ports only.
  const bool failed = !data->int_device || !data->int_device->events;
  if (failed && !reconnect(port)) {
    look_for_device(port, data);
    return;
  }
  watch_events(port, *data);
  arm(port);
}

void iio_int_ranges_changed(IOPort *port) {
  const IioIntSupervisedData *data = iio_int_data(port);
  if (data->initialised && !data->lost && io_port_supervised_input(port)) {
    disable(port);
    arm(port);
  }
}
