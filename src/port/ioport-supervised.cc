// Supervision of a port: forwarders to the backend, and the one rule that all backends share for
// changing a range.
#include <algorithm>
#include <utility>

#include "base/assert.h"
#include "base/glib-ptr.h"
#include "base/log.h"
#include "port/ioport-private.h"
#include "port/port-error.h"

namespace {

constexpr std::int32_t kLevelLimit = 65536;

// Fixed: a limit of 2^31 and more counts as negative.
bool valid_limits(std::uint32_t lower, std::uint32_t upper) {
  const auto low = static_cast<std::int32_t>(lower);
  const auto high = static_cast<std::int32_t>(upper);
  return low < kLevelLimit && high < kLevelLimit && low < high;
}

// The setting is kept, and counts as soon as the port is set up: the call succeeds.
void log_idle_supervision(IOPort *port) {
  if (!port->set_up && port->supervised && !std::exchange(port->idle_logged, true)) {
    log_warning("Port %s is supervised from now on, but its line is not measured: %s",
                io_port_describe(port), io_port_fault(port).c_str());
  }
}

}  // namespace

bool io_port_is_supervisable(IOPort *port) {
  assert_nonnull(port);
  assert_nonnull(port->functions);
  return port->functions->is_supervisable && io_port_backend_serves(port) &&
         port->functions->is_supervisable(port);
}

bool io_port_set_supervised(IOPort *port, bool supervised) {
  assert_nonnull(port->functions);
  if (!io_port_is_supervisable(port)) {
    return false;
  }
  port->supervised = supervised;
  if (port->functions->set_supervised) {
    port->functions->set_supervised(port, supervised);
  }
  log_idle_supervision(port);
  if (io_port_input(port)) {
    io_port_set_direction(port, true);
  }
  return true;
}

SupervisedRanges io_port_range_list(const IOPort *port) {
  const std::lock_guard lock(port->ranges_lock);
  return port->supervised_ranges;
}

void io_port_store_range_list(IOPort *port, SupervisedRanges ranges) {
  const std::lock_guard lock(port->ranges_lock);
  port->supervised_ranges.swap(ranges);
}

bool io_port_get_supervised_ranges(IOPort *port, SupervisedRanges *ranges) {
  assert_nonnull(port->functions);
  assert_nonnull(ranges);
  if (!io_port_is_supervisable(port) || !port->functions->get_supervised_ranges) {
    return false;
  }
  *ranges = port->functions->get_supervised_ranges(port);
  return true;
}

bool io_port_set_supervised_ranges(IOPort *port, SupervisedRanges ranges, GError **error) {
  assert_nonnull(port->functions);
  return io_port_is_supervisable(port) && port->functions->set_supervised_ranges &&
         port->functions->set_supervised_ranges(port, std::move(ranges), error);
}

bool io_port_set_supervised_range(IOPort *port, const char *state_word, std::uint32_t lower,
                                  std::uint32_t upper, GError **error) {
  if (!valid_limits(lower, upper)) {
    g_set_error_literal(error, io_supervised_error_quark(), IO_SUPERVISED_ERROR_BAD_RANGE,
                        "Invalid range.");
    return false;
  }
  const auto state = supervised_range_string2state(state_word);
  if (state == SUPERVISED_STATE_UNDEFINED) {
    g_set_error_literal(error, io_supervised_error_quark(), IO_SUPERVISED_ERROR_BAD_RANGE,
                        "State is undefined.");
    return false;
  }
  SupervisedRanges ranges;
  if (!io_port_get_supervised_ranges(port, &ranges)) {
    g_set_error_literal(error, io_supervised_error_quark(), IO_SUPERVISED_ERROR_GENERIC,
                        "Failed to get ranges from port.");
    return false;
  }
  const auto same = std::find_if(ranges.begin(), ranges.end(),
                                 [&](const auto &range) { return range.state == state; });
  if (same != ranges.end()) {
    ranges.erase(same);
  }
  ranges.push_back({state, upper, lower});
  return io_port_set_supervised_ranges(port, std::move(ranges), error);
}

bool io_port_get_supervised_readout(IOPort *port, SupervisedRangeState *state, std::uint32_t *level,
                                    GError **error) {
  assert_nonnull(port->functions);
  assert_nonnull(state);
  assert_nonnull(level);
  if (!port->functions->get_supervised_readout) {
    g_set_error_literal(error, io_control_error_quark(), IO_CONTROL_ERROR_GENERIC,
                        "Not applicable for port.");
    return false;
  }
  if (!io_port_is_supervisable(port)) {
    g_set_error_literal(error, io_supervised_error_quark(), IO_SUPERVISED_ERROR_NOT_SUPERVISED,
                        "Port is non-supervised");
    return false;
  }
  return port->functions->get_supervised_readout(port, state, level, error);
}

SupervisedRangeState io_port_get_supervised_state(IOPort *port) {
  assert_port(port);
  if (!port->set_up || !io_port_is_supervisable(port)) {
    return SUPERVISED_STATE_OPEN;
  }
  SupervisedRangeState state = SUPERVISED_STATE_UNDEFINED;
  std::uint32_t level = 0;
  Error error;
  if (!io_port_get_supervised_readout(port, &state, &level, error.out())) {
    log_warning("Failed to read supervised state: %s.", error.message());
    return SUPERVISED_STATE_UNDEFINED;
  }
  return state;
}
