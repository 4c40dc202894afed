#include "base/timeout-budget.h"

#include <gtest/gtest.h>

namespace {

constexpr std::int64_t kSecondUs = 1'000'000;

TEST(TimeoutBudget, WaitsInFullForAServiceThatHasNotFailed) {
  EXPECT_EQ(TimeoutBudget().timeout_ms(), TimeoutBudget::kBusDefault);
}

TEST(TimeoutBudget, LeavesAMomentForEachCallAfterOneThatWasNotAnswered) {
  TimeoutBudget budget;
  budget.spend(TimeoutBudget::kBudgetUs + 1);
  EXPECT_EQ(budget.timeout_ms(), TimeoutBudget::kMinimumMs);
  budget.spend(kSecondUs / 10);
  EXPECT_EQ(budget.timeout_ms(), TimeoutBudget::kMinimumMs);
}

TEST(TimeoutBudget, EndsWhenLateAnswersAddUpToTheBudget) {
  TimeoutBudget budget;
  budget.spend(10 * kSecondUs);
  EXPECT_EQ(budget.timeout_ms(), 15'000);
  budget.spend(10 * kSecondUs);
  EXPECT_EQ(budget.timeout_ms(), 5'000);
  budget.spend(4'950'000);
  EXPECT_EQ(budget.timeout_ms(), TimeoutBudget::kMinimumMs);
}

TEST(TimeoutBudget, DoesNotCountPromptAnswers) {
  TimeoutBudget budget;
  for (int call = 0; call < 1000; ++call) {
    budget.spend(TimeoutBudget::kPromptUs - 1);
  }
  EXPECT_EQ(budget.timeout_ms(), TimeoutBudget::kBusDefault);
}

}  // namespace
