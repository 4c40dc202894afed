// Waiting without sleeping: for a condition, up to a deadline that only a broken program reaches.
#pragma once

#include <glib.h>

#include <cstdint>

inline constexpr std::int64_t kTestTimeoutUs = 20'000'000;

inline std::int64_t deadline_of_a_test() {
  return g_get_monotonic_time() + kTestTimeoutUs;
}

// Runs the default main context until the condition holds. False: it never did.
template <typename Condition>
[[nodiscard]] bool iterate_until(Condition holds) {
  const std::int64_t deadline = deadline_of_a_test();
  while (!holds()) {
    if (g_get_monotonic_time() > deadline) {
      return false;
    }
    g_main_context_iteration(nullptr, FALSE);
  }
  return true;
}
