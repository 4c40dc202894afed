// The user's settings of a port: names, active-low sense, direction.
#include "base/log.h"
#include "port/ioport-private.h"
#include "port/port-name.h"

namespace {

bool name_in_use(const IOPort *ioport, bool input) {
  return ioport->type != PORT_CONFIGURABLE || ioport->direction == input;
}

// A step of a running sequence comes before the new declaration or after it: in between it would be
// sent to nobody.
bool set_name(IOPort *ioport, bool input, const std::string &name) {
  if (!port_name_valid(name)) {
    return false;
  }
  const std::lock_guard lock(ioport->lock);
  auto &held = input ? ioport->input_name : ioport->output_name;
  if (held == name) {
    return true;
  }
  held = name;
  if (name_in_use(ioport, input)) {
    io_port_redeclare_events_locked(ioport);
  }
  return true;
}

void report_current_state(IOPort *ioport) {
  io_port_report_state(ioport, io_port_get_state(ioport));
}

void change_input_sense(IOPort *ioport, bool activelow) {
  if (ioport->activelow_input == activelow) {
    return;
  }
  io_port_reset_event_filters(ioport);
  ioport->activelow_input = activelow;
  if (ioport->set_up && io_port_input(ioport)) {
    report_current_state(ioport);
  }
}

// The line flips, so that what the port says of itself stays.
void change_output_sense(IOPort *ioport, bool activelow) {
  if (ioport->activelow_output == activelow) {
    return;
  }
  io_port_reset_event_filters(ioport);
  ioport->activelow_output = activelow;
  if (ioport->set_up && !io_port_input(ioport)) {
    const bool raw = io_port_read_level(ioport) > 0;
    io_port_set_state_internal(ioport, activelow == raw);
  }
}

}  // namespace

std::optional<std::string> io_port_get_name(const IOPort *ioport) {
  g_return_val_if_fail(ioport != NULL, std::nullopt);
  return io_port_direction_input(ioport) ? ioport->input_name : ioport->output_name;
}

void io_port_get_names(const IOPort *ioport, std::optional<std::string> *input_name,
                       std::optional<std::string> *output_name) {
  if (!ioport) {
    return;
  }
  if (ioport->type != PORT_OUTPUT) {
    *input_name = ioport->input_name;
  }
  if (ioport->type != PORT_INPUT) {
    *output_name = ioport->output_name;
  }
}

bool io_port_set_input_name(IOPort *ioport, const std::string &name) {
  return ioport && ioport->type != PORT_OUTPUT && set_name(ioport, true, name);
}

bool io_port_set_output_name(IOPort *ioport, const std::string &name) {
  return ioport && ioport->type != PORT_INPUT && set_name(ioport, false, name);
}

void io_port_restore_direction(IOPort *ioport, bool input) {
  ioport->direction = input;
}

void io_port_restore_activelow(IOPort *ioport, bool activelow, bool input) {
  (input ? ioport->activelow_input : ioport->activelow_output) = activelow;
}

void io_port_restore_name(IOPort *ioport, std::optional<std::string> name, bool input) {
  if (name && !port_name_valid(*name)) {
    log_warning("Port %s: the %s name is left out: it is not UTF-8 or has more than %zu bytes",
                io_port_describe(ioport), input ? "input" : "output", kPortNameMaxBytes);
    return;
  }
  (input ? ioport->input_name : ioport->output_name) = std::move(name);
}

void io_port_restore_supervised(IOPort *ioport, bool supervised) {
  ioport->supervised = supervised;
}

bool io_port_set_activelow(IOPort *ioport, bool activelow, bool input) {
  g_assert(ioport);
  if (ioport->type == (input ? PORT_OUTPUT : PORT_INPUT)) {
    return false;
  }
  const auto lock = io_port_stop_sequence_and_lock(ioport);
  if (input) {
    change_input_sense(ioport, activelow);
  } else {
    change_output_sense(ioport, activelow);
  }
  return true;
}

bool io_port_set_direction(IOPort *ioport, bool input) {
  g_assert(ioport);
  if (ioport->type != PORT_CONFIGURABLE) {
    return false;
  }
  const auto lock = io_port_stop_sequence_and_lock(ioport);
  const bool changed = ioport->direction.exchange(input) != input;
  if (!ioport->set_up) {
    return true;
  }
  if (ioport->functions->set_direction) {
    ioport->functions->set_direction(ioport, input);
  }
  io_port_set_watch(ioport);
  io_port_declare_events_for_role(ioport, changed);
  report_current_state(ioport);
  return true;
}
