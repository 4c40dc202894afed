// Numbers of the hardware description, and its "range" element, whose attributes arrive one by one.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "port/ioport.h"

// Decimal. More than 32 bits wrap; not a number reads as 0.
std::uint32_t property_unsigned(const char *text);
std::int32_t property_signed(const char *text);

// The range that an element is at describing. A backend has one for all its ports, so an element
// has to give its state and its lower limit before the upper limit, which completes it.
struct PendingRange {
  std::optional<std::string> state;
  std::uint32_t lower = 0;
};

// Takes an attribute. Gives the upper limit when it completes the range.
std::optional<std::uint32_t> pending_range_take(PendingRange *pending, const char *key,
                                                const char *value);
// Takes an attribute, and adds the range to the port's when it is complete; one that the port
// refuses is logged and dropped.
void range_property_apply(PendingRange *pending, IOPort *port, const char *key, const char *value);
