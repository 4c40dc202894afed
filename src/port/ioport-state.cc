// Role and state of a port: the two trips between a logical state and a raw level.
#include "base/assert.h"
#include "base/log.h"
#include "port/ioport-private.h"
#include "port/port-listener.h"

namespace {

constexpr std::uint32_t kUnknownLevel = 2;  // and everything above

bool is_driven_output(const IOPort *ioport) {
  return !io_port_input(ioport) && ioport->backend != BACKEND_VIRTUAL && ioport->set_up;
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

bool io_port_is_supervised(const IOPort *ioport) {
  return ioport->supervised;
}

bool io_port_get_activelow(const IOPort *ioport, bool input) {
  return input ? ioport->activelow_input : ioport->activelow_output;
}

std::uint32_t io_port_read_level(IOPort *ioport) {
  return io_port_backend_serves(ioport) && ioport->functions->get_state
             ? ioport->functions->get_state(ioport)
             : 0;
}

void io_port_write_level(IOPort *ioport, std::int32_t level) {
  if (io_port_backend_serves(ioport) && ioport->functions->set_state) {
    ioport->functions->set_state(ioport, level);
  }
}

bool io_port_get_state(IOPort *ioport) {
  g_assert(ioport);
  if (!ioport->set_up) {
    return false;
  }
  const std::uint32_t raw = io_port_read_level(ioport);
  if (raw >= kUnknownLevel) {
    return false;
  }
  return (raw != 0) != io_port_get_activelow(ioport, io_port_input(ioport));
}

bool io_port_set_state(IOPort *ioport, bool state) {
  g_assert(ioport);
  if (!is_driven_output(ioport)) {
    log_warning("Set state on incorrect port");
    return false;
  }
  const std::lock_guard lock(ioport->lock);
  io_port_set_state_internal(ioport, state);
  return true;
}

void io_port_set_state_internal(IOPort *ioport, bool state) {
  g_return_if_fail(ioport != NULL);
  const bool old = io_port_get_state(ioport);
  io_port_write_level(ioport, state != ioport->activelow_output);
  const bool now = io_port_get_state(ioport);
  if (now != old) {
    io_port_report_state(ioport, now);
  }
}

bool io_port_set_virtual(IOPort *ioport, bool state) {
  if (!ioport->events_enabled) {
    return true;
  }
  if (ioport->backend == BACKEND_VIRTUAL && ioport->type == PORT_OUTPUT) {
    io_port_write_level(ioport, state);
  }
  io_port_fire_events(ioport, state);
  io_port_send_signal(ioport, true, state);
  return true;
}

void io_port_report_state(IOPort *ioport, std::int32_t state) {
  io_port_fire_events(ioport, state);
  io_port_send_signal(ioport, false, state != 0);
}

void io_port_report_line(IOPort *ioport, SupervisedRangeState line) {
  const bool state = io_port_get_state(ioport);
  io_port_fire_line_events(ioport, state, static_cast<std::int32_t>(line));
  io_port_send_signal(ioport, false, state);
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
