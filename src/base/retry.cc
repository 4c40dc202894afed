#include "base/retry.h"

#include <algorithm>

namespace {

constexpr guint kFirstPause = 1000;  // milliseconds
constexpr guint kLongestPause = 16000;

}  // namespace

void Retry::start(Attempt attempt, gpointer user_data) {
  if (timer_) {
    return;
  }
  attempt_ = attempt;
  user_data_ = user_data;
  schedule(kFirstPause);
}

void Retry::schedule(guint pause) {
  pause_ = pause;
  timer_ = Source(g_timeout_add(pause, on_timer, this));
}

// The attempt may stop the retry, and start it anew.
gboolean Retry::on_timer(gpointer self) {
  auto *retry = static_cast<Retry *>(self);
  retry->timer_.forget();
  if (!retry->attempt_(retry->user_data_) && !retry->timer_) {
    retry->schedule(std::min(2 * retry->pause_, kLongestPause));
  }
  return G_SOURCE_REMOVE;
}
