// The user's settings of a port: names, active-low sense, direction.
#include "base/assert.h"
#include "base/log.h"
#include "port/ioport-private.h"
#include "port/port-name.h"

namespace {

bool name_in_use(const IOPort *port, bool input) {
  return port->type != PORT_CONFIGURABLE || port->direction == input;
}

// Under the lock: the event of a step in between would be lost.
bool set_name(IOPort *port, bool input, const std::string &name) {
  if (!port_name_valid(name)) {
    return false;
  }
  const std::lock_guard lock(port->lock);
  auto &held = input ? port->input_name : port->output_name;
  if (held == name) {
    return true;
  }
  held = name;
  if (name_in_use(port, input)) {
    io_port_redeclare_events_locked(port);
  }
  return true;
}

void report_current_state(IOPort *port) {
  io_port_report_state(port, io_port_get_state(port));
}

void change_input_sense(IOPort *port, bool activelow) {
  if (port->activelow_input == activelow) {
    return;
  }
  io_port_reset_event_filters(port);
  port->activelow_input = activelow;
  if (port->set_up && io_port_input(port)) {
    report_current_state(port);
  }
}

// The line flips, so that what the port says of itself stays.
void change_output_sense(IOPort *port, bool activelow) {
  if (port->activelow_output == activelow) {
    return;
  }
  io_port_reset_event_filters(port);
  port->activelow_output = activelow;
  if (port->set_up && !io_port_input(port)) {
    const bool raw = io_port_read_level(port) > 0;
    io_port_set_state_internal(port, activelow == raw);
  }
}

}  // namespace

std::optional<std::string> io_port_get_name(const IOPort *port) {
  return_if_no_port(port, std::nullopt);
  return io_port_direction_input(port) ? port->input_name : port->output_name;
}

void io_port_get_names(const IOPort *port, std::optional<std::string> *input_name,
                       std::optional<std::string> *output_name) {
  if (!port) {
    return;
  }
  if (port->type != PORT_OUTPUT) {
    *input_name = port->input_name;
  }
  if (port->type != PORT_INPUT) {
    *output_name = port->output_name;
  }
}

bool io_port_set_input_name(IOPort *port, const std::string &name) {
  return port && port->type != PORT_OUTPUT && set_name(port, true, name);
}

bool io_port_set_output_name(IOPort *port, const std::string &name) {
  return port && port->type != PORT_INPUT && set_name(port, false, name);
}

void io_port_restore_direction(IOPort *port, bool input) {
  port->direction = input;
}

void io_port_restore_activelow(IOPort *port, bool activelow, bool input) {
  (input ? port->activelow_input : port->activelow_output) = activelow;
}

void io_port_restore_name(IOPort *port, std::optional<std::string> name, bool input) {
  if (name && !port_name_valid(*name)) {
    log_warning("Port %s: the %s name is ignored: it is not UTF-8 or has more than %zu bytes",
                io_port_describe(port), input ? "input" : "output", kPortNameMaxBytes);
    return;
  }
  (input ? port->input_name : port->output_name) = std::move(name);
}

void io_port_restore_supervised(IOPort *port, bool supervised) {
  port->supervised = supervised;
}

bool io_port_set_activelow(IOPort *port, bool activelow, bool input) {
  assert_port(port);
  if (port->type == (input ? PORT_OUTPUT : PORT_INPUT)) {
    return false;
  }
  const auto lock = io_port_stop_sequence_and_lock(port);
  if (input) {
    change_input_sense(port, activelow);
  } else {
    change_output_sense(port, activelow);
  }
  return true;
}

bool io_port_set_direction(IOPort *port, bool input) {
  assert_port(port);
  if (port->type != PORT_CONFIGURABLE) {
    return false;
  }
  const auto lock = io_port_stop_sequence_and_lock(port);
  const bool changed = port->direction.exchange(input) != input;
  if (!port->set_up) {
    return true;
  }
  if (port->functions->set_direction) {
    port->functions->set_direction(port, input);
  }
  io_port_set_watch(port);
  io_port_declare_events_for_role(port, changed);
  report_current_state(port);
  return true;
}
