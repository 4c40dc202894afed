// Supervised inputs on a converter that the kernel samples into a buffer, at the pace of a timer.
#include <fcntl.h>
#include <glib-unix.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "base/unique-fd.h"
#include "port/port-error.h"
#include "supervised/iio-line.h"
#include "supervised/iio-sample.h"
#include "supervised/iio-sysfs.h"
#include "supervised/range-property.h"

namespace {

constexpr const char *kTimerTriggers = "/sys/kernel/config/iio/triggers/hrtimer/";
constexpr int kFolderMode = 0775;
constexpr guint kCheckInterval = 1;  // seconds between two looks whether the device is lost

struct IioSupervisedData : IioLine {
  std::string name;     // of the device whose buffer is read
  std::string adc;      // of the device whose trigger is set
  std::string hrtimer;  // of the trigger
  std::string freq;     // hertz, as the kernel takes it
  int shift = 0;        // to the right, on top of the sample type's own
  int channel = 0;

  std::string dev_path;
  UniqueFd fd;
  bool gone = false;  // what `fd` belongs to is no longer there
  IioSampleType iio_type;
  // Action threads ask for these, too.
  std::atomic<std::uint32_t> last_level = 0;
  std::atomic<bool> lost = false;  // the watch could not read a sample; until the next one
  Source device_watch;
  Source device_check;

  bool set_control_pins(IOPort *port) override;
  bool setup_line(IOPort *port) override;
  void set_line_watch(IOPort *port, bool on) override;
  [[nodiscard]] const std::string &device_name() const override { return name; }
  [[nodiscard]] bool is_gone() const override;
  [[nodiscard]] std::string node_of(int device) const override;
  [[nodiscard]] std::vector<std::string> attributes_of(int device) const override;
  bool connect(IOPort *port) override;
  bool resume(IOPort *port) override;
};

PendingRange pending_range;

IioSupervisedData *data_of(IOPort *port) {
  return static_cast<IioSupervisedData *>(io_port_backend_data(port));
}

bool iio_set_control_pins(IOPort *port) {
  supervised_assert_input(port);
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

std::string trigger_frequency(int trigger) {
  return iio_folder(IIO_KIND_TRIGGER, trigger) + "sampling_frequency";
}

std::string current_trigger(int adc) {
  return iio_folder(IIO_KIND_DEVICE, adc) + "trigger/current_trigger";
}

// The timer's trigger at its frequency, for the converter.
bool setup_trigger(IOPort *port, const IioSupervisedData *data, int adc) {
  if (!data->hrtimer.empty()) {
    make_timer_trigger(data->hrtimer);
  }
  const int trigger = iio_find_number(data->hrtimer, IIO_KIND_TRIGGER);
  if (trigger < 0) {
    io_port_note_fault(port, "there is no trigger %s", data->hrtimer.c_str());
    log_critical("Failed to find trigger");
    return false;
  }
  sysfs_write(trigger_frequency(trigger), data->freq);
  const std::string current = current_trigger(adc);
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

// Fixed: a converter of another kind than the board was designed for ends the daemon.
void assert_sample_type(const IioSupervisedData *backend) {
  g_assert(backend->iio_type.sign == 'u');
  g_assert(backend->iio_type.bits <= 32);
  g_assert(backend->iio_type.size <= 32);
  g_assert(backend->iio_type.size % 8 == 0);
}

bool read_sample_type(IOPort *port, IioSupervisedData *data, const std::string &path) {
  const auto text = sysfs_read(path);
  const auto type = text ? iio_parse_sample_type(*text) : std::nullopt;
  if (!type) {
    io_port_note_fault(port, "%s tells no sample type", path.c_str());
    log_critical("Failed to find device type: %s", path.c_str());
    return false;
  }
  data->iio_type = *type;
  assert_sample_type(data);
  return true;
}

std::string buffer_switch(int device) {
  return iio_folder(IIO_KIND_DEVICE, device) + "buffer/enable";
}

void enable_buffer(int device, const std::string &element) {
  const std::string enable = buffer_switch(device);
  sysfs_write_number(enable, 0);
  sysfs_write_number(element + "_en", 1);
  sysfs_write_number(enable, 1);
}

// Reads never block: a spurious wake-up must not stop the daemon. What was open before stays when
// the device can't be opened.
bool open_device(IOPort *port, IioSupervisedData *data) {
  UniqueFd fresh(open(data->dev_path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
  if (!fresh) {
    const char *reason = g_strerror(errno);
    io_port_note_fault(port, "%s: %s", data->dev_path.c_str(), reason);
    log_critical("Failed to open device: %s", reason);
    return false;
  }
  data->fd = std::move(fresh);
  data->gone = false;
  return true;
}

bool iio_setup_sysfs(IOPort *port, IioSupervisedData *data) {
  const int device = iio_find_number(data->name, IIO_KIND_DEVICE);
  const int adc = iio_find_number(data->adc, IIO_KIND_DEVICE);
  if (device < 0 || adc < 0) {
    io_port_note_fault(port, "there is no converter %s",
                       (device < 0 ? data->name : data->adc).c_str());
    log_critical("Failed to find device name: %d %d", device, adc);
    return false;
  }
  data->dev_path = data->node_of(device);
  if (!setup_trigger(port, data, adc)) {
    return false;
  }
  const std::string element = scan_element(data, device);
  // A device that is back is the one that passed this before.
  if (data->iio_type.bytes == 0 && !read_sample_type(port, data, element + "_type")) {
    return false;
  }
  enable_buffer(device, element);
  return open_device(port, data);
}

// --- Samples ---

enum class Read { kSample, kNothing, kTruncated, kFailed };

Read failed_read(IioSupervisedData *data, int code, GError **error, Read result = Read::kFailed) {
  data->lost = true;
  data->gone = data->gone || code == ENODEV;
  const char *reason = g_strerror(code);
  log_critical("read Error: %s", reason);
  g_set_error_literal(error, io_supervised_error_quark(), IO_SUPERVISED_ERROR_GENERIC, reason);
  return result;
}

Read read_sample(IioSupervisedData *data, GError **error) {
  IioSample sample{};
  const ssize_t length = read(data->fd.get(), sample.data(), data->iio_type.bytes);
  if (length < 0 && (errno == EAGAIN || errno == EINTR)) {
    return Read::kNothing;
  }
  if (length <= 0) {
    return failed_read(data, length == 0 ? ENODEV : errno, error);
  }
  if (static_cast<std::size_t>(length) != data->iio_type.bytes) {
    return failed_read(data, EIO, error, Read::kTruncated);
  }
  data->last_level = iio_decode_sample(data->iio_type, sample, data->shift);
  data->lost = false;
  return Read::kSample;
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

void end_watch(IioSupervisedData *data) {
  data->device_watch.reset();
  data->device_check.reset();
}

// A device that can't be read would wake the main loop endlessly. It is retried instead.
void on_device_lost(IOPort *port, IioSupervisedData *data) {
  data->lost = true;
  end_watch(data);
  iio_retry_later(port);
}

gboolean on_sample(gint /*fd*/, GIOCondition condition, gpointer user_data) {
  auto *port = static_cast<IOPort *>(user_data);
  IioSupervisedData *data = data_of(port);
  Error error;
  const Read result = (condition & G_IO_IN) != 0 ? read_sample(data, error.out())
                                                 : failed_read(data, ENODEV, error.out());
  if (result == Read::kNothing) {
    return G_SOURCE_CONTINUE;
  }
  SupervisedRangeState state = SUPERVISED_STATE_UNDEFINED;
  if (result == Read::kSample) {
    (void)supervised_classify_for_port(port, data->last_level, &state, error.out());
  }
  if (error) {
    log_critical("Readout failed: %s", error.message());
  }
  if (result == Read::kFailed) {
    on_device_lost(port, data);
  }
  supervised_report_state(port, state);
  return G_SOURCE_CONTINUE;
}

// The kernel does not wake a poll when the device goes away, and the last sample would be kept.
gboolean check_device(gpointer user_data) {
  return on_sample(-1, G_IO_IN, user_data);
}

// The kernel keeps the oldest samples when its buffer is full: what was queued before the watch
// says nothing of the line now. False: the device can't be read.
bool drop_queued_samples(IioSupervisedData *data) {
  constexpr int most = 64;  // a device that is faster than this is drained enough
  std::array<std::uint8_t, 4096> queued{};
  ssize_t length = 1;
  for (int i = 0; i < most && length > 0; ++i) {
    length = read(data->fd.get(), queued.data(), queued.size());
  }
  const bool readable = length > 0 || (length < 0 && (errno == EAGAIN || errno == EINTR));
  data->gone = length == 0 || (!readable && errno == ENODEV);
  return readable;
}

void watch_device(IOPort *port, IioSupervisedData *data) {
  data->device_check = Source(g_timeout_add_seconds(kCheckInterval, check_device, port));
  data->device_watch = Source(g_unix_fd_add(data->fd.get(), G_IO_IN, on_sample, port));
}

// --- The document ---

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
  IioSupervisedData *data = data_of(port);
  if (supervised_set_pin_property(port, section, key, value)) {
    return;
  }
  if (std::string_view(section) == "range") {
    range_property_apply(&pending_range, port, key, value);
  } else if (std::string_view(section) == "device") {
    set_device_property(data, key, value);
  }
}

}  // namespace

// --- What differs from other lines ---

bool IioSupervisedData::set_control_pins(IOPort *port) {
  return iio_set_control_pins(port);
}

// The device allows one user at a time, so an earlier descriptor goes first.
bool IioSupervisedData::setup_line(IOPort *port) {
  fd.reset();
  iio_type = {};
  refusal_logged = false;
  lost = false;
  last_level = 0;
  if (iio_setup_sysfs(port, this)) {
    return true;
  }
  log_critical("Failed to setup iio device.");
  return false;
}

// Starts from the beginning: a device that was missing may be there now.
void IioSupervisedData::set_line_watch(IOPort *port, bool on) {
  if (!on) {
    end_watch(this);
    retry.stop();
    lost = false;
  } else if (!device_watch) {
    last_state = SUPERVISED_STATE_UNDEFINED;
    lost = !iio_retry_now(port) || lost;
  }
}

bool IioSupervisedData::is_gone() const {
  return gone || !fd;
}

std::string IioSupervisedData::node_of(int device) const {
  return iio_path("/dev/") + iio_entry(IIO_KIND_DEVICE, device);
}

std::vector<std::string> IioSupervisedData::attributes_of(int device) const {
  return {buffer_switch(device), scan_element(this, device) + "_en",
          current_trigger(iio_find_number(adc, IIO_KIND_DEVICE)),
          trigger_frequency(iio_find_number(hrtimer, IIO_KIND_TRIGGER))};
}

bool IioSupervisedData::connect(IOPort *port) {
  return iio_setup_sysfs(port, this);
}

// A device that still can't be read is not logged again; one that could be read before is logged by
// its watch.
bool IioSupervisedData::resume(IOPort *port) {
  if (!drop_queued_samples(this) && lost) {
    return false;
  }
  watch_device(port, this);
  return true;
}

extern constexpr PortFunctions kIioBackend = {
    .make_record = make_backend_record<IioSupervisedData>,
    .setup = supervised_setup,
    .is_supervisable = supervised_is_supervisable,
    .set_supervised = supervised_set_supervised,
    .get_supervised_ranges = supervised_ranges_get,
    .set_supervised_ranges = supervised_ranges_set,
    .get_supervised_readout = get_supervised_readout,
    .get_state = supervised_pin_level,
    .set_state = supervised_set_state,
    .start_watch = supervised_update_watch,
    .set_direction = supervised_set_direction,
    .set_property = set_property,
};
