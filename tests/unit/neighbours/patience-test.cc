#include "base/patience.h"

#include <gtest/gtest.h>

namespace {

constexpr std::int64_t kStart = 1'000'000'000;
constexpr std::int64_t kFullWait = 25'000'000;
constexpr std::int64_t kRefusal = 1'000;
constexpr std::int64_t kShortWait = 100'000;

TEST(Patience, WaitsInFullForAServiceThatHasNotFailed) {
  Patience patience;
  EXPECT_EQ(patience.timeout_ms(":1.1", kStart), Patience::kBusDefault);
}

TEST(Patience, GivesAProcessThatDidNotAnswerOnlyAMoment) {
  Patience patience;
  patience.note_failure(":1.1", kStart, kStart + kFullWait);
  EXPECT_EQ(patience.timeout_ms(":1.1", kStart + kFullWait), Patience::kMomentMs);
}

TEST(Patience, WaitsInFullForTheNextProcessOfTheService) {
  Patience patience;
  patience.note_failure(":1.1", kStart, kStart + kFullWait);
  EXPECT_EQ(patience.timeout_ms(":1.2", kStart + kFullWait), Patience::kBusDefault);
}

TEST(Patience, WaitsInFullAfterAnAnswer) {
  Patience patience;
  patience.note_failure(":1.1", kStart, kStart + kFullWait);
  patience.note_answer();
  EXPECT_EQ(patience.timeout_ms(":1.1", kStart + kFullWait), Patience::kBusDefault);
}

TEST(Patience, ForgetsAfterAMinute) {
  Patience patience;
  const std::int64_t silent = kStart + kFullWait;
  patience.note_failure(":1.1", kStart, silent);
  EXPECT_EQ(patience.timeout_ms(":1.1", silent + Patience::kMemoryUs - 1), Patience::kMomentMs);
  EXPECT_EQ(patience.timeout_ms(":1.1", silent + Patience::kMemoryUs), Patience::kBusDefault);
}

TEST(Patience, TakesAQuickRefusalForASignOfLife) {
  Patience patience;
  patience.note_failure(":1.1", kStart, kStart + kRefusal);
  EXPECT_EQ(patience.timeout_ms(":1.1", kStart + kRefusal), Patience::kBusDefault);
}

TEST(Patience, DoesNotStretchTheMinuteByTheShortWaitsWithinIt) {
  Patience patience;
  const std::int64_t silent = kStart + kFullWait;
  patience.note_failure(":1.1", kStart, silent);
  const std::int64_t later = silent + Patience::kMemoryUs - 1;
  patience.note_failure(":1.1", later - kShortWait, later);
  EXPECT_EQ(patience.timeout_ms(":1.1", later + 1), Patience::kBusDefault);
}

}  // namespace
