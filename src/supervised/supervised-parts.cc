#include "supervised/supervised-parts.h"

#include "supervised/supervised-data.h"
#include "supervised/supervised-edge-watch.h"
#include "supervised/supervised-pins.h"

namespace {

void stop_watches(IOPort *port, const SupervisedParts &parts) {
  supervised_set_edge_watch(port, false);
  parts.set_line_watch(port, false);
}

bool setup_input(IOPort *port, const SupervisedParts &parts) {
  if (!supervised_request_control_pins(port, parts.sio_ctrl_optional)) {
    return false;
  }
  // A pin that refuses is logged; the port is set up all the same.
  (void)parts.set_control_pins(port);
  return parts.setup_line(port);
}

}  // namespace

bool supervised_setup(IOPort *port, bool initial_level, const SupervisedParts &parts) {
  SupervisedData *data = supervised_data(port);
  if (data->initialised) {
    stop_watches(port, parts);  // they wait for descriptors that are about to go
  }
  data->initialised = false;
  if (!supervised_check_pins(port)) {
    return false;
  }
  supervised_request_pins(port, initial_level);
  data->initialised = io_port_get_type(port) == PORT_OUTPUT || setup_input(port, parts);
  return data->initialised;
}

bool supervised_is_supervisable(IOPort *port) {
  return io_port_get_type(port) != PORT_OUTPUT;
}

void supervised_switch_watch(IOPort *port, bool measured, const SupervisedParts &parts) {
  const SupervisedData *data = supervised_data(port);
  if (!data || !data->initialised) {
    return;
  }
  supervised_set_edge_watch(port, !measured);
  parts.set_line_watch(port, measured);
}

bool supervised_switch(IOPort *port, bool measured, const SupervisedParts &parts) {
  const SupervisedData *data = supervised_data(port);
  supervised_switch_watch(port, measured, parts);
  if (!io_port_input(port) && !io_port_set_direction(port, true)) {
    return false;
  }
  if (data->initialised) {
    (void)parts.set_control_pins(port);
  }
  return true;
}

// Into an output the line leaves the input paths first; into an input it is let go of first.
bool supervised_turn(IOPort *port, bool input, const SupervisedParts &parts) {
  if (!supervised_data(port)->initialised) {
    return false;
  }
  stop_watches(port, parts);
  if (input) {
    (void)supervised_drive_output(port, 0);
    return parts.set_control_pins(port);
  }
  (void)parts.set_control_pins(port);
  return supervised_drive_output(port, io_port_get_activelow(port, false) ? 1 : 0);
}
