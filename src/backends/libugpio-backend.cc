// Plain digital inputs and outputs on GPIO lines, and configurable ports, which have one line of
// each kind and a third that switches the terminal between the two.
#include <cerrno>
#include <mutex>
#include <string_view>

#include "backends/edge-watch.h"
#include "backends/libugpio-utils.h"
#include "base/log.h"
#include "port/ioport.h"

namespace {

struct GpioBackendData : PortBackendData {
  GpioPinPtr input;
  GpioPinPtr output;
  GpioPinPtr io_ctrl;

  // For every use of the pins' handles. Nothing else is locked while this is held.
  std::mutex lock;
  EdgeWatch edges{lock, G_IO_ERR};  // of the input
};

GpioBackendData *data_of(IOPort *port) {
  return static_cast<GpioBackendData *>(io_port_backend_data(port));
}

// --- Levels ---

int read_output(GpioBackendData *data) {
  const std::lock_guard guard(data->lock);
  return libugpio_get_gpio_pin(data->output.get());
}

// A line that can't be read counts as active.
std::uint32_t get_state(IOPort *port) {
  GpioBackendData *data = data_of(port);
  const int level = io_port_input(port) ? data->edges.read(data->input.get()) : read_output(data);
  return level != 0 ? 1 : 0;
}

void drive(IOPort *port, const char *role, const GpioPinPtr &pin, int level, const char *failure) {
  const std::lock_guard guard(data_of(port)->lock);
  const bool driven = libugpio_write_gpio_pin(pin.get(), level) != -1;
  const int reason = errno;
  if (!driven) {
    log_warning("%s", failure);
  }
  if (pin) {
    libugpio_note_driven(port, role, pin.get(), driven, reason);
  }
}

void set_state(IOPort *port, std::int32_t level) {
  drive(port, "output", data_of(port)->output, level, "Failed to set state on port!\n");
}

void switch_io_ctrl(IOPort *port, int value) {
  drive(port, "io_ctrl", data_of(port)->io_ctrl, value, "Couldn't change direction on port!\n");
}

void start_watch(IOPort *port) {
  GpioBackendData *data = data_of(port);
  data->edges.start(port, (io_port_input(port) ? data->input : data->output).get());
}

// --- Life ---

void request_pin(IOPort *port, const GpioPinPtr &pin, const char *role, bool is_input, bool value) {
  if (!pin) {
    io_port_note_fault(port, "no %s pin is described", role);
    log_warning("Port %s has no %s line", io_port_describe(port), role);
    return;
  }
  (void)libugpio_request_port_pin(port, role, pin.get(), is_input, value);
}

void setup_configurable(IOPort *port, const GpioBackendData *data, bool initial_level) {
  const bool input = io_port_direction_input(port);
  request_pin(port, data->input, "input", true, false);
  request_pin(port, data->output, "output", false, !input && initial_level);
  request_pin(port, data->io_ctrl, "io_ctrl", false, !input);
}

bool setup(IOPort *port, bool initial_level) {
  GpioBackendData *data = data_of(port);
  g_assert(data != NULL);
  data->edges.stop();
  switch (io_port_get_type(port)) {
    case PORT_INPUT:
      request_pin(port, data->input, "input", true, false);
      break;
    case PORT_OUTPUT:
      request_pin(port, data->output, "output", false, initial_level);
      break;
    case PORT_CONFIGURABLE:
      setup_configurable(port, data, initial_level);
      break;
  }
  return true;
}

// The output and its driver are never on at the wrong time: off before the terminal becomes an
// input, and inactive as soon as it is an output.
void set_direction(IOPort *port, bool input) {
  GpioBackendData *data = data_of(port);
  data->edges.stop();
  if (input) {
    set_state(port, 0);
    switch_io_ctrl(port, 0);
  } else {
    switch_io_ctrl(port, 1);
    set_state(port, io_port_get_activelow(port, false) ? 1 : 0);
  }
}

GpioPinPtr *pin_of_section(GpioBackendData *data, std::string_view section) {
  if (section == "input") {
    return &data->input;
  }
  if (section == "output") {
    return &data->output;
  }
  return section == "io_ctrl" ? &data->io_ctrl : nullptr;
}

void set_property(IOPort *port, const char *section, const char *key, const char *value) {
  GpioBackendData *data = data_of(port);
  GpioPinPtr *pin = pin_of_section(data, section);
  if (!pin) {
    log_warning("Could not parse backend data!\n");
    return;
  }
  libugpio_set_gpio_pin_property(libugpio_make_gpio_pin(*pin), key, value);
}

}  // namespace

extern constexpr PortFunctions kGpioBackend = {
    .make_record = make_backend_record<GpioBackendData>,
    .setup = setup,
    .get_state = get_state,
    .set_state = set_state,
    .start_watch = start_watch,
    .set_direction = set_direction,
    .set_property = set_property,
};
