// Supervised inputs on a converter that watches thresholds by itself: the daemon sets them around
// the range that the line is in and sleeps until the level leaves it.
#include <string>
#include <string_view>
#include <utility>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "supervised/iio-channel.h"
#include "supervised/iio-line.h"
#include "supervised/iio-sysfs.h"
#include "supervised/int-device.h"
#include "supervised/range-property.h"

namespace {

constexpr std::int32_t kNoLimit = -1;
constexpr std::uint32_t kDefaultLimitTimeout = 1000;

struct IioIntSupervisedData : IioLine, IioChannel {
  // --- From the hardware description ---
  // Levels that thresholds can't lie beyond. There the level is read again after limit_timeout.
  std::int32_t lower_limit = kNoLimit;
  std::int32_t upper_limit = kNoLimit;
  std::uint32_t limit_timeout = kDefaultLimitTimeout;  // milliseconds
  // Not switchable: always watched, by ranges of the document's own.
  bool adc_mode = false;
  SupervisedRanges own_ranges;
  bool cache_ad_value = true;  // readouts answer from the last value read
  bool pullup_when_supervised = false;

  // --- From set-up to drop ---
  IntDevicePtr int_device;
  bool unreadable = false;  // what was reported last is that the line could not be read
  Source limit_timer;

  [[nodiscard]] bool sio_ctrl_optional() const override { return true; }
  [[nodiscard]] bool always_measured() const override { return adc_mode; }
  bool set_control_pins(IOPort *port) override;
  bool setup_line(IOPort *port) override;
  void set_line_watch(IOPort *port, bool on) override;
  [[nodiscard]] const std::string &device_name() const override { return driver; }
  [[nodiscard]] bool is_gone() const override;
  [[nodiscard]] std::string node_of(int number) const override;
  [[nodiscard]] std::vector<std::string> attributes_of(int number) const override;
  bool connect(IOPort *port) override;
  bool resume(IOPort *port) override;
};

PendingRange pending_range;

IioIntSupervisedData *data_of(IOPort *port) {
  return static_cast<IioIntSupervisedData *>(io_port_backend_data(port));
}

// On some boards the plain path's pull-up is what feeds the measured line.
bool iio_int_set_control_pins(IOPort *port) {
  supervised_assert_input(port);
  ControlLevels levels = supervised_control_levels(port);
  if (data_of(port)->pullup_when_supervised && io_port_direction_input(port)) {
    levels.io_ctrl = true;
    levels.pull_up = true;
  }
  return supervised_drive_control_pins(port, levels);
}

// --- Readouts ---

bool get_ranges(IOPort *port, const IioIntSupervisedData &data, SupervisedRanges *ranges) {
  if (data.adc_mode) {
    *ranges = data.own_ranges;
    return true;
  }
  return io_port_get_supervised_ranges(port, ranges);
}

// Reads the converter, or takes the value that was read last, and classifies it. Also from action
// threads.
bool read_line(IOPort *port, bool fresh, SupervisedRangeState *state, std::uint32_t *level,
               GError **error) {
  IioIntSupervisedData *data = data_of(port);
  *state = SUPERVISED_STATE_UNDEFINED;
  if (fresh && !iio_channel_read(data, error)) {
    return false;
  }
  *level = static_cast<std::uint32_t>(data->value.load());
  if (data->adc_mode) {
    *state = supervised_classify(data->own_ranges, *level);
    return true;
  }
  return supervised_classify_for_port(port, *level, state, error);
}

// --- Thresholds ---

gboolean read_again(gpointer user_data);

// Without a pause the main loop would never sleep.
void schedule_read(IOPort *port, IioIntSupervisedData *data) {
  const guint pause = data->limit_timeout != 0 ? data->limit_timeout : kDefaultLimitTimeout;
  data->limit_timer = Source(g_timeout_add(pause, read_again, port));
}

bool at_limit(const IioIntSupervisedData &data, std::int32_t value) {
  return (data.lower_limit != kNoLimit && value <= data.lower_limit) ||
         (data.upper_limit != kNoLimit && value >= data.upper_limit);
}

// A level that moved while its thresholds were set may never cross them, and a state that was first
// seen by the thresholds has not been reported.
bool needs_another_read(IioIntSupervisedData *data, const SupervisedRange &range) {
  const bool unreported =
      data->last_state != SUPERVISED_STATE_UNDEFINED && data->last_state != range.state;
  return unreported || !iio_channel_read(data, nullptr) ||
         !supervised_find_range({range}, static_cast<std::uint32_t>(data->value.load()));
}

// Where no threshold can be set the level is read again after a while. False: the level can't be
// read, or its thresholds can't be set.
bool arm(IOPort *port) {
  IioIntSupervisedData *data = data_of(port);
  SupervisedRanges ranges;
  data->limit_timer.reset();
  if (!get_ranges(port, *data, &ranges) || !iio_channel_read(data, nullptr)) {
    log_critical("Couldn't read adc value for %s\n", io_port_get_name(port).value_or("").c_str());
    data->unreadable = true;
    return false;
  }
  // What was reported last is that the line could not be read.
  const bool readable_again = std::exchange(data->unreadable, false);
  const SupervisedRange *range =
      supervised_find_range(ranges, static_cast<std::uint32_t>(data->value.load()));
  if (!range || at_limit(*data, data->value)) {
    schedule_read(port, data);
    return true;
  }
  if (!apply_thresholds(&data->files, plan_thresholds(*range, data->rules))) {
    return false;
  }
  if (readable_again || needs_another_read(data, *range)) {
    schedule_read(port, data);
  }
  return true;
}

void arm_or_retry(IOPort *port) {
  if (arm(port)) {
    data_of(port)->retry.stop();
  } else {
    iio_retry_later(port);
  }
}

// Reports what the line is now; undefined, with an error, when it can't be read.
void report_line(IOPort *port, GError **error) {
  SupervisedRangeState state = SUPERVISED_STATE_UNDEFINED;
  std::uint32_t level = 0;
  data_of(port)->unreadable = !read_line(port, true, &state, &level, error);
  supervised_report_state(port, state);
}

gboolean read_again(gpointer user_data) {
  auto *port = static_cast<IOPort *>(user_data);
  data_of(port)->limit_timer.forget();
  Error error;
  report_line(port, error.out());
  if (error) {
    log_critical("Unable to read from port %s\n", io_port_get_name(port).value_or("").c_str());
  }
  arm_or_retry(port);
  return G_SOURCE_REMOVE;
}

void on_event(IOPort *port) {
  Error error;
  report_line(port, error.out());
  if (error) {
    log_critical("Readout failed: %s", error.message());
  }
  arm_or_retry(port);
}

void on_lost(IOPort *port) {
  IioIntSupervisedData *data = data_of(port);
  data->limit_timer.reset();
  data->unreadable = true;
  iio_retry_later(port);
  supervised_report_state(port, SUPERVISED_STATE_UNDEFINED);
}

void disable(IOPort *port) {
  disable_thresholds(&data_of(port)->files);
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

// --- Operations ---

bool is_supervisable(IOPort *port) {
  return !data_of(port)->adc_mode && supervised_is_supervisable(port);
}

// Thresholds that are set lie around a range that may be gone.
bool set_supervised_ranges(IOPort *port, SupervisedRanges ranges, GError **error) {
  if (!supervised_ranges_set(port, std::move(ranges), error)) {
    return false;
  }
  const IioIntSupervisedData *data = data_of(port);
  if (data->initialised && !data->retry && io_port_supervised_input(port)) {
    disable(port);
    arm_or_retry(port);
  }
  return true;
}

bool get_supervised_readout(IOPort *port, SupervisedRangeState *state, std::uint32_t *level,
                            GError **error) {
  return read_line(port, !data_of(port)->cache_ad_value, state, level, error);
}

// Outputs have a pin only, whatever the document says of their mode.
std::uint32_t get_state(IOPort *port) {
  const bool measured = io_port_supervised_input(port) || data_of(port)->adc_mode;
  if (!measured || io_port_get_type(port) == PORT_OUTPUT) {
    return supervised_pin_level(port);
  }
  SupervisedRangeState state = SUPERVISED_STATE_UNDEFINED;
  std::uint32_t level = 0;
  (void)read_line(port, true, &state, &level, nullptr);
  return state;
}

void drop(IOPort *port) {
  IioIntSupervisedData *data = data_of(port);
  data->initialised = false;
  data->set_line_watch(port, false);
  data->int_device.reset();
  data->files = {};
  supervised_set_edge_watch(port, false);
  supervised_close_pins(port);
}

// --- The document ---

// In adc mode the ranges stay out of the port and are taken as they come.
void apply_range(IioIntSupervisedData *data, IOPort *port, const char *key, const char *value) {
  if (!data->adc_mode) {
    range_property_apply(&pending_range, port, key, value);
    return;
  }
  if (const auto upper = pending_range_take(&pending_range, key, value)) {
    const char *state = pending_range.state ? pending_range.state->c_str() : nullptr;
    data->own_ranges.push_back({supervised_range_string2state(state), *upper, pending_range.lower});
    pending_range = {};
  }
}

void set_line_property(IioIntSupervisedData *data, std::string_view key, const char *value) {
  const std::string_view word = value;
  if (key == "lower_limit") {
    data->lower_limit = property_signed(value);
  } else if (key == "upper_limit") {
    data->upper_limit = property_signed(value);
  } else if (key == "limit_timeout") {
    data->limit_timeout = property_unsigned(value);
  } else if (key == "mode") {
    data->adc_mode = word == "adc";
  } else if (key == "cache_ad_value") {
    data->cache_ad_value = word != "false";
  } else if (key == "pullup_when_supervised") {
    data->pullup_when_supervised = word == "true";
  }
}

// "mode" has to come before the ranges: it decides whose they are.
void set_property(IOPort *port, const char *section, const char *key, const char *value) {
  IioIntSupervisedData *data = data_of(port);
  if (supervised_set_pin_property(port, section, key, value)) {
    return;
  }
  if (std::string_view(section) == "range") {
    apply_range(data, port, key, value);
  } else if (std::string_view(section) == "device" && !iio_channel_set_property(data, key, value)) {
    set_line_property(data, key, value);
  }
}

}  // namespace

// --- What differs from other lines ---

bool IioIntSupervisedData::set_control_pins(IOPort *port) {
  return iio_int_set_control_pins(port);
}

bool IioIntSupervisedData::setup_line(IOPort *port) {
  refusal_logged = false;
  unreadable = false;
  value = 0;
  if (connect(port)) {
    return true;
  }
  log_critical("Failed to setup iio device.");
  return false;
}

// Starts from the beginning: a device that was missing may be there now.
void IioIntSupervisedData::set_line_watch(IOPort *port, bool on) {
  limit_timer.reset();
  retry.stop();
  unreadable = false;
  if (!on) {
    disable(port);
    unwatch_events(port, *this);
    return;
  }
  last_state = SUPERVISED_STATE_UNDEFINED;
  if (is_gone()) {
    (void)iio_retry_now(port);
    return;
  }
  watch_events(port, *this);
  arm_or_retry(port);
}

bool IioIntSupervisedData::is_gone() const {
  return !int_device || int_device->gone || !iio_is_device(device, driver);
}

std::string IioIntSupervisedData::node_of(int number) const {
  return iio_path("/dev/") + iio_entry(IIO_KIND_DEVICE, number);
}

std::vector<std::string> IioIntSupervisedData::attributes_of(int number) const {
  return iio_channel_attributes(*this, number);
}

bool IioIntSupervisedData::connect(IOPort *port) {
  const int number = iio_find_number(driver, IIO_KIND_DEVICE);
  if (number < 0) {
    io_port_note_fault(port, "there is no converter %s", driver.c_str());
    log_critical("Failed to find device name");
    log_critical("Failed to setup sysfs");
    return false;
  }
  IntDevicePtr found = int_device_get(node_of(number));
  if (!found) {
    io_port_note_fault(port, "%s: %s", node_of(number).c_str(), g_strerror(errno));
    log_critical("Failed to open backend->device");
    return false;
  }
  if (!iio_channel_open(this, number, port)) {
    return false;
  }
  unwatch_events(port, *this);
  int_device = std::move(found);
  return true;
}

// A level that still can't be read is not logged again.
bool IioIntSupervisedData::resume(IOPort *port) {
  watch_events(port, *this);
  if (!iio_channel_is_readable(this)) {
    return false;
  }
  report_line(port, nullptr);
  return arm(port);
}

extern constexpr PortFunctions kIioInterruptBackend = {
    .make_record = make_backend_record<IioIntSupervisedData>,
    .setup = supervised_setup,
    .is_supervisable = is_supervisable,
    .set_supervised = supervised_set_supervised,
    .get_supervised_ranges = supervised_ranges_get,
    .set_supervised_ranges = set_supervised_ranges,
    .get_supervised_readout = get_supervised_readout,
    .get_state = get_state,
    .set_state = supervised_set_state,
    .start_watch = supervised_update_watch,
    .set_direction = supervised_set_direction,
    .set_property = set_property,
    .drop = drop,
};
