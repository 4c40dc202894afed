#include "supervised/supervised-pins.h"

#include <cerrno>
#include <string_view>

#include "base/log.h"

namespace {

constexpr std::uint32_t kUnknownLevel = 2;

SupervisedPins *pins_of(IOPort *port) {
  return static_cast<SupervisedPins *>(io_port_backend_data(port));
}

GpioPinPtr *pin_of_section(SupervisedPins *pins, std::string_view section) {
  if (section == "io_ctrl") {
    return &pins->io_ctrl;
  }
  if (section == "sio_ctrl") {
    return &pins->sio_ctrl;
  }
  if (section == "input") {
    return &pins->input;
  }
  return section == "output" ? &pins->output : nullptr;
}

void request_pin(IOPort *port, const GpioPinPtr &pin, const char *role, bool is_input, bool level) {
  if (!pin) {
    return;
  }
  log_info("Init pin: %s", libugpio_alias_text(pin.get()));
  (void)libugpio_request_port_pin(port, role, pin.get(), is_input, level, G_LOG_LEVEL_CRITICAL);
}

// The line keeps the direction that it has: the boot loader has set it.
bool request_sio_ctrl(IOPort *port, GpioPin &pin) {
  libugpio_close_gpio_pin(&pin);
  pin.handle = pin.alias ? ugpio_request_named(pin.alias->c_str())
                         : ugpio_request(static_cast<unsigned int>(pin.pin), "sioctrl");
  if (!pin.handle) {
    pin.refusal = errno;
    libugpio_note_missing(port, "sio_ctrl", &pin);
    log_critical("Request for gpio pin %s failed.", libugpio_alias_text(&pin));
    return false;
  }
  if (ugpio_full_open(pin.handle) == -1) {
    libugpio_note_missing(port, "sio_ctrl", &pin);
    log_critical("Failed to open gpio pin %s\n", libugpio_alias_text(&pin));
    return false;
  }
  if (ugpio_set_activelow(pin.handle, pin.inverted > 0 ? 1 : 0) != 0) {
    libugpio_note_missing(port, "sio_ctrl", &pin);
    log_critical("Failed set active low!");
    return false;
  }
  return true;
}

// A board may lack a pin; there is nothing to drive then.
bool drive(IOPort *port, const char *role, const GpioPinPtr &pin, int level) {
  if (!pin) {
    return true;
  }
  const bool driven = libugpio_set_gpio_pin(pin.get(), level);
  libugpio_note_driven(port, role, pin.get(), driven, errno);
  if (driven) {
    pin->driven_high = level != 0;
  }
  return driven;
}

bool drive_io_ctrl(IOPort *port, bool on) {
  return drive(port, "io_ctrl", pins_of(port)->io_ctrl, on ? 1 : 0);
}

bool drive_sio_ctrl(IOPort *port, bool on) {
  return drive(port, "sio_ctrl", pins_of(port)->sio_ctrl, on ? 1 : 0);
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

int read_pin(IOPort *port) {
  SupervisedPins *pins = pins_of(port);
  if (io_port_input(port)) {
    return pins->edges.read(pins->input.get());
  }
  const std::lock_guard guard(pins->pins_lock);
  return libugpio_get_gpio_pin(pins->output.get());
}

}  // namespace

bool supervised_set_pin_property(IOPort *port, const char *section, const char *key,
                                 const char *value) {
  GpioPinPtr *pin = pin_of_section(pins_of(port), section);
  if (!pin) {
    return false;
  }
  libugpio_set_gpio_pin_property(libugpio_make_gpio_pin(*pin), key, value);
  return true;
}

bool supervised_check_pins(IOPort *port) {
  const SupervisedPins *pins = pins_of(port);
  const bool input = pins->input != nullptr;
  const bool output = pins->output != nullptr;
  if (io_port_get_type(port) == PORT_CONFIGURABLE) {
    if (!input || !output) {
      io_port_note_fault(port, "it needs both an input and an output pin");
      log_critical("Supervised IO port should have both 'input' and 'output' pins.");
    }
    return input && output;
  }
  if (input == output) {
    io_port_note_fault(port, "it needs either an input or an output pin");
    log_critical("Limited IO port should only have either 'input' or 'output' pin.");
  }
  return input != output;
}

void supervised_request_pins(IOPort *port, bool initial_level) {
  const SupervisedPins *pins = pins_of(port);
  if (io_port_get_type(port) != PORT_OUTPUT) {
    request_pin(port, pins->input, "input", true, false);
  }
  if (has_output_side(port)) {
    request_pin(port, pins->output, "output", false, !io_port_input(port) && initial_level);
  }
}

bool supervised_request_control_pins(IOPort *port, bool sio_ctrl_optional) {
  SupervisedPins *pins = pins_of(port);
  const bool input = io_port_input(port);
  if (pins->io_ctrl) {
    request_pin(port, pins->io_ctrl, "io_ctrl", false, input);
  } else {
    log_warning("Port %s has no io_ctrl pin", io_port_describe(port));
  }
  if (!pins->sio_ctrl) {
    if (!sio_ctrl_optional) {
      io_port_note_fault(port, "no sio_ctrl pin is described");
      log_critical("Port %s has no sio_ctrl pin", io_port_describe(port));
    }
    return sio_ctrl_optional;
  }
  return request_sio_ctrl(port, *pins->sio_ctrl);
}

bool supervised_drive_control_pins(IOPort *port, ControlLevels levels) {
  SupervisedPins *pins = pins_of(port);
  const std::lock_guard guard(pins->pins_lock);
  if (!drive_io_ctrl(port, levels.io_ctrl)) {
    log_critical("Failed to set ioctrl pin");
    return false;
  }
  if (drive_sio_ctrl(port, levels.sio_ctrl)) {
    return true;
  }
  log_critical("Failed to set sioctrl pin");
  if (!fits(levels, pins->sio_ctrl->driven_high)) {
    (void)drive_io_ctrl(port, !levels.io_ctrl);
  }
  return false;
}

void supervised_assert_input(IOPort *port, const char *file, int line, const char *function) {
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

std::uint32_t supervised_pin_level(IOPort *port) {
  const int level = read_pin(port);
  return level < 0 ? kUnknownLevel : static_cast<std::uint32_t>(level != 0);
}

void supervised_set_state(IOPort *port, std::int32_t level) {
  SupervisedPins *pins = pins_of(port);
  if (!has_output_side(port) || !pins->output) {
    return;
  }
  const std::lock_guard guard(pins->pins_lock);
  (void)drive(port, "output", pins->output, level);
}

void supervised_set_edge_watch(IOPort *port, bool on) {
  SupervisedPins *pins = pins_of(port);
  if (!on) {
    pins->edges.stop();
  } else if (!pins->edges.is_on()) {
    pins->edges.start(port, (io_port_input(port) ? pins->input : pins->output).get());
  }
}

void supervised_close_pins(IOPort *port) {
  SupervisedPins *pins = pins_of(port);
  const std::lock_guard guard(pins->pins_lock);
  for (const auto *pin : {&pins->io_ctrl, &pins->sio_ctrl, &pins->input, &pins->output}) {
    libugpio_close_gpio_pin(pin->get());
  }
}
