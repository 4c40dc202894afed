// Supervised inputs on a converter that the kernel samples into a buffer, at the pace of a timer.
#include <fcntl.h>
#include <glib-unix.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <string>
#include <string_view>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "base/unique-fd.h"
#include "port/port-error.h"
#include "supervised/iio-sample.h"
#include "supervised/iio-sysfs.h"
#include "supervised/range-property.h"
#include "supervised/supervised-backends.h"
#include "supervised/supervised-data.h"
#include "supervised/supervised-edge-watch.h"
#include "supervised/supervised-parts.h"
#include "supervised/supervised-pins.h"
#include "supervised/supervised-utils.h"

namespace {

constexpr const char *kTimerTriggers = "/sys/kernel/config/iio/triggers/hrtimer/";
constexpr int kFolderMode = 0775;
constexpr guint kRecoveryInterval = 1000;  // milliseconds between two looks for a lost device
constexpr guint kCheckInterval = 1;        // seconds between two looks whether it is lost

struct IioSupervisedData : SupervisedData {
  std::string name;     // of the device whose buffer is read
  std::string adc;      // of the device whose trigger is set
  std::string hrtimer;  // of the trigger
  std::string freq;     // hertz, as the kernel takes it
  int shift = 0;        // to the right, on top of the sample type's own
  int channel = 0;

  std::string dev_path;
  UniqueFd fd;
  IioSampleType iio_type;
  // Action threads ask for these, too.
  std::atomic<std::uint32_t> last_level = 0;
  std::atomic<bool> lost = false;  // the watch could not read a sample; until the next one
  Source device_watch;
  Source device_check;
  Source recovery;
};

PendingRange pending_range;

IioSupervisedData *data_of(IOPort *port) {
  return static_cast<IioSupervisedData *>(io_port_backend_data(port));
}

bool iio_set_control_pins(IOPort *port) {
  supervised_demand_input(port);
  return supervised_drive_control_pins(port, supervised_control_levels(port));
}

// --- Set-up ---

void make_timer_trigger(const std::string &name) {
  const std::string folder = iio_path(kTimerTriggers) + name;
  if (!g_file_test(folder.c_str(), G_FILE_TEST_IS_DIR) &&
      g_mkdir_with_parents(folder.c_str(), kFolderMode) != 0) {
    log_critical("Failed to create sysfs directory '%s': %s", folder.c_str(), g_strerror(errno));
  }
}

// The timer's trigger at its frequency, for the converter.
bool setup_trigger(const IioSupervisedData *data, int adc) {
  if (!data->hrtimer.empty()) {
    make_timer_trigger(data->hrtimer);
  }
  const int trigger = iio_find_number(data->hrtimer, IIO_KIND_TRIGGER);
  if (trigger < 0) {
    log_critical("Failed to find trigger");
    return false;
  }
  sysfs_write(iio_folder(IIO_KIND_TRIGGER, trigger) + "sampling_frequency", data->freq);
  const std::string current = iio_folder(IIO_KIND_DEVICE, adc) + "trigger/current_trigger";
  if (sysfs_read(current) != data->hrtimer) {
    sysfs_write(current, data->hrtimer);
  }
  return true;
}

// The start of the path of the channel's files; a device with a single channel may not number it.
std::string scan_element(const IioSupervisedData *data, int device) {
  const std::string element = iio_folder(IIO_KIND_DEVICE, device) + "scan_elements/in_voltage";
  return g_file_test((element + "_en").c_str(), G_FILE_TEST_EXISTS)
             ? element
             : element + std::to_string(data->channel);
}

// A converter of another kind than the board was designed for. Its readings would be nonsense from
// the first one on, so the daemon does not run with it.
void demand_usable_sample_type(const IioSupervisedData *backend) {
  g_assert(backend->iio_type.sign == 'u');
  g_assert(backend->iio_type.bits <= 32);
  g_assert(backend->iio_type.size <= 32);
  g_assert(backend->iio_type.size % 8 == 0);
}

bool read_sample_type(IioSupervisedData *data, const std::string &path) {
  const auto text = sysfs_read(path);
  const auto type = text ? iio_parse_sample_type(*text) : std::nullopt;
  if (!type) {
    log_critical("Failed to find device type: %s", path.c_str());
    return false;
  }
  data->iio_type = *type;
  demand_usable_sample_type(data);
  return true;
}

void enable_buffer(int device, const std::string &element) {
  const std::string enable = iio_folder(IIO_KIND_DEVICE, device) + "buffer/enable";
  sysfs_write_number(enable, 0);
  sysfs_write_number(element + "_en", 1);
  sysfs_write_number(enable, 1);
}

// Reads never block: a spurious wake-up must not stop the daemon. The device allows one user at a
// time, so an earlier descriptor goes first.
bool open_device(IioSupervisedData *data) {
  data->fd.reset();
  data->fd.reset(open(data->dev_path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
  if (!data->fd) {
    log_critical("Failed to open device: %s", g_strerror(errno));
  }
  return static_cast<bool>(data->fd);
}

bool iio_setup_sysfs(IioSupervisedData *data) {
  const int device = iio_find_number(data->name, IIO_KIND_DEVICE);
  const int adc = iio_find_number(data->adc, IIO_KIND_DEVICE);
  if (device < 0 || adc < 0) {
    log_critical("Failed to find device name: %d %d", device, adc);
    return false;
  }
  data->dev_path = iio_path("/dev/") + iio_entry(IIO_KIND_DEVICE, device);
  if (!setup_trigger(data, adc)) {
    return false;
  }
  const std::string element = scan_element(data, device);
  // A device that is back is the one that passed this before.
  if (!data->lost && !read_sample_type(data, element + "_type")) {
    return false;
  }
  enable_buffer(device, element);
  return open_device(data);
}

bool iio_setup_line(IOPort *port) {
  IioSupervisedData *data = data_of(port);
  data->lost = false;
  data->last_level = 0;
  if (iio_setup_sysfs(data)) {
    return true;
  }
  log_critical("Failed to setup iio device.");
  return false;
}

// --- Samples ---

enum class Read { sample, nothing, failed, gone };

Read failed_read(IioSupervisedData *data, int code, Read result, GError **error) {
  data->lost = true;
  const char *reason = g_strerror(code);
  log_critical("read Error: %s", reason);
  g_set_error_literal(error, io_supervised_error_quark(), IO_SUPERVISED_ERROR_GENERIC, reason);
  return result;
}

Read read_sample(IioSupervisedData *data, GError **error) {
  IioSample sample{};
  const ssize_t length = read(data->fd.get(), sample.data(), data->iio_type.bytes);
  if (length < 0 && (errno == EAGAIN || errno == EINTR)) {
    return Read::nothing;
  }
  if (length <= 0) {
    return failed_read(data, length == 0 ? ENODEV : errno, Read::gone, error);
  }
  if (static_cast<std::size_t>(length) != data->iio_type.bytes) {
    return failed_read(data, EIO, Read::failed, error);
  }
  data->last_level = iio_decode_sample(data->iio_type, sample, data->shift);
  data->lost = false;
  return Read::sample;
}

// Answers from the last sample; before the first one the level is 0. Also from action threads.
bool get_supervised_readout(IOPort *port, SupervisedRangeState *state, std::uint32_t *level,
                            GError **error) {
  const IioSupervisedData *data = data_of(port);
  *state = SUPERVISED_STATE_UNDEFINED;
  *level = data->last_level;
  if (data->lost) {
    return true;
  }
  return supervised_classify_for_port(port, *level, state, error);
}

// --- Device watch ---

gboolean recover(gpointer user_data);

// A device that is gone would wake the main loop without end. It is looked for instead.
void lose_device(IOPort *port, IioSupervisedData *data) {
  data->lost = true;
  data->device_watch.reset();
  data->device_check.reset();
  data->fd.reset();
  data->recovery = Source(g_timeout_add(kRecoveryInterval, recover, port));
}

gboolean on_sample(gint /*fd*/, GIOCondition condition, gpointer user_data) {
  auto *port = static_cast<IOPort *>(user_data);
  IioSupervisedData *data = data_of(port);
  Error error;
  const Read result = (condition & G_IO_IN) != 0
                          ? read_sample(data, error.out())
                          : failed_read(data, ENODEV, Read::gone, error.out());
  if (result == Read::nothing) {
    return G_SOURCE_CONTINUE;
  }
  SupervisedRangeState state = SUPERVISED_STATE_UNDEFINED;
  if (result == Read::sample) {
    (void)supervised_classify_for_port(port, data->last_level, &state, error.out());
  }
  if (error) {
    log_critical("Readout failed: %s", error.message());
  }
  if (result == Read::gone) {
    lose_device(port, data);
  }
  supervised_report_state(port, state);
  return G_SOURCE_CONTINUE;
}

// The kernel wakes nobody for a device that is gone, and its last sample would stand for ever.
gboolean check_device(gpointer user_data) {
  return on_sample(-1, G_IO_IN, user_data);
}

void watch_device(IOPort *port, IioSupervisedData *data) {
  data->recovery.reset();
  data->device_check = Source(g_timeout_add_seconds(kCheckInterval, check_device, port));
  data->device_watch = Source(g_unix_fd_add(data->fd.get(), G_IO_IN, on_sample, port));
}

// Only a device that is there again is worth the messages of a set-up.
gboolean recover(gpointer user_data) {
  auto *port = static_cast<IOPort *>(user_data);
  IioSupervisedData *data = data_of(port);
  if (iio_find_number(data->name, IIO_KIND_DEVICE) >= 0 && iio_setup_sysfs(data)) {
    watch_device(port, data);
  }
  return G_SOURCE_CONTINUE;
}

void set_device_watch(IOPort *port, bool on) {
  IioSupervisedData *data = data_of(port);
  if (!on) {
    data->device_watch.reset();
    data->device_check.reset();
    data->recovery.reset();
    data->lost = false;
  } else if (!data->device_watch && !data->recovery) {
    data->last_state = SUPERVISED_STATE_UNDEFINED;
    if (data->fd) {
      watch_device(port, data);
    } else {
      lose_device(port, data);
    }
  }
}

constexpr SupervisedParts kParts = {
    .sio_ctrl_optional = false,
    .set_control_pins = iio_set_control_pins,
    .setup_line = iio_setup_line,
    .set_line_watch = set_device_watch,
};

// --- Operations ---

bool setup(IOPort *port, bool initial_level) {
  return supervised_setup(port, initial_level, kParts);
}

bool set_supervised(IOPort *port, bool supervised) {
  return supervised_switch(port, supervised, kParts);
}

void start_watch(IOPort *port) {
  supervised_switch_watch(port, io_port_supervised_input(port), kParts);
}

void set_direction(IOPort *port, bool input) {
  (void)supervised_turn(port, input, kParts);
}

void set_device_property(IioSupervisedData *data, std::string_view key, const char *value) {
  if (key == "name") {
    data->name = value;
  } else if (key == "adc") {
    data->adc = value;
  } else if (key == "hrtimer") {
    data->hrtimer = value;
  } else if (key == "freq") {
    data->freq = value;
  } else if (key == "shift") {
    data->shift = property_signed(value);
  } else if (key == "channel") {
    data->channel = property_signed(value);
  }
}

void set_property(IOPort *port, const char *section, const char *key, const char *value) {
  auto *data = io_port_make_backend_data<IioSupervisedData>(port);
  if (supervised_set_pin_property(port, section, key, value)) {
    return;
  }
  if (std::string_view(section) == "range") {
    range_property_apply(&pending_range, port, key, value);
  } else if (std::string_view(section) == "device") {
    set_device_property(data, key, value);
  }
}

void free_data(IOPort *port) {
  io_port_set_backend_data(port, nullptr);
}

constexpr PortFunctions kFunctions = {
    .setup = setup,
    .is_supervisable = supervised_is_supervisable,
    .set_supervised = set_supervised,
    .get_supervised_ranges = supervised_ranges_get,
    .set_supervised_ranges = supervised_ranges_set,
    .get_supervised_readout = get_supervised_readout,
    .get_state = supervised_pin_level,
    .set_state = supervised_set_state,
    .start_watch = start_watch,
    .set_direction = set_direction,
    .set_property = set_property,
    .free = free_data,
};

}  // namespace

const PortFunctions *supervised_iio_backend_functions(IOPort *port) {
  io_port_make_backend_data<IioSupervisedData>(port);
  return &kFunctions;
}
