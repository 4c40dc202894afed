#include "dbus/bus-service.h"

#include "base/log.h"
#include "dbus/system-bus.h"

namespace {

constexpr const char *kBusName = "org.freedesktop.DBus";
constexpr const char *kBusPath = "/org/freedesktop/DBus";

// The bus's answers to a request for a name.
enum NameReply : guint32 { NAME_REPLY_PRIMARY_OWNER = 1, NAME_REPLY_IN_QUEUE = 2 };

}  // namespace

void BusService::start(GDBusInterfaceSkeleton *object) {
  {
    const std::lock_guard lock(lock_);
    object_.reset(object);
  }
  system_bus_when_ready([this](GDBusConnection *connection) { open(connection); });
}

void BusService::open(GDBusConnection *connection) {
  if (!object_) {
    return;
  }
  Error error;
  if (!g_dbus_interface_skeleton_export(object_.get(), connection, path_, error.out())) {
    log_warning("Could not export %s: %s", path_, error.message());
  }
  connection_ = gobject_reference(connection);
  request_name();
}

void BusService::request_name() {
  constexpr guint32 no_flags = 0;
  g_dbus_connection_call(connection_.get(), kBusName, kBusPath, kBusName, "RequestName",
                         g_variant_new("(su)", name_, no_flags), G_VARIANT_TYPE("(u)"),
                         G_DBUS_CALL_FLAGS_NONE, G_MAXINT, nullptr, on_name_reply, this);
}

void BusService::on_name_reply(GObject *source, GAsyncResult *result, gpointer user_data) {
  const auto *service = static_cast<BusService *>(user_data);
  Error error;
  const GVariantPtr reply(
      g_dbus_connection_call_finish(G_DBUS_CONNECTION(source), result, error.out()));
  if (!reply) {
    log_warning("Could not request the name %s: %s", service->name_, error.message());
    return;
  }
  guint32 answer = 0;
  g_variant_get(reply.get(), "(u)", &answer);
  if (answer == NAME_REPLY_IN_QUEUE) {
    log_warning("The name %s is taken: is another instance running?", service->name_);
  }
}

void BusService::stop() {
  {
    const std::lock_guard lock(lock_);
    if (object_ && g_dbus_interface_skeleton_get_connection(object_.get())) {
      g_dbus_interface_skeleton_unexport(object_.get());
    }
    object_.reset();
  }
  if (connection_) {
    g_dbus_connection_call(connection_.get(), kBusName, kBusPath, kBusName, "ReleaseName",
                           g_variant_new("(s)", name_), nullptr, G_DBUS_CALL_FLAGS_NONE, -1,
                           nullptr, nullptr, nullptr);
    connection_.reset();
  }
}

void connect_handlers(gpointer object, std::initializer_list<MethodHandler> handlers) {
  for (const auto &handler : handlers) {
    g_signal_connect(object, handler.signal, handler.callback, nullptr);
  }
}
