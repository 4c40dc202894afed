#include "legacy/bridge.h"

#include "base/fatal.h"
#include "base/log.h"
#include "base/termination.h"
#include "legacy/announcer.h"
#include "legacy/mappings.h"
#include "legacy/names.h"
#include "legacy/objects.h"

namespace {

// A bus that does not answer must keep neither a drop of ports nor the end of the daemon for long.
constexpr int kReleaseTimeoutMs = 1000;

bool enabled = true;
std::unique_ptr<LegacyController> legacy_ctrl;

GVariantPtr call_bus(const LegacyController &controller, const char *method, GVariant *arguments,
                     int timeout_ms, GCancellable *cancellable, Error &error) {
  return GVariantPtr(g_dbus_connection_call_sync(
      controller.connection.get(), "org.freedesktop.DBus", "/org/freedesktop/DBus",
      "org.freedesktop.DBus", method, arguments, G_VARIANT_TYPE("(u)"), G_DBUS_CALL_FLAGS_NONE,
      timeout_ms, cancellable, error.out()));
}

bool is_ending(const Error &error) {
  return error.matches(G_IO_ERROR, G_IO_ERROR_CANCELLED);
}

bool connect(LegacyController &controller) {
  Error error;
  controller.connection.reset(
      g_bus_get_sync(G_BUS_TYPE_SYSTEM, termination_cancellable(), error.out()));
  if (!controller.connection && !is_ending(error)) {
    end_daemon(std::string("Failed to connect to system bus: ") + error.message());
  }
  return controller.connection != nullptr;
}

// The connection sends SIGTERM itself when it is lost.
void request_name(LegacyController &controller) {
  constexpr guint32 no_flags = 0;
  Error error;
  controller.name_owned =
      call_bus(controller, "RequestName", g_variant_new("(su)", kLegacyService, no_flags), G_MAXINT,
               termination_cancellable(), error) != nullptr;
  if (controller.name_owned || is_ending(error)) {
    return;
  }
  const std::string reason = std::string("Could not request name: ") + error.message();
  if (!g_dbus_connection_is_closed(controller.connection.get())) {
    end_daemon(reason);
  }
  log_warning("%s", reason.c_str());
}

void release_name(LegacyController &controller) {
  Error error;
  if (!call_bus(controller, "ReleaseName", g_variant_new("(s)", kLegacyService), kReleaseTimeoutMs,
                nullptr, error)) {
    log_warning("Could not release DBus name: %s", error.message());
  }
  controller.name_owned = false;
}

}  // namespace

bool legacy_interface_enabled() {
  return enabled;
}

void legacy_interface_disable() {
  enabled = false;
}

void iocontrol_conf_legacy_dbus_create() {
  g_assert(legacy_ctrl == NULL);
  legacy_ctrl = std::make_unique<LegacyController>();
  if (!connect(*legacy_ctrl)) {
    return;
  }
  legacy_ctrl->introspection = legacy_introspection_parse(kLegacyIntrospection);
  legacy_register_objects(*legacy_ctrl);
  legacy_announcer_start(legacy_announcer());
  legacy_announce_counts(legacy_announcer());
  request_name(*legacy_ctrl);
}

void iocontrol_conf_legacy_dbus_destroy() {
  g_assert(legacy_ctrl != NULL);
  if (legacy_ctrl->name_owned) {
    g_assert(legacy_ctrl->connection != NULL);
    release_name(*legacy_ctrl);
  }
  unreg_port_objects(*legacy_ctrl);
  legacy_announcer_stop(legacy_announcer());
  legacy_ctrl.reset();
}

void legacy_interface_renew() {
  if (enabled) {
    iocontrol_conf_legacy_dbus_destroy();
    legacy_request_mappings();
    iocontrol_conf_legacy_dbus_create();
  }
}
