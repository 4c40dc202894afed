// The pins of a supervised port: the plain input and output, and the two control pins that lead the
// line either to the plain input or to the converter.
//
// While the port acts as an input exactly one control pin is 1, as an output both are 0. Main
// thread unless said otherwise.
#pragma once

#include "port/ioport.h"

// Applies an attribute of one of the four pin sections, making the pin on its first mention. False:
// it is another section.
bool supervised_set_pin_property(IOPort *port, const char *section, const char *key,
                                 const char *value);

// What the document must give: both plain pins for a configurable port, exactly one for any other.
// False, with a message, when it does not.
bool supervised_check_pins(IOPort *port);
// Requests the plain pins; an output starts at `initial_level`, or at 0 while the port acts as an
// input. A pin that can't be had is logged and goes missing; set-up goes on.
void supervised_request_pins(IOPort *port, bool initial_level);
// Requests the control pins. False, with a message, when sio_ctrl can't be had. Where it is
// optional, not having one is fine.
bool supervised_request_control_pins(IOPort *port, bool sio_ctrl_optional);

struct ControlLevels {
  bool io_ctrl;
  bool sio_ctrl;
  bool pull_up = false;  // io_ctrl may be on as well while the line goes to the converter
};
// Drives io_ctrl, then sio_ctrl. False, with a message, when one of them refuses. When it is
// sio_ctrl that stays as it was, an input gets the io_ctrl that goes with that.
bool supervised_drive_control_pins(IOPort *port, ControlLevels levels);
// Control pins are those of a port that can be an input. Any other is a programming error of the
// caller, and ends the daemon with the caller's place in the message.
void supervised_demand_input(IOPort *port, const char *file = __builtin_FILE(),
                             int line = __builtin_LINE(),
                             const char *function = __builtin_FUNCTION());
// What they have to be by the common rule, for a port that can be an input.
ControlLevels supervised_control_levels(IOPort *port);

// For the backends' tables. Also from action threads.
void supervised_set_state(IOPort *port, std::int32_t level);
// Drives the output pin if the port's type has an output side; false when it has none or it failed.
bool supervised_drive_output(IOPort *port, std::int32_t level);

// Gives the lines of all four pins back; the pins stay.
void supervised_close_pins(IOPort *port);
