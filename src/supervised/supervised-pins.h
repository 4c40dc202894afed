// The pins of a supervised port: the plain input and output, and the two control pins that lead the
// line either to the plain input or to the converter.
//
// While the port acts as an input exactly one control pin is 1, as an output both are 0. Main
// thread unless said otherwise.
#pragma once

#include <mutex>

#include "backends/edge-watch.h"
#include "backends/libugpio-utils.h"
#include "port/ioport.h"

struct SupervisedPins : PortBackendData {
  GpioPinPtr io_ctrl;   // 1: the plain input path is connected
  GpioPinPtr sio_ctrl;  // 1: the line goes to the converter
  GpioPinPtr input;
  GpioPinPtr output;
  // For the pins' handles, since action threads drive the output. Nothing else is locked while it
  // is held.
  std::mutex pins_lock;
  EdgeWatch edges{pins_lock, G_IO_PRI};  // of the plain pin
};

// Applies an attribute of one of the four pin sections, making the pin on its first mention. False:
// it is another section.
bool supervised_set_pin_property(IOPort *port, const char *section, const char *key,
                                 const char *value);

// What the document must give: both plain pins for a configurable port, exactly one for any other.
// False, with a message, when it does not.
bool supervised_check_pins(IOPort *port);
// Requests the plain pins; an output starts at `initial_level`, or at 0 while the port acts as an
// input. A pin that is not available is logged, and set-up continues.
void supervised_request_pins(IOPort *port, bool initial_level);
// Requests the control pins. False, with a message, when sio_ctrl is not available, unless
// it is optional and not described.
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
void supervised_assert_input(IOPort *port, const char *file = __builtin_FILE(),
                             int line = __builtin_LINE(),
                             const char *function = __builtin_FUNCTION());
// What they have to be by the common rule, for a port that can be an input.
ControlLevels supervised_control_levels(IOPort *port);

// For the backends' tables; also from action threads. The raw level of the input pin while the port
// acts as an input, else of the output pin; 2 when it can't be read.
std::uint32_t supervised_pin_level(IOPort *port);
// Drives the output pin, if the port's type has an output side.
void supervised_set_state(IOPort *port, std::int32_t level);

// Reports every change of the plain pin from now on, or no longer. On already: nothing. A pin that
// can't be read any more is looked at once a second until it can.
void supervised_set_edge_watch(IOPort *port, bool on);

// Gives the lines of all four pins back; the pins stay.
void supervised_close_pins(IOPort *port);
