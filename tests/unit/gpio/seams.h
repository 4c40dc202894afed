// GLib calls of the code under test that the linker redirects to the tests, so that they see them
// and need not wait for real time.
#pragma once

#include <glib.h>

#include <vector>

struct Seams {
  std::vector<gulong> sleeps;  // microseconds
  std::vector<guint>
      intervals;  // milliseconds, of the timers that were started; they are due at once
  std::vector<guint> fd_watches;  // source ids, of those gone as well
  std::vector<GIOCondition> fd_conditions;

  int alive_fd_watches() const;
};

Seams &seams();
