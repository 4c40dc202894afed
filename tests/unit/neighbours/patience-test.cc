#include "base/patience.h"

#include <gtest/gtest.h>

namespace {

constexpr std::int64_t kSecondUs = 1'000'000;

TEST(Patience, WaitsInFullForAServiceThatHasNotFailed) {
  EXPECT_EQ(Patience().timeout_ms(), Patience::kBusDefault);
}

TEST(Patience, LeavesAMomentForEachCallAfterOneThatWasNotAnswered) {
  Patience patience;
  patience.spend(Patience::kBudgetUs + 1);
  EXPECT_EQ(patience.timeout_ms(), Patience::kMomentMs);
  patience.spend(kSecondUs / 10);
  EXPECT_EQ(patience.timeout_ms(), Patience::kMomentMs);
}

TEST(Patience, EndsWhenLateAnswersAddUpToTheBudget) {
  Patience patience;
  patience.spend(10 * kSecondUs);
  EXPECT_EQ(patience.timeout_ms(), 15'000);
  patience.spend(10 * kSecondUs);
  EXPECT_EQ(patience.timeout_ms(), 5'000);
  patience.spend(4'950'000);
  EXPECT_EQ(patience.timeout_ms(), Patience::kMomentMs);
}

TEST(Patience, DoesNotCountPromptAnswers) {
  Patience patience;
  for (int call = 0; call < 1000; ++call) {
    patience.spend(Patience::kLateUs - 1);
  }
  EXPECT_EQ(patience.timeout_ms(), Patience::kBusDefault);
}

}  // namespace
