// The port's side of its events: which apply, when they are made known, when they are sent.
#include <algorithm>

#include "base/log.h"
#include "port/ioport-private.h"
#include "port/port-listener.h"

namespace {
constexpr const char *kPortAny = "PortAny";
}

IoEvents &io_port_events(IOPort *ioport) {
  return ioport->events;
}

bool io_port_event_applies(const IOPort *ioport, const IoEvent &event) {
  return (event.supervised_input && io_port_supervised_input(ioport)) ||
         (io_port_input(ioport) ? event.input : event.output);
}

bool io_port_events_enabled(const IOPort *ioport) {
  return ioport->events_enabled;
}

void io_port_set_events_enabled(IOPort *ioport, bool enabled) {
  if (ioport->events_enabled == enabled) {
    return;
  }
  ioport->events_enabled = enabled;
  if (enabled) {
    io_port_declare_events(ioport);
  } else {
    io_port_undeclare_events(ioport);
  }
}

void io_port_declare_events(IOPort *ioport) {
  const auto declare = port_listener().declare_event;
  if (!declare) {
    return;
  }
  for (auto &event : ioport->events) {
    if (!declare(ioport, &event)) {
      log_warning("Could not declare event %s", event.name.value_or("").c_str());
    }
  }
}

void io_port_undeclare_events(IOPort *ioport) {
  const auto undeclare = port_listener().undeclare_event;
  if (!undeclare) {
    return;
  }
  for (auto &event : ioport->events) {
    undeclare(&event);
  }
}

void io_port_redeclare_events_locked(IOPort *ioport) {
  const auto redeclare = port_listener().redeclare_event;
  if (!ioport->events_enabled || !redeclare) {
    return;
  }
  for (auto &event : ioport->events) {
    redeclare(ioport, &event);
  }
}

// In between, the event of a step would be sent to nobody.
void io_port_redeclare_events(IOPort *ioport) {
  const std::lock_guard lock(ioport->lock);
  io_port_redeclare_events_locked(ioport);
}

void io_port_declare_events_for_role(IOPort *ioport, bool role_changed) {
  const auto &listener = port_listener();
  if (!ioport->events_enabled) {
    return;
  }
  for (auto &event : ioport->events) {
    if (!io_port_event_applies(ioport, event)) {
      if (listener.undeclare_event) {
        listener.undeclare_event(&event);
      }
      continue;
    }
    // An event of both roles names the port as the role does.
    if (role_changed && listener.redeclare_event) {
      listener.redeclare_event(ioport, &event);
    }
    if (listener.declare_event) {
      listener.declare_event(ioport, &event);
    }
  }
}

void io_port_fire_events(IOPort *ioport, std::int32_t state) {
  io_port_fire_line_events(ioport, state, state);
}

void io_port_fire_line_events(IOPort *ioport, std::int32_t state, std::int32_t line) {
  const auto send = port_listener().send_event;
  if (!ioport->events_enabled || !send) {
    return;
  }
  for (auto &event : ioport->events) {
    if (io_port_event_applies(ioport, event)) {
      const bool of_line = event.supervised_input && io_port_supervised_input(ioport);
      send(ioport, &event, of_line ? line : state);
    }
  }
}

void io_port_reset_event_filters(IOPort *ioport) {
  g_assert(ioport);
  for (auto &event : ioport->events) {
    event.filter_reset = true;
  }
}

bool io_port_got_port_any(IOPort *ioport) {
  g_assert(ioport);
  return ioport->events_enabled &&
         std::any_of(ioport->events.begin(), ioport->events.end(),
                     [](const IoEvent &event) { return event.name == kPortAny; });
}
