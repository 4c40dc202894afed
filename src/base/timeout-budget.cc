#include "base/timeout-budget.h"

#include <algorithm>

namespace {
constexpr std::int64_t kMicrosecondsPerMillisecond = 1000;
}

int TimeoutBudget::timeout_ms() const {
  if (remaining_us_ == kBudgetUs) {
    return kBusDefault;
  }
  return std::max(kMinimumMs, static_cast<int>(remaining_us_ / kMicrosecondsPerMillisecond));
}

void TimeoutBudget::spend(std::int64_t waited_us) {
  if (waited_us >= kPromptUs) {
    remaining_us_ = std::max<std::int64_t>(0, remaining_us_ - waited_us);
  }
}
