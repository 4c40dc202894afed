#include "supervised/supervised.h"

#include <algorithm>
#include <utility>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "port/port-error.h"

namespace {

constexpr guint kPollInterval = 250;  // milliseconds

SupervisedLine *line_of(IOPort *port) {
  return static_cast<SupervisedLine *>(io_port_backend_data(port));
}

// The watch of the pin is always switched first.
void switch_watch(IOPort *port, bool pin, bool measured) {
  supervised_set_edge_watch(port, pin);
  line_of(port)->set_line_watch(port, measured);
}

void follow_line(IOPort *port, bool supervised) {
  if (const SupervisedLine *line = line_of(port); line->initialised) {
    const bool measured = supervised || line->always_measured();
    switch_watch(port, !measured, measured);
  }
}

bool setup_input(IOPort *port, SupervisedLine *line) {
  if (!supervised_request_control_pins(port, line->sio_ctrl_optional())) {
    return false;
  }
  // A pin that refuses is logged; the port is set up all the same.
  (void)line->set_control_pins(port);
  return line->setup_line(port);
}

gboolean poll_line(gpointer user_data) {
  auto *port = static_cast<IOPort *>(user_data);
  SupervisedRangeState state = SUPERVISED_STATE_UNDEFINED;
  std::uint32_t level = 0;
  Error error;
  if (io_port_get_supervised_readout(port, &state, &level, error.out())) {
    supervised_report_state(port, state);
  } else {
    log_critical("Readout failed: %s", error.message());
  }
  return G_SOURCE_CONTINUE;
}

}  // namespace

bool supervised_setup(IOPort *port, bool initial_level) {
  SupervisedLine *line = line_of(port);
  if (line->initialised) {
    switch_watch(port, false, false);  // they wait for descriptors that are about to go
  }
  line->initialised = false;
  if (!supervised_check_pins(port)) {
    return false;
  }
  supervised_request_pins(port, initial_level);
  line->initialised = io_port_get_type(port) == PORT_OUTPUT || setup_input(port, line);
  return line->initialised;
}

bool supervised_is_supervisable(IOPort *port) {
  return io_port_get_type(port) != PORT_OUTPUT;
}

bool supervised_set_supervised(IOPort *port, bool supervised) {
  SupervisedLine *line = line_of(port);
  follow_line(port, supervised);
  if (!io_port_input(port) && !io_port_set_direction(port, true)) {
    return false;
  }
  if (line->initialised) {
    (void)line->set_control_pins(port);
  }
  return true;
}

SupervisedRanges supervised_ranges_get(IOPort *port) {
  return io_port_range_list(port);
}

bool supervised_ranges_set(IOPort *port, SupervisedRanges ranges, GError **error) {
  if (ranges.empty()) {
    g_set_error_literal(error, io_supervised_error_quark(), IO_SUPERVISED_ERROR_BAD_RANGE,
                        "Ranges is null.");
    return false;
  }
  io_port_store_range_list(port, std::move(ranges));
  return true;
}

void supervised_update_watch(IOPort *port) {
  follow_line(port, io_port_supervised_input(port));
}

// To become an output, the line leaves the input paths before it is driven; to become an input, it
// is no longer driven before it joins them. A pin that refuses is logged.
void supervised_set_direction(IOPort *port, bool input) {
  SupervisedLine *line = line_of(port);
  if (!line->initialised) {
    return;
  }
  switch_watch(port, false, false);
  if (input) {
    supervised_set_state(port, 0);
    (void)line->set_control_pins(port);
  } else {
    (void)line->set_control_pins(port);
    supervised_set_state(port, io_port_get_activelow(port, false) ? 1 : 0);
  }
}

const SupervisedRange *supervised_find_range(const SupervisedRanges &ranges, std::uint32_t level) {
  const auto found = std::find_if(ranges.rbegin(), ranges.rend(), [&](const auto &range) {
    return range.lower <= level && level <= range.upper;
  });
  return found == ranges.rend() ? nullptr : &*found;
}

SupervisedRangeState supervised_classify(const SupervisedRanges &ranges, std::uint32_t level) {
  const SupervisedRange *range = supervised_find_range(ranges, level);
  return range ? range->state : SUPERVISED_STATE_UNDEFINED;
}

bool supervised_classify_for_port(IOPort *port, std::uint32_t level, SupervisedRangeState *state,
                                  GError **error) {
  *state = SUPERVISED_STATE_UNDEFINED;
  SupervisedRanges ranges;
  if (!io_port_get_supervised_ranges(port, &ranges)) {
    g_set_error(error, io_supervised_error_quark(), IO_SUPERVISED_ERROR_NOT_SUPERVISED,
                "Failed to get ranges from port %s", io_port_get_name(port).value_or("").c_str());
    return false;
  }
  *state = supervised_classify(ranges, level);
  return true;
}

void supervised_report_state(IOPort *port, SupervisedRangeState state) {
  if (std::exchange(line_of(port)->last_state, state) != state) {
    io_port_report_state(port, static_cast<std::int32_t>(state));
  }
}

void supervised_set_poll(IOPort *port, bool on) {
  SupervisedLine *line = line_of(port);
  if (!on) {
    line->poll.reset();
  } else if (!line->poll) {
    line->last_state = SUPERVISED_STATE_UNDEFINED;
    line->poll = Source(g_timeout_add(kPollInterval, poll_line, port));
  }
}

bool supervised_supported_states(IOPort * /*port*/, std::vector<const char *> *states) {
  for (const auto state : {SUPERVISED_STATE_CLOSED, SUPERVISED_STATE_OPEN, SUPERVISED_STATE_SHORT,
                           SUPERVISED_STATE_CUT}) {
    states->push_back(supervised_range_state2string(state));
  }
  return true;
}
