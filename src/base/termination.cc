#include "base/termination.h"

#include <glib-unix.h>
#include <poll.h>
#include <unistd.h>

#include <csignal>
#include <string_view>

#include "base/glib-ptr.h"
#include "base/log.h"

namespace {

// Within the five seconds that a daemon has to end.
constexpr guint kForcedExitMs = 4800;

// The log may be what hangs, or standard error, if nobody reads it.
gboolean on_forced_exit(gpointer /*user_data*/) {
  constexpr std::string_view message = "portd did not stop in time\n";
  pollfd error_output = {.fd = STDERR_FILENO, .events = POLLOUT, .revents = 0};
  if (poll(&error_output, 1, 0) > 0) {
    [[maybe_unused]] const auto written = write(STDERR_FILENO, message.data(), message.size());
  }
  _exit(0);
}

gboolean on_sigterm(gpointer user_data) {
  g_cancellable_cancel(termination_cancellable());
  const GSourcePtr forced_exit(g_timeout_source_new(kForcedExitMs));
  g_source_set_callback(forced_exit.get(), on_forced_exit, nullptr, nullptr);
  g_source_attach(forced_exit.get(), static_cast<GMainContext *>(user_data));
  return G_SOURCE_REMOVE;
}

gpointer watch(gpointer context) {
  const GMainContextPtr owned(static_cast<GMainContext *>(context));
  while (true) {
    g_main_context_iteration(owned.get(), TRUE);
  }
}

}  // namespace

GCancellable *termination_cancellable() {
  // Never freed: the thread below may still use it when the process ends.
  static GCancellable *const cancellable = g_cancellable_new();
  return cancellable;
}

bool termination_watch() {
  GMainContext *context = g_main_context_new();
  const GSourcePtr sigterm(g_unix_signal_source_new(SIGTERM));
  g_source_set_callback(sigterm.get(), on_sigterm, context, nullptr);
  g_source_attach(sigterm.get(), context);
  Error error;
  GThread *thread = g_thread_try_new("Termination", watch, context, error.out());
  if (!thread) {
    log_critical("Could not start the thread that waits for SIGTERM: %s", error.message());
    return false;
  }
  g_thread_unref(thread);
  return true;
}
