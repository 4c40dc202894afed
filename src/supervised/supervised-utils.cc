#include "supervised/supervised-utils.h"

#include <utility>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "port/port-error.h"
#include "supervised/supervised-data.h"
#include "supervised/supervised-edge-watch.h"

namespace {

constexpr guint kPollInterval = 250;  // milliseconds

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

SupervisedRangeState supervised_classify(const SupervisedRanges &ranges, std::uint32_t level) {
  SupervisedRangeState state = SUPERVISED_STATE_UNDEFINED;
  for (const auto &range : ranges) {
    if (range.lower <= level && level <= range.upper) {
      state = range.state;
    }
  }
  return state;
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

bool supervised_supported_states(IOPort * /*port*/, std::vector<const char *> *states) {
  for (const auto state : {SUPERVISED_STATE_CLOSED, SUPERVISED_STATE_OPEN, SUPERVISED_STATE_SHORT,
                           SUPERVISED_STATE_CUT}) {
    states->push_back(supervised_range_state2string(state));
  }
  return true;
}

void supervised_report_state(IOPort *port, SupervisedRangeState state) {
  SupervisedData *data = supervised_data(port);
  if (std::exchange(data->last_state, state) != state) {
    io_port_report_state(port, static_cast<std::int32_t>(state));
  }
}

void supervised_set_poll(IOPort *port, bool on) {
  SupervisedData *data = supervised_data(port);
  if (!on) {
    data->poll.reset();
  } else if (!data->poll) {
    data->last_state = SUPERVISED_STATE_UNDEFINED;
    data->poll = Source(g_timeout_add(kPollInterval, poll_line, port));
  }
}

void supervised_update_watch(IOPort *port) {
  const SupervisedData *data = supervised_data(port);
  if (!data || !data->initialised) {
    return;
  }
  const bool supervised = io_port_supervised_input(port);
  supervised_set_edge_watch(port, !supervised);
  supervised_set_poll(port, supervised);
}
