// What the supervised backends do alike around a measurement of their own: set-up, switching
// between supervision and the plain pin, and between input and output. Main thread.
#pragma once

#include "port/ioport.h"

// What differs between the backends.
struct SupervisedParts {
  // Whether a board may do without the pin that leads the line to the converter.
  bool sio_ctrl_optional;
  // Drives the control pins to what the port is now.
  bool (*set_control_pins)(IOPort *port);
  // Brings the converter of an input up; false, with a message, when it can't.
  bool (*setup_line)(IOPort *port);
  // Watches the measured line, or no longer. Only called between set-up and drop.
  void (*set_line_watch)(IOPort *port, bool on);
};

// A setup: the pins, and for a port that can be an input the converter.
bool supervised_setup(IOPort *port, bool initial_level, const SupervisedParts &parts);
// An is_supervisable: every port but an output.
bool supervised_is_supervisable(IOPort *port);
// Watches the plain pin or the measured line; never both, and neither before set-up.
void supervised_switch_watch(IOPort *port, bool measured, const SupervisedParts &parts);
// A set_supervised: switches the watch, makes the port an input and drives the control pins. Where
// the line stays measured without supervision `measured` differs from `supervised`.
bool supervised_switch(IOPort *port, bool measured, const SupervisedParts &parts);
// A set_direction, called with the new direction already in the port. False when a pin refused.
bool supervised_turn(IOPort *port, bool input, const SupervisedParts &parts);
