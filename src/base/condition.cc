#include "base/condition.h"

#include <ctime>

namespace {
constexpr std::int64_t kMicrosecondsPerSecond = 1'000'000;
constexpr std::int64_t kNanosecondsPerMicrosecond = 1'000;
}  // namespace

MonotonicCondition::MonotonicCondition() {
  pthread_condattr_t attributes;
  pthread_condattr_init(&attributes);
  pthread_condattr_setclock(&attributes, CLOCK_MONOTONIC);
  pthread_cond_init(&condition_, &attributes);
  pthread_condattr_destroy(&attributes);
}

MonotonicCondition::~MonotonicCondition() {
  pthread_cond_destroy(&condition_);
}

void MonotonicCondition::wait(std::unique_lock<std::mutex> &lock) {
  pthread_cond_wait(&condition_, lock.mutex()->native_handle());
}

void MonotonicCondition::wait_until(std::unique_lock<std::mutex> &lock, std::int64_t deadline_us) {
  if (deadline_us <= 0) {
    return;
  }
  timespec deadline{};
  deadline.tv_sec = static_cast<time_t>(deadline_us / kMicrosecondsPerSecond);
  deadline.tv_nsec =
      static_cast<long>(deadline_us % kMicrosecondsPerSecond * kNanosecondsPerMicrosecond);
  pthread_cond_timedwait(&condition_, lock.mutex()->native_handle(), &deadline);
}

void MonotonicCondition::notify_all() {
  pthread_cond_broadcast(&condition_);
}
