#include "base/patience.h"

int Patience::timeout_ms(const std::string &owner, std::int64_t now_us) {
  const std::lock_guard lock(lock_);
  return now_us < silent_until_us_ && owner == silent_owner_ ? kMomentMs : kBusDefault;
}

// Short waits are not counted: a service that is slow but alive gets its full chance once a minute.
void Patience::note_failure(const std::string &owner, std::int64_t begun_us, std::int64_t now_us) {
  if (now_us - begun_us < kUnansweredUs) {
    return;
  }
  const std::lock_guard lock(lock_);
  silent_owner_ = owner;
  silent_until_us_ = now_us + kMemoryUs;
}

void Patience::note_answer() {
  const std::lock_guard lock(lock_);
  silent_until_us_ = 0;
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
                                           patience.timeout_ms(owner, begun), nullptr, error));
  if (reply) {
    patience.note_answer();
  } else {
    patience.note_failure(owner, begun, g_get_monotonic_time());
  }
  return reply;
}
