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
