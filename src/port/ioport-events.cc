// The port's side of its events: which apply, when they are made known, when they are sent.
#include <algorithm>

#include "base/assert.h"
#include "base/log.h"
#include "port/ioport-private.h"
#include "port/port-listener.h"

namespace {
constexpr const char *kPortAny = "PortAny";
}

IoEvents &io_port_events(IOPort *port) {
  return port->events;
}

bool io_port_event_applies(const IOPort *port, const IoEvent &event) {
  return (event.supervised_input && io_port_supervised_input(port)) ||
         (io_port_input(port) ? event.input : event.output);
}

bool io_port_events_enabled(const IOPort *port) {
  return port->events_enabled;
}

void io_port_set_events_enabled(IOPort *port, bool enabled) {
  if (port->events_enabled == enabled) {
    return;
  }
  port->events_enabled = enabled;
  if (enabled) {
    io_port_declare_events(port);
  } else {
    io_port_undeclare_events(port);
  }
}

void io_port_declare_events(IOPort *port) {
  const auto declare = port_listener().declare_event;
  if (!declare) {
    return;
  }
  for (auto &event : port->events) {
    if (!declare(port, &event)) {
      log_warning("Could not declare event %s", event.name.value_or("").c_str());
    }
  }
}

void io_port_undeclare_events(IOPort *port) {
  const auto undeclare = port_listener().undeclare_event;
  if (!undeclare) {
    return;
  }
  for (auto &event : port->events) {
    undeclare(&event);
  }
}

void io_port_redeclare_events_locked(IOPort *port) {
  const auto redeclare = port_listener().redeclare_event;
  if (!port->events_enabled || !redeclare) {
    return;
  }
  for (auto &event : port->events) {
    redeclare(port, &event);
  }
}

// Under the lock: in between, the event of a step would be lost.
void io_port_redeclare_events(IOPort *port) {
  const std::lock_guard lock(port->lock);
  io_port_redeclare_events_locked(port);
}

void io_port_declare_events_for_role(IOPort *port, bool role_changed) {
  const auto &listener = port_listener();
  if (!port->events_enabled) {
    return;
  }
  for (auto &event : port->events) {
    if (!io_port_event_applies(port, event)) {
      if (listener.undeclare_event) {
        listener.undeclare_event(&event);
      }
      continue;
    }
    // An event of both roles names the port as the role does.
    if (role_changed && listener.redeclare_event) {
      listener.redeclare_event(port, &event);
    }
    if (listener.declare_event) {
      listener.declare_event(port, &event);
    }
  }
}

void io_port_fire_events(IOPort *port, std::int32_t state) {
  io_port_fire_line_events(port, state, state);
}

void io_port_fire_line_events(IOPort *port, std::int32_t state, std::int32_t line) {
  const auto send = port_listener().send_event;
  if (!port->events_enabled || !send) {
    return;
  }
  for (auto &event : port->events) {
    if (io_port_event_applies(port, event)) {
      const bool of_line = event.supervised_input && io_port_supervised_input(port);
      send(port, &event, of_line ? line : state);
    }
  }
}

void io_port_reset_event_filters(IOPort *port) {
  assert_port(port);
  for (auto &event : port->events) {
    event.filter_reset = true;
  }
}

bool io_port_got_port_any(IOPort *port) {
  assert_port(port);
  return port->events_enabled &&
         std::any_of(port->events.begin(), port->events.end(),
                     [](const IoEvent &event) { return event.name == kPortAny; });
}
