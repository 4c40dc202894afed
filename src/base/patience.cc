#include "base/patience.h"

int Patience::timeout_ms(const std::string &owner, const std::string &method, std::int64_t now_us) {
  const std::lock_guard lock(lock_);
  const bool used_up = owner == owner_ && now_us < used_up_until_us_;
  return used_up && !answering_.contains(method) ? kMomentMs : kBusDefault;
}

void Patience::note_failure(const std::string &owner, std::int64_t begun_us, std::int64_t now_us) {
  const std::lock_guard lock(lock_);
  const bool unanswered = now_us - begun_us >= kUnansweredUs;
  note_wait(owner, begun_us, now_us, unanswered ? kBudgetUs : now_us - begun_us);
}

void Patience::note_answer(const std::string &owner, const std::string &method,
                           std::int64_t begun_us, std::int64_t now_us) {
  const std::lock_guard lock(lock_);
  if (owner == owner_) {
    answering_.insert(method);
  }
  note_wait(owner, begun_us, now_us, now_us - begun_us);
}

// A moment that passed without an answer is not late: a service that lags gets its full chance once
// a minute.
void Patience::note_wait(const std::string &owner, std::int64_t begun_us, std::int64_t now_us,
                         std::int64_t cost_us) {
  if (cost_us < kLateUs) {
    return;
  }
  if (owner != owner_ || begun_us - last_late_us_ >= kMemoryUs) {
    owner_ = owner;
    spent_us_ = 0;
    used_up_until_us_ = 0;
  }
  last_late_us_ = now_us;
  spent_us_ += cost_us;
  if (spent_us_ >= kBudgetUs) {
    spent_us_ = 0;
    used_up_until_us_ = now_us + kMemoryUs;
    answering_.clear();
  }
}

std::string proxy_owner(GDBusProxy *proxy) {
  const GCharPtr owner(g_dbus_proxy_get_name_owner(proxy));
  return owner ? owner.get() : "";
}

GVariantPtr call_with_patience(Patience &patience, GDBusProxy *proxy, const char *method,
                               GVariant *parameters, GError **error) {
  const std::string owner = proxy_owner(proxy);
  const std::int64_t begun = g_get_monotonic_time();
  GVariantPtr reply(g_dbus_proxy_call_sync(proxy, method, parameters, G_DBUS_CALL_FLAGS_NONE,
                                           patience.timeout_ms(owner, method, begun), nullptr,
                                           error));
  const std::int64_t now = g_get_monotonic_time();
  if (reply) {
    patience.note_answer(owner, method, begun, now);
  } else {
    patience.note_failure(owner, begun, now);
  }
  return reply;
}
