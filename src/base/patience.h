// How long calls wait for a service that may hang or lag, so that many in a row do not add up.
//
// A call waits as long as the bus allows until the process of the service has used the patience up:
// by a single call that it left without an answer, or by late answers that add up to a minute
// without a minute's pause between two of them. For the minute after that its calls get only a
// moment each. A method that answers within the moment is waited for in full again; that one
// method answers says nothing of the others. A new process of the service is waited for in full.
// Any thread.
#pragma once

#include <cstdint>
#include <mutex>
#include <set>
#include <string>

#include "base/glib-ptr.h"

class Patience {
 public:
  static constexpr int kBusDefault = -1;  // the bus's own limit of 25 seconds
  static constexpr int kMomentMs = 100;
  // A call that failed sooner was refused, not left without an answer.
  static constexpr std::int64_t kUnansweredUs = 20'000'000;
  static constexpr std::int64_t kLateUs = 1'000'000;  // sooner is no delay worth counting
  static constexpr std::int64_t kBudgetUs = 60'000'000;
  static constexpr std::int64_t kMemoryUs = 60'000'000;

  // The limit in milliseconds of a call that is made now. `owner` is the unique bus name of the
  // service's process, empty for none; times are those of g_get_monotonic_time().
  int timeout_ms(const std::string &owner, const std::string &method, std::int64_t now_us);
  void note_failure(const std::string &owner, std::int64_t begun_us, std::int64_t now_us);
  void note_answer(const std::string &owner, const std::string &method, std::int64_t begun_us,
                   std::int64_t now_us);

 private:
  void note_wait(const std::string &owner, std::int64_t begun_us, std::int64_t now_us,
                 std::int64_t cost_us);

  std::mutex lock_;
  std::string owner_;  // the process that the rest is about
  std::int64_t spent_us_ = 0;
  std::int64_t last_late_us_ = 0;
  std::int64_t used_up_until_us_ = 0;
  std::set<std::string> answering_;  // methods that have answered since patience was used up
};

// The unique bus name of the process behind a proxy, empty for none. Any thread.
std::string proxy_owner(GDBusProxy *proxy);

// Calls a method through the proxy and waits as patience has it. Null and `error`: no answer, or an
// error as the answer. Any thread.
GVariantPtr call_with_patience(Patience &patience, GDBusProxy *proxy, const char *method,
                               GVariant *parameters, GError **error);
