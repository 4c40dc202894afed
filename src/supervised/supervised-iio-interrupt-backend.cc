// Supervised inputs on a converter that watches thresholds by itself: the daemon sets them around
// the range that the line is in and sleeps until the level leaves it.
#include "base/log.h"
#include "supervised/iio-interrupt-data.h"
#include "supervised/iio-interrupt-line.h"
#include "supervised/iio-interrupt-properties.h"
#include "supervised/supervised-backends.h"
#include "supervised/supervised-edge-watch.h"
#include "supervised/supervised-parts.h"
#include "supervised/supervised-pins.h"
#include "supervised/supervised-utils.h"

namespace {

// On some boards the plain path's pull-up is what feeds the measured line.
bool iio_int_set_control_pins(IOPort *port) {
  supervised_demand_input(port);
  ControlLevels levels = supervised_control_levels(port);
  if (iio_int_data(port)->pullup_when_supervised && io_port_direction_input(port)) {
    levels.io_ctrl = true;
    levels.pull_up = true;
  }
  return supervised_drive_control_pins(port, levels);
}

constexpr SupervisedParts kParts = {
    .sio_ctrl_optional = true,
    .set_control_pins = iio_int_set_control_pins,
    .setup_line = iio_int_setup_line,
    .set_line_watch = iio_int_set_threshold_watch,
};

bool setup(IOPort *port, bool initial_level) {
  return supervised_setup(port, initial_level, kParts);
}

bool is_supervisable(IOPort *port) {
  const IioIntSupervisedData *data = iio_int_data(port);
  return data && !data->adc_mode && supervised_is_supervisable(port);
}

bool set_supervised(IOPort *port, bool supervised) {
  return supervised_switch(port, supervised || iio_int_data(port)->adc_mode, kParts);
}

bool set_supervised_ranges(IOPort *port, SupervisedRanges ranges, GError **error) {
  if (!supervised_ranges_set(port, std::move(ranges), error)) {
    return false;
  }
  iio_int_ranges_changed(port);
  return true;
}

bool get_supervised_readout(IOPort *port, SupervisedRangeState *state, std::uint32_t *level,
                            GError **error) {
  const IioIntSupervisedData *data = iio_int_data(port);
  if (data->lost) {
    *state = SUPERVISED_STATE_UNDEFINED;
    *level = static_cast<std::uint32_t>(data->value.load());
    return true;
  }
  return iio_int_readout(port, !data->cache_ad_value, state, level, error);
}

// Outputs have a pin only, whatever the document says of their mode.
std::uint32_t get_state(IOPort *port) {
  const bool measured = io_port_supervised_input(port) || iio_int_data(port)->adc_mode;
  if (!measured || io_port_get_type(port) == PORT_OUTPUT) {
    return supervised_pin_level(port);
  }
  SupervisedRangeState state = SUPERVISED_STATE_UNDEFINED;
  std::uint32_t level = 0;
  (void)iio_int_readout(port, true, &state, &level, nullptr);
  return state;
}

void start_watch(IOPort *port) {
  const IioIntSupervisedData *data = iio_int_data(port);
  supervised_switch_watch(port, io_port_supervised_input(port) || (data && data->adc_mode), kParts);
}

void set_direction(IOPort *port, bool input) {
  (void)supervised_turn(port, input, kParts);
}

void drop(IOPort *port) {
  IioIntSupervisedData *data = iio_int_data(port);
  if (!data) {
    return;
  }
  data->initialised = false;
  iio_int_release_line(port);
  supervised_set_edge_watch(port, false);
  supervised_close_pins(port);
}

void free_data(IOPort *port) {
  drop(port);
  io_port_set_backend_data(port, nullptr);
}

constexpr PortFunctions kFunctions = {
    .setup = setup,
    .is_supervisable = is_supervisable,
    .set_supervised = set_supervised,
    .get_supervised_ranges = supervised_ranges_get,
    .set_supervised_ranges = set_supervised_ranges,
    .get_supervised_readout = get_supervised_readout,
    .get_state = get_state,
    .set_state = supervised_set_state,
    .start_watch = start_watch,
    .set_direction = set_direction,
    .set_property = iio_interrupt_set_property,
    .free = free_data,
    .drop = drop,
};

}  // namespace

const PortFunctions *supervised_iio_interrupt_backend_functions(IOPort *port) {
  io_port_make_backend_data<IioIntSupervisedData>(port);
  return &kFunctions;
}
