// Supervised inputs on an SPI converter that is read on demand.
#include <fcntl.h>
#include <linux/spi/spidev.h>
#include <sys/ioctl.h>

#include <cerrno>
#include <cstdio>
#include <string>
#include <string_view>

#include "backends/spi-sample.h"
#include "base/log.h"
#include "base/unique-fd.h"
#include "port/ioport.h"
#include "port/port-error.h"
#include "supervised/range-property.h"
#include "supervised/supervised.h"

namespace {

struct SpiSupervisedData : SupervisedLine {
  bool set_control_pins(IOPort *port) override;
  bool setup_line(IOPort *port) override;
  void set_line_watch(IOPort *port, bool on) override { supervised_set_poll(port, on); }

  std::string path;          // of the spidev node
  std::uint32_t speed = 0;   // hertz; 0: the device's default
  std::uint8_t address = 0;  // tells the converter what to measure
  // For the descriptor, which an action thread may read through and lose. Nothing else is locked
  // while it is held.
  std::mutex fd_lock;
  UniqueFd fd;
};

PendingRange pending_range;

SpiSupervisedData *data_of(IOPort *port) {
  return static_cast<SpiSupervisedData *>(io_port_backend_data(port));
}

bool spi_set_control_pins(IOPort *port) {
  supervised_assert_input(port);
  return supervised_drive_control_pins(port, supervised_control_levels(port));
}

// --- Set-up ---

// Gives the failed step's message, with errno; null when the device is open.
const char *open_device(SpiSupervisedData *data) {
  data->fd.reset(open(data->path.c_str(), O_RDWR | O_CLOEXEC));
  if (!data->fd) {
    return "Failed to open SPI device.";
  }
  std::uint8_t bits_per_word = 8;
  if (ioctl(data->fd.get(), SPI_IOC_WR_BITS_PER_WORD, &bits_per_word) < 0) {
    return "Failed to set bits per word.";
  }
  if (data->speed != 0 && ioctl(data->fd.get(), SPI_IOC_WR_MAX_SPEED_HZ, &data->speed) < 0) {
    return "Failed to set max speed.";
  }
  return nullptr;
}

// --- Operations ---

bool spi_setup(IOPort *port, bool initial_level) {
  return supervised_setup(port, initial_level);
}

// A transfer that failed costs the device until the port is set up again. Unset, with errno: it
// did.
std::optional<int> read_sample(SpiSupervisedData *data) {
  const std::lock_guard lock(data->fd_lock);
  const auto sample = spi_read_sample(data->fd.get(), data->address);
  if (!sample) {
    const int reason = errno;
    data->fd.reset();
    errno = reason;
  }
  return sample;
}

bool get_supervised_readout(IOPort *port, SupervisedRangeState *state, std::uint32_t *level,
                            GError **error) {
  SpiSupervisedData *data = data_of(port);
  *state = SUPERVISED_STATE_UNDEFINED;
  const auto sample = read_sample(data);
  if (!sample) {
    const char *reason = g_strerror(errno);
    log_critical("Error: %s", reason);
    g_set_error_literal(error, io_supervised_error_quark(), IO_SUPERVISED_ERROR_GENERIC, reason);
    return false;
  }
  *level = static_cast<std::uint32_t>(*sample);
  return supervised_classify_for_port(port, *level, state, error);
}

void set_device_property(SpiSupervisedData *data, std::string_view section, std::string_view key,
                         const char *value) {
  unsigned int address = 0;
  if (section == "address" && std::sscanf(value, "%x", &address) == 1) {
    data->address = static_cast<std::uint8_t>(address);
  } else if (section == "device" && key == "path") {
    data->path = value;
  } else if (section == "speed" && key == "value") {
    data->speed = static_cast<std::uint32_t>(g_ascii_strtoull(value, nullptr, 0));
  }
}

void set_property(IOPort *port, const char *section, const char *key, const char *value) {
  SpiSupervisedData *data = data_of(port);
  if (supervised_set_pin_property(port, section, key, value)) {
    return;
  }
  if (std::string_view(section) == "range") {
    range_property_apply(&pending_range, port, key, value);
  } else {
    set_device_property(data, section, key, value);
  }
}

}  // namespace

bool SpiSupervisedData::set_control_pins(IOPort *port) {
  return spi_set_control_pins(port);
}

bool SpiSupervisedData::setup_line(IOPort *port) {
  const char *failure = open_device(this);
  if (!failure) {
    return true;
  }
  const char *reason = g_strerror(errno);
  io_port_note_fault(port, "%s: %s", path.c_str(), reason);
  log_warning("Can't use %s: %s", path.c_str(), reason);
  log_critical("%s", failure);
  log_critical("Failed to open spi device.");
  return false;
}

extern constexpr PortFunctions kSpiBackend = {
    .make_record = make_backend_record<SpiSupervisedData>,
    .setup = spi_setup,
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
