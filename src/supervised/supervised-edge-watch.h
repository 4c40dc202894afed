// The plain pin of a port that is not supervised now: its level, and the watch of its edges.
#pragma once

#include <cstdint>

struct IOPort;

// The raw level of the input pin while the port acts as an input, else of the output pin; 2 when it
// can't be read. Also from action threads.
std::uint32_t supervised_pin_level(IOPort *port);

// Reports every change of the pin from now on, or no longer. On already: nothing. A pin that can't
// be read any more is looked at once a second until it can. Main thread.
void supervised_set_edge_watch(IOPort *port, bool on);
