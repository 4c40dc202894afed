// The time that a series of calls to a service that may hang can take together.
//
// The budget is what the bus allows for a single call. Once it is spent, each call still gets a
// short timeout, since the service may have recovered. Calls that take less than a second are not
// counted. One thread at a time.
#pragma once

#include <cstdint>

class TimeoutBudget {
 public:
  static constexpr int kBusDefault = -1;  // the bus's own limit, which is the budget
  static constexpr int kMinimumMs = 250;
  static constexpr std::int64_t kBudgetUs = 25'000'000;
  static constexpr std::int64_t kPromptUs = 1'000'000;

  // The limit in milliseconds of the next call.
  int timeout_ms() const;
  // Counts a call that has taken `waited_us`, answered or not.
  void spend(std::int64_t waited_us);

 private:
  std::int64_t remaining_us_ = kBudgetUs;
};
