// The states of a supervised line, and the ranges of converter codes that tell them apart, with
// their text and GVariant forms.
#pragma once

#include <glib.h>

#include <cstdint>
#include <vector>

// The values are fixed: they index the text table and travel in integer event keys.
enum SupervisedRangeState : std::uint32_t {
  SUPERVISED_STATE_OPEN = 0,
  SUPERVISED_STATE_CLOSED = 1,
  SUPERVISED_STATE_SHORT = 2,
  SUPERVISED_STATE_CUT = 3,
  SUPERVISED_STATE_UNDEFINED = 4,
};

// One range of levels. Both limits are inclusive, in raw converter codes.
struct SupervisedRange {
  SupervisedRangeState state;
  std::uint32_t upper;
  std::uint32_t lower;

  bool operator==(const SupervisedRange &) const = default;
};

// Ordered: where ranges overlap, the last one that holds a level decides. An empty list is no list.
using SupervisedRanges = std::vector<SupervisedRange>;

// The word for a state. A state beyond SUPERVISED_STATE_UNDEFINED is a programming error and ends
// the daemon. Any thread.
const char *supervised_range_state2string(SupervisedRangeState state);

// The state for a word, compared exactly; every other text, and none at all, is undefined. Any
// thread.
SupervisedRangeState supervised_range_string2state(const char *text);

// The ranges as a new floating "a(suu)" of (state, lower, upper), in list order. Any thread.
GVariant *supervised_ranges_to_variant(const SupervisedRanges &ranges);

// The ranges of an "a(suu)", by rising lower limit; equal limits keep their order. `variant` stays
// the caller's. Any thread.
SupervisedRanges supervised_ranges_from_variant(GVariant *variant);
