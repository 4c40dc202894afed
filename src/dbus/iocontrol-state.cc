#include "dbus/iocontrol-state.h"

#include "base/glib-ptr.h"
#include "dbus/bus-service.h"
#include "dbus/error-domain.h"
#include "dbus/iocontrol-handlers.h"
#include "dbus/state-calls.h"
#include "dbus/system-bus.h"
#include "iocontrol-state-gen.h"
#include "port/port-listener.h"

namespace {

constexpr const char *kName = "com.kelv.IOControl.State";
constexpr const char *kPath = "/com/kelv/IOControl/State";

BusService service(kName, kPath);

void emit_port_changed(const PortChange &change) {
  service.with_object([&](GDBusInterfaceSkeleton *object) {
    iocontrol_state_emit_port_changed(IOCONTROL_STATE(object), change.number, change.is_virtual,
                                      change.hidden, change.input, change.virtual_trig,
                                      change.state, change.activelow);
  });
}

void emit_action_sequence_done(int number) {
  service.with_object([&](GDBusInterfaceSkeleton *object) {
    iocontrol_state_emit_action_sequence_done(IOCONTROL_STATE(object), number);
  });
}

GObjectPtr<GDBusConnection> current_bus() {
  GObjectPtr<GDBusConnection> bus;
  service.with_object([&](GDBusInterfaceSkeleton *object) {
    if (GDBusConnection *connection = g_dbus_interface_skeleton_get_connection(object)) {
      bus = gobject_reference(connection);
    }
  });
  return bus;
}

// A question that the bus itself answers, after it has taken all that was sent before.
void wait_until_sent(GCancellable *cancelled, std::int64_t deadline_us) {
  constexpr std::int64_t us_per_ms = 1000;
  const auto connection = current_bus();
  const std::int64_t left_ms = (deadline_us - g_get_monotonic_time()) / us_per_ms;
  if (!connection || left_ms <= 0) {
    return;
  }
  Error ignored;  // whatever the answer is, nothing is left to wait for
  const GVariantPtr reply(g_dbus_connection_call_sync(
      connection.get(), "org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus",
      "GetId", nullptr, nullptr, G_DBUS_CALL_FLAGS_NO_AUTO_START, static_cast<int>(left_ms),
      cancelled, ignored.out()));
}

}  // namespace

void iocontrol_state_start() {
  io_error_domains_register();
  port_listener().port_changed = emit_port_changed;
  port_listener().action_sequence_done = emit_action_sequence_done;
  port_listener().wait_until_sent = wait_until_sent;
  IOControlState *object = iocontrol_state_skeleton_new();
  iocontrol_connect_handlers(object);
  system_bus_when_ready(
      [](GDBusConnection *connection) { state_calls_start(connection, kPath, kName); });
  service.start(G_DBUS_INTERFACE_SKELETON(object));
}

void iocontrol_state_stop() {
  state_calls_stop();
  service.stop();
}
