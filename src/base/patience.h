// How long calls that start-up makes in a row wait for a service that may hang or lag, so that they
// do not add up.
//
// Together they wait as long as the bus lets a single call wait, and then a moment each: the
// service may have recovered. Answers within a second are not counted. One thread at a time.
#pragma once

#include <cstdint>

class Patience {
 public:
  static constexpr int kBusDefault = -1;  // the bus's own limit, which is the budget
  static constexpr int kMomentMs = 250;
  static constexpr std::int64_t kBudgetUs = 25'000'000;
  static constexpr std::int64_t kLateUs = 1'000'000;

  // The limit in milliseconds of the next call.
  int timeout_ms() const;
  // Counts a call that has taken `waited_us`, answered or not.
  void spend(std::int64_t waited_us);

 private:
  std::int64_t left_us_ = kBudgetUs;
};
