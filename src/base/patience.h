// How long a call waits for a service that may hang. The first call that goes unanswered waits as
// long as the bus allows; for the minute after it the same process of the service is given only a
// moment per call, so that many calls in a row do not add up. A process that answers again, or a
// new one, is waited for in full. Any thread.
#pragma once

#include <cstdint>
#include <mutex>
#include <string>

#include "base/glib-ptr.h"

class Patience {
 public:
  static constexpr int kBusDefault = -1;  // the bus's own limit of 25 seconds
  static constexpr int kMomentMs = 100;
  // A call that failed sooner was refused, not left without an answer.
  static constexpr std::int64_t kUnansweredUs = 20'000'000;
  static constexpr std::int64_t kMemoryUs = 60'000'000;

  // The limit in milliseconds of a call that is made now. `owner` is the unique bus name of the
  // service's process, empty for none; times are those of g_get_monotonic_time().
  int timeout_ms(const std::string &owner, std::int64_t now_us);
  void note_failure(const std::string &owner, std::int64_t begun_us, std::int64_t now_us);
  void note_answer();

 private:
  std::mutex lock_;
  std::string silent_owner_;
  std::int64_t silent_until_us_ = 0;
};

// The unique bus name of the process behind a proxy, empty for none. Any thread.
std::string proxy_owner(GDBusProxy *proxy);

// Calls a method through the proxy and waits as patience has it. Null and `error`: no answer, or an
// error as the answer. Any thread.
GVariantPtr call_with_patience(Patience &patience, GDBusProxy *proxy, const char *method,
                               GVariant *parameters, GError **error);
