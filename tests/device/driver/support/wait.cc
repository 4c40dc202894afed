#include "support/wait.h"

#include "base/source.h"

namespace {
constexpr guint kLook = 2;  // milliseconds between two looks at a condition

gboolean look_again(gpointer /*user_data*/) {
  return G_SOURCE_CONTINUE;
}
}  // namespace

bool wait_until(const std::function<bool()> &condition, gint64 timeout) {
  const gint64 deadline = g_get_monotonic_time() + timeout;
  const Source alarm(g_timeout_add(kLook, look_again, nullptr));
  while (!condition()) {
    if (g_get_monotonic_time() > deadline) {
      return false;
    }
    g_main_context_iteration(nullptr, TRUE);
  }
  return true;
}

void run_loop_for(gint64 microseconds) {
  (void)wait_until([] { return false; }, microseconds);
}
