#include "supervised/supervised-pins.h"

#include <cstring>
#include <string_view>

#include "base/log.h"
#include "supervised/supervised-data.h"

namespace {

GpioPinPtr *pin_of_section(SupervisedData *data, std::string_view section) {
  if (section == "io_ctrl") {
    return &data->io_ctrl;
  }
  if (section == "sio_ctrl") {
    return &data->sio_ctrl;
  }
  if (section == "input") {
    return &data->input;
  }
  return section == "output" ? &data->output : nullptr;
}

const char *alias_of(const GpioPin &pin) {
  return pin.alias ? pin.alias->c_str() : "(null)";
}

void request_pin(const GpioPinPtr &pin, bool is_input, bool level) {
  if (!pin) {
    return;
  }
  log_info("Init pin: %s", alias_of(*pin));
  // Why it failed is in the log; the port does without the pin.
  (void)libugpio_request_gpio_pin(pin.get(), is_input, level);
}

// The line keeps the direction that it has: the boot loader has set it.
bool request_sio_ctrl(GpioPin &pin) {
  libugpio_close_gpio_pin(&pin);
  pin.handle = pin.alias ? ugpio_request_named(pin.alias->c_str())
                         : ugpio_request(static_cast<unsigned int>(pin.pin), "sioctrl");
  if (!pin.handle) {
    log_critical("Request for gpio pin %s failed.", alias_of(pin));
    return false;
  }
  if (ugpio_full_open(pin.handle) == -1) {
    log_critical("Failed to open gpio pin %s\n", alias_of(pin));
    return false;
  }
  if (ugpio_set_activelow(pin.handle, pin.inverted > 0 ? 1 : 0) != 0) {
    log_critical("Failed set active low!");
    return false;
  }
  return true;
}

// A board may lack a pin; there is nothing to drive then.
bool drive(const GpioPinPtr &pin, bool level) {
  if (!pin) {
    return true;
  }
  if (!libugpio_set_gpio_pin(pin.get(), level ? 1 : 0)) {
    return false;
  }
  pin->driven_high = level;
  return true;
}

// Whether the pins would do for the role that `levels` are meant for when sio_ctrl stays as it is.
// An output has to leave the plain path in any case; an input needs one path, and not both.
bool fits(const ControlLevels &levels, bool sio_ctrl) {
  const bool output = !levels.io_ctrl && !levels.sio_ctrl;
  return output || levels.io_ctrl != sio_ctrl || (sio_ctrl && levels.pull_up);
}

bool has_output_side(IOPort *port) {
  return io_port_get_type(port) != PORT_INPUT;
}

}  // namespace

bool supervised_set_pin_property(IOPort *port, const char *section, const char *key,
                                 const char *value) {
  GpioPinPtr *pin = pin_of_section(supervised_data(port), section);
  if (!pin) {
    return false;
  }
  libugpio_set_gpio_pin_property(libugpio_make_gpio_pin(*pin), key, value);
  return true;
}

bool supervised_check_pins(IOPort *port) {
  const SupervisedData *data = supervised_data(port);
  const bool input = data->input != nullptr;
  const bool output = data->output != nullptr;
  if (io_port_get_type(port) == PORT_CONFIGURABLE) {
    if (!input || !output) {
      log_critical("Supervised IO port should have both 'input' and 'output' pins.");
    }
    return input && output;
  }
  if (input == output) {
    log_critical("Limited IO port should only have either 'input' or 'output' pin.");
  }
  return input != output;
}

void supervised_request_pins(IOPort *port, bool initial_level) {
  const SupervisedData *data = supervised_data(port);
  if (io_port_get_type(port) != PORT_OUTPUT) {
    request_pin(data->input, true, false);
  }
  if (has_output_side(port)) {
    request_pin(data->output, false, !io_port_input(port) && initial_level);
  }
}

bool supervised_request_control_pins(IOPort *port, bool sio_ctrl_optional) {
  SupervisedData *data = supervised_data(port);
  const bool input = io_port_input(port);
  if (data->io_ctrl) {
    request_pin(data->io_ctrl, false, input);
  } else {
    log_warning("Port %s has no io_ctrl pin", io_port_describe(port));
  }
  if (!data->sio_ctrl) {
    if (!sio_ctrl_optional) {
      log_critical("Port %s has no sio_ctrl pin", io_port_describe(port));
    }
    return sio_ctrl_optional;
  }
  return request_sio_ctrl(*data->sio_ctrl);
}

bool supervised_drive_control_pins(IOPort *port, ControlLevels levels) {
  SupervisedData *data = supervised_data(port);
  const std::lock_guard guard(data->pins_lock);
  if (!drive(data->io_ctrl, levels.io_ctrl)) {
    log_critical("Failed to set ioctrl pin");
    return false;
  }
  if (drive(data->sio_ctrl, levels.sio_ctrl)) {
    return true;
  }
  log_critical("Failed to set sioctrl pin");
  if (!fits(levels, data->sio_ctrl->driven_high)) {
    (void)drive(data->io_ctrl, !levels.io_ctrl);
  }
  return false;
}

void supervised_demand_input(IOPort *port, const char *file, int line, const char *function) {
  if (io_port_get_type(port) == PORT_OUTPUT) {
    g_assertion_message_expr(G_LOG_DOMAIN, file, line, function, "port->type == PORT_INPUT");
  }
}

ControlLevels supervised_control_levels(IOPort *port) {
  if (!io_port_direction_input(port)) {
    return {.io_ctrl = false, .sio_ctrl = false};
  }
  const bool supervised = io_port_supervised_input(port);
  return {.io_ctrl = !supervised, .sio_ctrl = supervised};
}

void supervised_set_state(IOPort *port, std::int32_t level) {
  (void)supervised_drive_output(port, level);
}

bool supervised_drive_output(IOPort *port, std::int32_t level) {
  SupervisedData *data = supervised_data(port);
  if (!has_output_side(port) || !data->output) {
    return false;
  }
  const std::lock_guard guard(data->pins_lock);
  return libugpio_set_gpio_pin(data->output.get(), level);
}

void supervised_close_pins(IOPort *port) {
  SupervisedData *data = supervised_data(port);
  const std::lock_guard guard(data->pins_lock);
  for (const auto *pin : {&data->io_ctrl, &data->sio_ctrl, &data->input, &data->output}) {
    libugpio_close_gpio_pin(pin->get());
  }
}
