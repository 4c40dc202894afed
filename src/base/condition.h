// A condition variable whose deadlines are on the monotonic clock, so that setting the device's
// time of day neither stretches nor cuts a wait.
//
// std::condition_variable would do, but ThreadSanitizer does not follow the clock call that it uses
// for steady deadlines and then reports races that are none.
#pragma once

#include <pthread.h>

#include <cstdint>
#include <mutex>

class MonotonicCondition {
 public:
  MonotonicCondition();
  ~MonotonicCondition();
  MonotonicCondition(const MonotonicCondition &) = delete;
  MonotonicCondition &operator=(const MonotonicCondition &) = delete;

  void wait(std::unique_lock<std::mutex> &lock);
  // Waits until signalled or until g_get_monotonic_time() reaches `deadline_us`. May wake early,
  // as any condition variable may: test the condition and the clock again.
  void wait_until(std::unique_lock<std::mutex> &lock, std::int64_t deadline_us);
  void notify_all();

 private:
  pthread_cond_t condition_;
};
