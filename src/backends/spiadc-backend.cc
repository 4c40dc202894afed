// Inputs made of a voltage: a converter is sampled at a fixed interval, and the input is active
// while the sample lies in one of some ranges.
#include <fcntl.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <string>
#include <string_view>
#include <vector>

#include "backends/poll-interval.h"
#include "backends/spi-sample.h"
#include "base/log.h"
#include "base/source.h"
#include "base/unique-fd.h"
#include "port/ioport.h"

namespace {

// In raw converter codes.
struct SpiAdcRange {
  std::int32_t active_min = 0;
  std::int32_t active_max = 0;
  std::int32_t hysteresis =
      0;  // widens the range of an active input, narrows that of an inactive one
};

struct SpiAdcBackendData : PortBackendData {
  std::string device;
  std::int32_t address = 0;  // its low byte starts a conversion
  UniqueFd fd;
  std::vector<SpiAdcRange> ranges;  // newest last
  std::uint32_t timeout = 0;        // milliseconds between two samples
  bool inverted = false;
  std::atomic<std::int32_t> state = 0;  // the last result, after inversion
  Source source;
};

SpiAdcBackendData *data_of(IOPort *port) {
  return static_cast<SpiAdcBackendData *>(io_port_backend_data(port));
}

bool setup(IOPort *port, bool /*initial_level*/) {
  SpiAdcBackendData *data = data_of(port);
  g_assert(data != NULL);
  if (io_port_get_type(port) != PORT_INPUT) {
    io_port_note_fault(port, "an SPI ADC port can only be an input");
    log_warning("Port %s: an SPI ADC port can only be an input", io_port_describe(port));
    return false;
  }
  // A path that names a pipe, by mistake, must not hold the start until somebody writes to it.
  data->fd.reset(open(data->device.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
  if (data->fd) {
    return true;
  }
  const char *reason = g_strerror(errno);
  io_port_note_fault(port, "%s: %s", data->device.c_str(), reason);
  log_warning("Failed to open %s: %s", data->device.c_str(), reason);
  return false;
}

std::uint32_t get_state(IOPort *port) {
  return data_of(port)->state > 0 ? 1 : 0;
}

// In 64 bits, where no limit that a document gives can overflow.
bool in_range(const SpiAdcRange &range, std::int64_t sample, bool was_in_range) {
  const std::int64_t widening =
      was_in_range ? std::int64_t{range.hysteresis} : -std::int64_t{range.hysteresis};
  return sample >= range.active_min - widening && sample <= range.active_max + widening;
}

bool in_any_range(const SpiAdcBackendData *data, std::int32_t sample) {
  const bool was_in_range = (data->state > 0) != data->inverted;
  return std::any_of(data->ranges.begin(), data->ranges.end(), [&](const SpiAdcRange &range) {
    return in_range(range, sample, was_in_range);
  });
}

std::int32_t read_sample(const SpiAdcBackendData *data) {
  const auto sample = spi_read_sample(data->fd.get(), static_cast<std::uint8_t>(data->address));
  if (!sample) {
    log_warning("SPI_IOC_MESSAGE failed! : %s", g_strerror(errno));
  }
  return sample.value_or(0);
}

gboolean poll_sample(gpointer user_data) {
  auto *port = static_cast<IOPort *>(user_data);
  SpiAdcBackendData *data = data_of(port);
  const std::int32_t old = data->state;
  data->state = in_any_range(data, read_sample(data)) != data->inverted ? 1 : 0;
  const bool logical = io_port_get_state(port);
  if (data->state != old) {
    io_port_report_state(port, logical);
  }
  return G_SOURCE_CONTINUE;
}

void start_watch(IOPort *port) {
  SpiAdcBackendData *data = data_of(port);
  // A timer that runs goes on: arming it anew would put its next sample off.
  if (data && !data->source) {
    data->source = Source(g_timeout_add(poll_interval(port, data->timeout), poll_sample, port));
  }
}

std::int32_t parse_number(const char *text) {
  return static_cast<std::int32_t>(g_ascii_strtoll(text, nullptr, 0));
}

void set_device_property(SpiAdcBackendData *data, std::string_view key, const char *value) {
  if (key == "device") {
    data->device = value;
  } else if (key == "address") {
    data->address = parse_number(value);
  } else if (key == "timeout") {
    data->timeout = static_cast<std::uint32_t>(parse_number(value));
  } else if (key == "inverted") {
    data->inverted = std::string_view(value) == "true";
  }
}

void set_range_property(SpiAdcBackendData *data, std::string_view key, const char *value) {
  if (data->ranges.empty()) {
    log_warning("Spi ADC backend configured incorrectly");
    return;
  }
  SpiAdcRange &range = data->ranges.back();
  if (key == "active_min") {
    range.active_min = parse_number(value);
  } else if (key == "active_max") {
    range.active_max = parse_number(value);
  } else if (key == "hysteresis") {
    range.hysteresis = parse_number(value);
  }
}

// A "range" section begins a range, whatever it says; the "input" section after it fills the range.
void set_property(IOPort *port, const char *section, const char *key, const char *value) {
  SpiAdcBackendData *data = data_of(port);
  const std::string_view name = section;
  if (name == "device") {
    set_device_property(data, key, value);
  } else if (name == "range") {
    data->ranges.emplace_back();
  } else if (name == "input") {
    set_range_property(data, key, value);
  } else {
    log_warning("Could not parse backend data!\n");
  }
}

}  // namespace

extern constexpr PortFunctions kSpiAdcBackend = {
    .make_record = make_backend_record<SpiAdcBackendData>,
    .setup = setup,
    .get_state = get_state,
    .start_watch = start_watch,
    .set_property = set_property,
};
