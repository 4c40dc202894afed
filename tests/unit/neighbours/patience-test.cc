#include "base/patience.h"

#include <gtest/gtest.h>

namespace {

constexpr std::int64_t kStart = 1'000'000'000;
constexpr std::int64_t kFullWait = 25'000'000;
constexpr std::int64_t kLate = 20'000'000;
constexpr std::int64_t kPrompt = 1'000;
constexpr std::int64_t kShortWait = 100'000;
constexpr const char *kOwner = ":1.1";

// Calls of one process, one after another.
class PatienceTest : public testing::Test {
 protected:
  int limit(const char *method = "Ask", const char *owner = kOwner) {
    return patience_.timeout_ms(owner, method, now_);
  }
  void fail_after(std::int64_t wait) {
    now_ += wait;
    patience_.note_failure(kOwner, now_ - wait, now_);
  }
  void answer_after(std::int64_t wait, const char *method = "Ask") {
    now_ += wait;
    patience_.note_answer(kOwner, method, now_ - wait, now_);
  }

  Patience patience_;
  std::int64_t now_ = kStart;
};

TEST_F(PatienceTest, WaitsInFullForAServiceThatHasNotFailed) {
  EXPECT_EQ(limit(), Patience::kBusDefault);
}

TEST_F(PatienceTest, GivesAProcessThatDidNotAnswerOnlyAMoment) {
  fail_after(kFullWait);
  EXPECT_EQ(limit(), Patience::kMomentMs);
  EXPECT_EQ(limit("Tell"), Patience::kMomentMs);
}

TEST_F(PatienceTest, WaitsInFullForTheNextProcessOfTheService) {
  fail_after(kFullWait);
  EXPECT_EQ(limit("Ask", ":1.2"), Patience::kBusDefault);
}

TEST_F(PatienceTest, WaitsInFullForAMethodThatAnswersAgain) {
  fail_after(kFullWait);
  answer_after(kPrompt);
  EXPECT_EQ(limit(), Patience::kBusDefault);
}

TEST_F(PatienceTest, DoesNotTakeTheAnswersOfOneMethodForThoseOfAnother) {
  fail_after(kFullWait);
  answer_after(kPrompt, "Tell");
  EXPECT_EQ(limit("Tell"), Patience::kBusDefault);
  EXPECT_EQ(limit("Ask"), Patience::kMomentMs);
}

TEST_F(PatienceTest, TrustsNoMethodThatLastAnsweredBeforeTheProcessFellSilent) {
  fail_after(kFullWait);
  answer_after(kPrompt, "Tell");
  fail_after(kFullWait);
  EXPECT_EQ(limit("Tell"), Patience::kMomentMs);
}

TEST_F(PatienceTest, DoesNotTakeAnAnswerOfAnotherProcessForOneOfTheSilentOne) {
  fail_after(kFullWait);
  patience_.note_answer(":1.2", "Ask", now_, now_ + kPrompt);
  EXPECT_EQ(limit(), Patience::kMomentMs);
}

TEST_F(PatienceTest, ForgetsAfterAMinute) {
  fail_after(kFullWait);
  now_ += Patience::kMemoryUs - 1;
  EXPECT_EQ(limit(), Patience::kMomentMs);
  ++now_;
  EXPECT_EQ(limit(), Patience::kBusDefault);
}

TEST_F(PatienceTest, TakesAQuickRefusalForASignOfLife) {
  fail_after(kPrompt);
  EXPECT_EQ(limit(), Patience::kBusDefault);
}

TEST_F(PatienceTest, DoesNotStretchTheMinuteByTheShortWaitsWithinIt) {
  fail_after(kFullWait);
  now_ += Patience::kMemoryUs - 1 - kShortWait;
  fail_after(kShortWait);
  ++now_;
  EXPECT_EQ(limit(), Patience::kBusDefault);
}

TEST_F(PatienceTest, EndsWhenLateAnswersAddUpToAMinute) {
  answer_after(kLate);
  answer_after(kPrompt, "Tell");
  answer_after(kLate);
  EXPECT_EQ(limit(), Patience::kBusDefault);
  answer_after(kLate);
  EXPECT_EQ(limit(), Patience::kMomentMs);
  answer_after(kPrompt);
  EXPECT_EQ(limit(), Patience::kBusDefault);
}

TEST_F(PatienceTest, CountsALateRefusalLikeALateAnswer) {
  answer_after(kLate);
  answer_after(kLate);
  fail_after(kLate - 1);
  EXPECT_EQ(limit(), Patience::kBusDefault);
  fail_after(Patience::kLateUs);
  EXPECT_EQ(limit(), Patience::kMomentMs);
}

TEST_F(PatienceTest, DoesNotCountPromptAnswers) {
  for (int i = 0; i < 100; ++i) {
    answer_after(Patience::kLateUs - 1);
  }
  EXPECT_EQ(limit(), Patience::kBusDefault);
}

TEST_F(PatienceTest, ForgetsLateAnswersAfterAMinuteWithoutAny) {
  answer_after(kLate);
  answer_after(kLate);
  now_ += Patience::kMemoryUs;
  answer_after(kLate);
  EXPECT_EQ(limit(), Patience::kBusDefault);
}

TEST_F(PatienceTest, DoesNotCountTheLateAnswersOfAnotherProcess) {
  answer_after(kLate);
  answer_after(kLate);
  patience_.note_answer(":1.2", "Ask", now_, now_ + kLate);
  EXPECT_EQ(limit("Ask", ":1.2"), Patience::kBusDefault);
}

}  // namespace
