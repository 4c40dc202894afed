// A supervised line: an input that is measured while it is supervised, and has its plain pin
// watched while it is not. What all backends do alike is here; what differs are the hooks of their
// private records. Main thread unless said otherwise.
#pragma once

#include <vector>

#include "base/source.h"
#include "supervised/supervised-pins.h"

// What the private records of all supervised backends begin with.
struct SupervisedLine : SupervisedPins {
  // Whether a board may do without the pin that leads the line to the converter.
  [[nodiscard]] virtual bool sio_ctrl_optional() const { return false; }
  // Whether the line is measured, without supervision as well.
  [[nodiscard]] virtual bool always_measured() const { return false; }
  // Drives the control pins to what the port is now.
  virtual bool set_control_pins(IOPort *port) = 0;
  // Brings the converter of an input up; false, with a message, when it can't.
  virtual bool setup_line(IOPort *port) = 0;
  // Watches the measured line, or no longer. Only called between set-up and drop.
  virtual void set_line_watch(IOPort *port, bool on) = 0;

  Source poll;
  // The entry of this port in what would be a table by port number. Held here it serves every
  // number, and ports that share one leave each other's alone.
  SupervisedRangeState last_state = SUPERVISED_STATE_UNDEFINED;
  bool initialised = false;  // set-up has succeeded and the port was not dropped since
};

// --- Operations for the backends' tables ---

// The pins, and for a port that can be an input the converter.
bool supervised_setup(IOPort *port, bool initial_level);
// Every port but an output. Also from action threads.
bool supervised_is_supervisable(IOPort *port);
// Switches the watch, makes the port an input and drives the control pins.
bool supervised_set_supervised(IOPort *port, bool supervised);
// The port's own list, and its replacement. An empty list is no list and is refused.
SupervisedRanges supervised_ranges_get(IOPort *port);
bool supervised_ranges_set(IOPort *port, SupervisedRanges ranges, GError **error);
// Watches the plain pin or the measured line; never both, and neither before set-up.
void supervised_update_watch(IOPort *port);
// Called with the new direction already in the port.
void supervised_set_direction(IOPort *port, bool input);

// --- For the backends themselves ---

// The last range that holds the level, in list order, or none. Any thread.
const SupervisedRange *supervised_find_range(const SupervisedRanges &ranges, std::uint32_t level);
// Its state; undefined when there is none. Any thread.
SupervisedRangeState supervised_classify(const SupervisedRanges &ranges, std::uint32_t level);
// The same by the ranges of the port. False, with an error and an undefined state, when it has none
// to offer. Also from action threads.
bool supervised_classify_for_port(IOPort *port, std::uint32_t level, SupervisedRangeState *state,
                                  GError **error);
// Reports the state of the line unless it is the one that was reported last.
void supervised_report_state(IOPort *port, SupervisedRangeState state);
// Four readouts a second, for a line that is read on demand. Switched on anew, the first defined
// state is reported in any case; a readout that fails is logged and changes nothing.
void supervised_set_poll(IOPort *port, bool on);

// Adds the words for the states that a supervised port can tell apart. Fixed: their order. Always
// true.
bool supervised_supported_states(IOPort *port, std::vector<const char *> *states);
