#include "base/patience.h"

#include <algorithm>

namespace {
constexpr std::int64_t kMicrosecondsPerMillisecond = 1000;
}

int Patience::timeout_ms() const {
  if (left_us_ == kBudgetUs) {
    return kBusDefault;
  }
  return std::max(kMomentMs, static_cast<int>(left_us_ / kMicrosecondsPerMillisecond));
}

void Patience::spend(std::int64_t waited_us) {
  if (waited_us >= kLateUs) {
    left_us_ = std::max<std::int64_t>(0, left_us_ - waited_us);
  }
}
