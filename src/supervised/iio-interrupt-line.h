// The measured line of a supervised input on threshold events: its converter, its readouts and its
// watch. Main thread unless said otherwise.
#pragma once

#include "port/ioport.h"

// Brings the converter up, all events off. False, with a message, when it can't.
bool iio_int_setup_line(IOPort *port);
// Gives up everything that set-up and the watch hold, but the pins.
void iio_int_release_line(IOPort *port);

// Reads the converter, or takes the value that was read last, and classifies it. False, with an
// error and an undefined state, when it can't be read. Also from action threads.
bool iio_int_readout(IOPort *port, bool fresh, SupervisedRangeState *state, std::uint32_t *level,
                     GError **error);

// Sets the thresholds around the range that the level is in now, and reports every change of the
// state from then on; or no longer. On again: the thresholds are set anew.
void iio_int_set_threshold_watch(IOPort *port, bool on);
// The port has other ranges: thresholds that are set lie around one that may be gone.
void iio_int_ranges_changed(IOPort *port);
