#include "seams.h"

#include <glib-unix.h>

#include <algorithm>

// The linker's option --wrap gives the calls and the real functions these names.
void fake_usleep(gulong microseconds) asm("__wrap_g_usleep");
guint fake_timeout_add(guint interval, GSourceFunc function,
                       gpointer data) asm("__wrap_g_timeout_add");
guint real_timeout_add(guint interval, GSourceFunc function,
                       gpointer data) asm("__real_g_timeout_add");
guint fake_unix_fd_add(gint fd, GIOCondition condition, GUnixFDSourceFunc function,
                       gpointer data) asm("__wrap_g_unix_fd_add");
guint real_unix_fd_add(gint fd, GIOCondition condition, GUnixFDSourceFunc function,
                       gpointer data) asm("__real_g_unix_fd_add");

Seams &seams() {
  static Seams instance;
  return instance;
}

int Seams::alive_fd_watches() const {
  return static_cast<int>(std::count_if(fd_watches.begin(), fd_watches.end(), [](guint id) {
    return g_main_context_find_source_by_id(nullptr, id) != nullptr;
  }));
}

void fake_usleep(gulong microseconds) {
  seams().sleeps.push_back(microseconds);
}

guint fake_timeout_add(guint interval, GSourceFunc function, gpointer data) {
  seams().intervals.push_back(interval);
  return real_timeout_add(0, function, data);
}

guint fake_unix_fd_add(gint fd, GIOCondition condition, GUnixFDSourceFunc function, gpointer data) {
  const guint id = real_unix_fd_add(fd, condition, function, data);
  seams().fd_watches.push_back(id);
  seams().fd_conditions.push_back(condition);
  return id;
}
