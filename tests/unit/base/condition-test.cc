#include "base/condition.h"

#include <gtest/gtest.h>

#include <thread>

#include "support/deadline.h"

namespace {

constexpr std::int64_t kMillisecondUs = 1000;

// Waits, with the given call, for another thread that notifies.
template <typename Wait>
void wait_for_notifier(Wait wait) {
  MonotonicCondition condition;
  std::mutex mutex;
  bool ready = false;
  std::thread notifier([&] {
    const std::lock_guard lock(mutex);
    ready = true;
    condition.notify_all();
  });
  {
    std::unique_lock lock(mutex);
    // NOLINTNEXTLINE(bugprone-infinite-loop): another thread ends it
    while (!ready) {
      wait(condition, lock);
    }
    EXPECT_TRUE(lock.owns_lock());
  }
  notifier.join();
}

TEST(MonotonicCondition, WakesAWaiterThatIsNotified) {
  wait_for_notifier([](auto &condition, auto &lock) { condition.wait(lock); });
}

TEST(MonotonicCondition, WakesEveryWaiter) {
  MonotonicCondition condition;
  std::mutex mutex;
  bool ready = false;
  int awake = 0;
  const auto wait = [&] {
    std::unique_lock lock(mutex);
    while (!ready) {
      condition.wait(lock);
    }
    ++awake;
  };
  std::thread first(wait);
  std::thread second(wait);
  {
    const std::lock_guard lock(mutex);
    ready = true;
    condition.notify_all();
  }
  first.join();
  second.join();
  EXPECT_EQ(awake, 2);
}

TEST(MonotonicCondition, WaitsUntilTheDeadlineWhenNobodyNotifies) {
  MonotonicCondition condition;
  std::mutex mutex;
  std::unique_lock lock(mutex);
  const std::int64_t deadline = g_get_monotonic_time() + 5 * kMillisecondUs;
  while (g_get_monotonic_time() < deadline) {
    condition.wait_until(lock, deadline);
  }
  EXPECT_GE(g_get_monotonic_time(), deadline);
  EXPECT_TRUE(lock.owns_lock());
}

TEST(MonotonicCondition, DoesNotWaitForADeadlineThatHasPassed) {
  MonotonicCondition condition;
  std::mutex mutex;
  std::unique_lock lock(mutex);
  const std::int64_t begin = g_get_monotonic_time();
  for (const std::int64_t deadline :
       {begin, begin - 1, std::int64_t{1}, std::int64_t{0}, std::int64_t{-1}, INT64_MIN}) {
    condition.wait_until(lock, deadline);
  }
  EXPECT_LT(g_get_monotonic_time() - begin, kTestTimeoutUs);
  EXPECT_TRUE(lock.owns_lock());
}

TEST(MonotonicCondition, IsWokenBeforeALaterDeadline) {
  const std::int64_t deadline = deadline_of_a_test();
  wait_for_notifier([&](auto &condition, auto &lock) {
    condition.wait_until(lock, deadline);
    ASSERT_LT(g_get_monotonic_time(), deadline);
  });
}

}  // namespace
