#include "port/supervised-range.h"

#include <algorithm>
#include <array>
#include <string_view>

namespace {

constexpr std::array<const char *, 5> kStateWords = {"open", "closed", "short", "cut", "undefined"};

// Fixed: limits are compared by the sign of their wrapped difference.
bool lower_limit_before(const SupervisedRange &a, const SupervisedRange &b) {
  return static_cast<std::int32_t>(a.lower - b.lower) < 0;
}

}  // namespace

const char *supervised_range_state2string(SupervisedRangeState state) {
  g_assert(state < kStateWords.size());
  return kStateWords[state];
}

SupervisedRangeState supervised_range_string2state(const char *text) {
  const std::string_view word = text ? text : "";
  for (const auto state : {SUPERVISED_STATE_OPEN, SUPERVISED_STATE_CLOSED, SUPERVISED_STATE_CUT,
                           SUPERVISED_STATE_SHORT}) {
    if (word == kStateWords[state]) {
      return state;
    }
  }
  return SUPERVISED_STATE_UNDEFINED;
}

GVariant *supervised_ranges_to_variant(const SupervisedRanges &ranges) {
  GVariantBuilder builder;
  g_variant_builder_init(&builder, G_VARIANT_TYPE("a(suu)"));
  for (const auto &range : ranges) {
    g_variant_builder_add(&builder, "(suu)", supervised_range_state2string(range.state),
                          range.lower, range.upper);
  }
  return g_variant_builder_end(&builder);
}

SupervisedRanges supervised_ranges_from_variant(GVariant *variant) {
  SupervisedRanges ranges;
  GVariantIter iter;
  const char *state = nullptr;
  std::uint32_t lower = 0;
  std::uint32_t upper = 0;
  g_variant_iter_init(&iter, variant);
  while (g_variant_iter_next(&iter, "(&suu)", &state, &lower, &upper)) {
    const SupervisedRange range = {supervised_range_string2state(state), upper, lower};
    const auto place = std::find_if(ranges.begin(), ranges.end(), [&](const auto &other) {
      return lower_limit_before(range, other);
    });
    ranges.insert(place, range);
  }
  return ranges;
}
