#include "dbus/iocontrol-conf-legacy-dbus.h"

#include "base/fatal.h"
#include "base/log.h"
#include "dbus/legacy-controller.h"
#include "dbus/legacy-names.h"

namespace {

std::unique_ptr<LegacyController> legacy_ctrl;

GVariantPtr call_bus(const LegacyController &controller, const char *method, GVariant *arguments,
                     Error &error) {
  return GVariantPtr(g_dbus_connection_call_sync(
      controller.connection.get(), "org.freedesktop.DBus", "/org/freedesktop/DBus",
      "org.freedesktop.DBus", method, arguments, G_VARIANT_TYPE("(u)"), G_DBUS_CALL_FLAGS_NONE,
      G_MAXINT, nullptr, error.out()));
}

void connect(LegacyController &controller) {
  Error error;
  controller.connection.reset(g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, error.out()));
  if (!controller.connection) {
    end_daemon(std::string("Failed to connect to system bus: ") + error.message());
  }
}

void request_name(LegacyController &controller) {
  constexpr guint32 no_flags = 0;
  Error error;
  if (!call_bus(controller, "RequestName", g_variant_new("(su)", kLegacyService, no_flags),
                error)) {
    end_daemon(std::string("Could not request name: ") + error.message());
  }
  controller.name_owned = true;
}

void release_name(LegacyController &controller) {
  Error error;
  if (!call_bus(controller, "ReleaseName", g_variant_new("(s)", kLegacyService), error)) {
    log_warning("Could not release DBus name: %s", error.message());
  }
  controller.name_owned = false;
}

}  // namespace

void iocontrol_conf_legacy_dbus_create() {
  g_assert(legacy_ctrl == NULL);
  legacy_ctrl = std::make_unique<LegacyController>();
  connect(*legacy_ctrl);
  legacy_ctrl->introspection = legacy_introspection_parse(kLegacyIntrospection);
  legacy_register_objects(*legacy_ctrl);
  legacy_announcer_start(legacy_ctrl->announcer);
  legacy_announce_counts(legacy_ctrl->announcer);
  request_name(*legacy_ctrl);
}

void iocontrol_conf_legacy_dbus_destroy() {
  g_assert(legacy_ctrl != NULL);
  if (legacy_ctrl->name_owned) {
    g_assert(legacy_ctrl->connection != NULL);
    release_name(*legacy_ctrl);
  }
  unreg_port_objects(*legacy_ctrl);
  legacy_announcer_stop(legacy_ctrl->announcer);
  legacy_ctrl.reset();
}
