// States of supervised lines, their words, and the forms that range lists take outside.
#include "port/supervised-range.h"

#include <gtest/gtest.h>

#include <string>

#include "base/glib-ptr.h"

namespace {

std::string text_of(const SupervisedRanges &ranges) {
  const GVariantPtr variant(g_variant_ref_sink(supervised_ranges_to_variant(ranges)));
  const GCharPtr text(g_variant_print(variant.get(), TRUE));
  return text.get();
}

SupervisedRanges ranges_of(const char *text) {
  const GVariantPtr variant(
      g_variant_parse(G_VARIANT_TYPE("a(suu)"), text, nullptr, nullptr, nullptr));
  return variant ? supervised_ranges_from_variant(variant.get()) : SupervisedRanges{};
}

TEST(SupervisedState, HasItsFixedWord) {
  EXPECT_STREQ(supervised_range_state2string(static_cast<SupervisedRangeState>(0)), "open");
  EXPECT_STREQ(supervised_range_state2string(static_cast<SupervisedRangeState>(1)), "closed");
  EXPECT_STREQ(supervised_range_state2string(static_cast<SupervisedRangeState>(2)), "short");
  EXPECT_STREQ(supervised_range_state2string(static_cast<SupervisedRangeState>(3)), "cut");
  EXPECT_STREQ(supervised_range_state2string(static_cast<SupervisedRangeState>(4)), "undefined");
}

TEST(SupervisedState, IsFoundByItsExactWord) {
  EXPECT_EQ(supervised_range_string2state("open"), 0U);
  EXPECT_EQ(supervised_range_string2state("closed"), 1U);
  EXPECT_EQ(supervised_range_string2state("short"), 2U);
  EXPECT_EQ(supervised_range_string2state("cut"), 3U);
}

TEST(SupervisedState, IsUndefinedForEveryOtherText) {
  for (const char *text : {"undefined", "Open", "OPEN", "open ", "", "tampered", "0"}) {
    EXPECT_EQ(supervised_range_string2state(text), SUPERVISED_STATE_UNDEFINED) << text;
  }
  EXPECT_EQ(supervised_range_string2state(nullptr), SUPERVISED_STATE_UNDEFINED);
}

TEST(SupervisedRanges, AreWrittenInListOrderAsStateLowerUpper) {
  EXPECT_EQ(text_of({{SUPERVISED_STATE_CUT, 20, 10}, {SUPERVISED_STATE_OPEN, 5, 1}}),
            "[('cut', uint32 10, uint32 20), ('open', 1, 5)]");
}

TEST(SupervisedRanges, OfNothingAreAnEmptyArrayOfTheRightType) {
  EXPECT_EQ(text_of({}), "@a(suu) []");
  EXPECT_EQ(ranges_of("@a(suu) []"), SupervisedRanges{});
}

TEST(SupervisedRanges, AreReadByRisingLowerLimit) {
  const SupervisedRanges expected = {{SUPERVISED_STATE_SHORT, 3, 1},
                                     {SUPERVISED_STATE_OPEN, 30, 20},
                                     {SUPERVISED_STATE_CUT, 70, 60}};
  EXPECT_EQ(ranges_of("[('cut', 60, 70), ('short', 1, 3), ('open', 20, 30)]"), expected);
}

TEST(SupervisedRanges, OfEqualLowerLimitsKeepTheirOrder) {
  const SupervisedRanges expected = {{SUPERVISED_STATE_CUT, 9, 0},
                                     {SUPERVISED_STATE_OPEN, 8, 5},
                                     {SUPERVISED_STATE_SHORT, 6, 5},
                                     {SUPERVISED_STATE_CLOSED, 7, 5}};
  EXPECT_EQ(ranges_of("[('open', 5, 8), ('short', 5, 6), ('cut', 0, 9), ('closed', 5, 7)]"),
            expected);
}

// The limits are compared by the sign of their 32-bit difference.
TEST(SupervisedRanges, CountLargeLowerLimitsAsNegativeWhenTheyAreOrdered) {
  const SupervisedRanges expected = {{SUPERVISED_STATE_CUT, 5, UINT32_MAX},
                                     {SUPERVISED_STATE_OPEN, 9, 6}};
  EXPECT_EQ(ranges_of("[('open', 6, 9), ('cut', 4294967295, 5)]"), expected);
}

TEST(SupervisedRanges, ReadAnUnknownWordAsUndefined) {
  const SupervisedRanges expected = {{SUPERVISED_STATE_UNDEFINED, 2, 1}};
  EXPECT_EQ(ranges_of("[('ajar', 1, 2)]"), expected);
}

TEST(SupervisedRanges, SurviveTheWayOutAndBack) {
  const SupervisedRanges ranges = {{SUPERVISED_STATE_CLOSED, 65535, 0},
                                   {SUPERVISED_STATE_OPEN, 99, 98}};
  EXPECT_EQ(ranges_of(text_of(ranges).c_str()), ranges);
}

}  // namespace
