// Role and state of a port: the two trips between a logical state and a raw level.
#include "base/assert.h"
#include "base/log.h"
#include "port/ioport-private.h"
#include "port/port-listener.h"

namespace {

constexpr std::uint32_t kUnknownLevel = 2;  // and everything above

bool is_driven_output(const IOPort *port) {
  return !io_port_input(port) && port->backend != BACKEND_VIRTUAL && port->set_up;
}

}  // namespace

bool io_port_input(const IOPort *port) {
  assert_nonnull(port->functions);
  return port->type == PORT_INPUT || (port->type == PORT_CONFIGURABLE && port->direction);
}

bool io_port_direction_input(const IOPort *port) {
  switch (port->type) {
    case PORT_INPUT:
      return true;
    case PORT_OUTPUT:
      return false;
    case PORT_CONFIGURABLE:
      return port->direction;
  }
  g_assert_not_reached();
}

bool io_port_supervised_input(const IOPort *port) {
  return io_port_input(port) && port->supervised;
}

bool io_port_is_supervised(const IOPort *port) {
  return port->supervised;
}

bool io_port_get_activelow(const IOPort *port, bool input) {
  return input ? port->activelow_input : port->activelow_output;
}

std::uint32_t io_port_read_level(IOPort *port) {
  return io_port_backend_serves(port) && port->functions->get_state
             ? port->functions->get_state(port)
             : 0;
}

void io_port_write_level(IOPort *port, std::int32_t level) {
  if (io_port_backend_serves(port) && port->functions->set_state) {
    port->functions->set_state(port, level);
  }
}

bool io_port_get_state(IOPort *port) {
  assert_port(port);
  if (!port->set_up) {
    return false;
  }
  const std::uint32_t raw = io_port_read_level(port);
  if (raw >= kUnknownLevel) {
    return false;
  }
  return (raw != 0) != io_port_get_activelow(port, io_port_input(port));
}

bool io_port_set_state(IOPort *port, bool state) {
  assert_port(port);
  if (!is_driven_output(port)) {
    log_warning("Set state on incorrect port");
    return false;
  }
  const std::lock_guard lock(port->lock);
  io_port_set_state_internal(port, state);
  return true;
}

void io_port_set_state_internal(IOPort *port, bool state) {
  return_if_no_port(port);
  const bool old = io_port_get_state(port);
  io_port_write_level(port, state != port->activelow_output);
  const bool now = io_port_get_state(port);
  if (now != old) {
    io_port_report_state(port, now);
  }
}

bool io_port_set_virtual(IOPort *port, bool state) {
  if (!port->events_enabled) {
    return true;
  }
  if (port->backend == BACKEND_VIRTUAL && port->type == PORT_OUTPUT) {
    io_port_write_level(port, state);
  }
  io_port_fire_events(port, state);
  io_port_send_signal(port, true, state);
  return true;
}

void io_port_report_state(IOPort *port, std::int32_t state) {
  io_port_fire_events(port, state);
  io_port_send_signal(port, false, state != 0);
}

void io_port_report_line(IOPort *port, SupervisedRangeState line) {
  const bool state = io_port_get_state(port);
  io_port_fire_line_events(port, state, static_cast<std::int32_t>(line));
  io_port_send_signal(port, false, state);
}

void io_port_send_signal(IOPort *port, bool virtual_change, bool state) {
  if (!port->events_enabled) {
    return;
  }
  g_assert(port->functions != NULL);
  const auto port_changed = port_listener().port_changed;
  if (!port_changed) {
    return;
  }
  const bool input = io_port_input(port);
  port_changed({.number = port->number,
                .is_virtual = io_port_get_flag(port, "virtual"),
                .hidden = io_port_get_flag(port, "hidden"),
                .input = input,
                .virtual_trig = virtual_change,
                .state = state,
                .activelow = io_port_get_activelow(port, input)});
}

void io_port_set_watch(IOPort *port) {
  g_assert(port != NULL);
  if (port->events_enabled && io_port_input(port) && port->functions->start_watch &&
      io_port_backend_serves(port)) {
    port->functions->start_watch(port);
  }
}
