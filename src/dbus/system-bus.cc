#include "dbus/system-bus.h"

#include <utility>
#include <vector>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "base/source.h"
#include "base/termination.h"

namespace {

// Nothing tells when a bus appears.
constexpr guint kRetrySeconds = 1;
constexpr guint kFlushTimeoutMs = 1000;

struct SystemBus {
  GObjectPtr<GDBusConnection> connection;
  std::vector<std::function<void(GDBusConnection *)>> waiting;
  Source retry;
  bool connecting = false;
  bool reported_missing = false;
};

SystemBus &system_bus() {
  static SystemBus bus;
  return bus;
}

void connect_to_bus();

gboolean on_retry(gpointer /*user_data*/) {
  system_bus().retry.forget();
  connect_to_bus();
  return G_SOURCE_REMOVE;
}

void retry_later(const Error &error) {
  auto &bus = system_bus();
  if (!std::exchange(bus.reported_missing, true)) {
    log_critical("No interface is served until there is a system bus: %s", error.message());
  }
  bus.retry = Source(g_timeout_add_seconds(kRetrySeconds, on_retry, nullptr));
}

void on_bus(GObject * /*source*/, GAsyncResult *result, gpointer /*user_data*/) {
  auto &bus = system_bus();
  Error error;
  bus.connecting = false;
  bus.connection.reset(g_bus_get_finish(result, error.out()));
  if (!bus.connection) {
    // The daemon is ending: somebody who wanted the connection as well has stopped waiting for it.
    if (!error.matches(G_IO_ERROR, G_IO_ERROR_CANCELLED)) {
      retry_later(error);
    }
    return;
  }
  for (const auto &ready : std::exchange(bus.waiting, {})) {
    ready(bus.connection.get());
  }
}

void connect_to_bus() {
  if (!std::exchange(system_bus().connecting, true)) {
    // Whoever else asks for the connection waits for this one, and a bus may answer nothing.
    g_bus_get(G_BUS_TYPE_SYSTEM, termination_cancellable(), on_bus, nullptr);
  }
}

void on_flushed(GObject * /*connection*/, GAsyncResult * /*result*/, gpointer user_data) {
  *static_cast<bool *>(user_data) = true;
}

gboolean on_flush_timeout(gpointer user_data) {
  *static_cast<bool *>(user_data) = true;
  return G_SOURCE_REMOVE;
}

// A context of its own: nothing else of the daemon may run any more, and the result of a flush that
// ends after the timeout is discarded.
void flush(GDBusConnection *connection) {
  const GMainContextPtr context(g_main_context_new());
  g_main_context_push_thread_default(context.get());
  bool finished = false;
  g_dbus_connection_flush(connection, nullptr, on_flushed, &finished);
  const GSourcePtr timeout(g_timeout_source_new(kFlushTimeoutMs));
  g_source_set_callback(timeout.get(), on_flush_timeout, &finished, nullptr);
  g_source_attach(timeout.get(), context.get());
  while (!finished) {
    g_main_context_iteration(context.get(), TRUE);
  }
  g_source_destroy(timeout.get());
  g_main_context_pop_thread_default(context.get());
}

}  // namespace

void system_bus_when_ready(std::function<void(GDBusConnection *)> ready) {
  system_bus().waiting.push_back(std::move(ready));
  connect_to_bus();
}

void system_bus_flush() {
  auto &bus = system_bus();
  bus.retry.reset();
  if (bus.connection) {
    flush(bus.connection.get());
    bus.connection.reset();
  }
}
