#include "base/own-name.h"

#include "base/glib-ptr.h"
#include "base/log.h"

namespace {

constexpr guint kFlushTimeoutMs = 1000;

using MainContextPtr = std::unique_ptr<GMainContext, GlibDeleter<g_main_context_unref>>;
using SourcePtr = std::unique_ptr<GSource, GlibDeleter<g_source_unref>>;

void on_flushed(GObject * /*connection*/, GAsyncResult * /*result*/, gpointer user_data) {
  *static_cast<bool *>(user_data) = true;
}

gboolean on_flush_timeout(gpointer user_data) {
  *static_cast<bool *>(user_data) = true;
  return G_SOURCE_REMOVE;
}

}  // namespace

BusName::BusName(const char *name, GBusAcquiredCallback on_bus_acquired)
    : id_(g_bus_own_name(G_BUS_TYPE_SYSTEM, name, G_BUS_NAME_OWNER_FLAGS_NONE, on_bus_acquired,
                         nullptr, nullptr, nullptr, nullptr)) {}

void BusName::reset() {
  if (id_ != 0) {
    g_bus_unown_name(std::exchange(id_, 0));
  }
}

void export_object(GDBusInterfaceSkeleton *skeleton, GDBusConnection *connection,
                   const char *path) {
  Error error;
  if (!g_dbus_interface_skeleton_export(skeleton, connection, path, error.out())) {
    log_warning("Could not export %s: %s", path, error.message());
  }
}

void flush_bus(GDBusConnection *connection) {
  // A context of its own: nothing else of the daemon may run any more, and a flush that ends after
  // the timeout finds nobody to report to.
  const MainContextPtr context(g_main_context_new());
  g_main_context_push_thread_default(context.get());
  bool finished = false;
  g_dbus_connection_flush(connection, nullptr, on_flushed, &finished);
  const SourcePtr timeout(g_timeout_source_new(kFlushTimeoutMs));
  g_source_set_callback(timeout.get(), on_flush_timeout, &finished, nullptr);
  g_source_attach(timeout.get(), context.get());
  while (!finished) {
    g_main_context_iteration(context.get(), TRUE);
  }
  g_source_destroy(timeout.get());
  g_main_context_pop_thread_default(context.get());
}
