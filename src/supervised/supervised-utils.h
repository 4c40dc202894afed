// What every supervised backend does alike: the port's ranges, classifying a level by them, and the
// poll of a line that is read on demand. Main thread.
#pragma once

#include <vector>

#include "port/ioport.h"

// The state of the last range that holds the level, in list order; undefined when none does.
SupervisedRangeState supervised_classify(const SupervisedRanges &ranges, std::uint32_t level);
// The same by the ranges of the port. False, with an error and an undefined state, when it has none
// to offer.
bool supervised_classify_for_port(IOPort *port, std::uint32_t level, SupervisedRangeState *state,
                                  GError **error);

// For the backends' tables: the port's own list, and its replacement. An empty list is no list and
// is refused.
SupervisedRanges supervised_ranges_get(IOPort *port);
bool supervised_ranges_set(IOPort *port, SupervisedRanges ranges, GError **error);

// Adds the words for the states that a supervised port can tell apart, in the order that clients
// know. Always true.
bool supervised_supported_states(IOPort *port, std::vector<const char *> *states);

// Reports the state of the line unless it is the one that was reported last.
void supervised_report_state(IOPort *port, SupervisedRangeState state);
// Four readouts a second. Switched on anew, the first defined state is reported in any case; a
// readout that fails is logged and changes nothing.
void supervised_set_poll(IOPort *port, bool on);
// The start_watch of backends that poll: a supervised input is polled, any other port has its plain
// pin watched. Nothing is watched before set-up.
void supervised_update_watch(IOPort *port);
