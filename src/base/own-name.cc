#include "base/own-name.h"

#include "base/glib-ptr.h"
#include "base/log.h"

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
