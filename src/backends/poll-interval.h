// How often a backend looks at what can't signal a change.
#pragma once

#include <cstdint>

struct IOPort;

// The interval in milliseconds for a timer of the port: what the hardware description says, or,
// with a warning, a sensible one where that is nothing or 0. A timer without an interval would take
// a processor to itself. Main thread.
std::uint32_t poll_interval(const IOPort *port, std::uint32_t described_ms);
