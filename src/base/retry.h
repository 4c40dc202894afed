// Tries something again until it works, after pauses that grow from one second to sixteen. Main
// thread only.
#pragma once

#include <glib.h>

#include "base/source.h"

class Retry {
 public:
  // False: it does not work yet.
  using Attempt = bool (*)(gpointer user_data);

  // The first attempt comes after a second. Running already: goes on as it is.
  void start(Attempt attempt, gpointer user_data);
  void stop() { timer_.reset(); }

  explicit operator bool() const { return static_cast<bool>(timer_); }

 private:
  static gboolean on_timer(gpointer self);
  void schedule(guint pause);

  Source timer_;
  guint pause_ = 0;  // milliseconds, the one that runs
  Attempt attempt_ = nullptr;
  gpointer user_data_ = nullptr;
};
