#include "dbus/iocontrol-state.h"

#include <mutex>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "base/own-name.h"
#include "dbus/connector.h"
#include "dbus/error-domain.h"
#include "dbus/iocontrol-handlers.h"
#include "iocontrol-state-gen.h"
#include "port/port-listener.h"

namespace {

constexpr const char *kName = "com.kelv.IOControl.State";
constexpr const char *kPath = "/com/kelv/IOControl/State";

// Action threads emit signals while the main thread may start or stop the interface.
std::mutex skeleton_lock;
GObjectPtr<IOControlState> skeleton;
GObjectPtr<GDBusConnection> bus;  // once it is there
BusName control_name;
BusName connector_name;

GObjectPtr<IOControlState> current_skeleton() {
  const std::lock_guard lock(skeleton_lock);
  return GObjectPtr<IOControlState>(
      skeleton ? static_cast<IOControlState *>(g_object_ref(skeleton.get())) : nullptr);
}

void emit_port_changed(const PortChange &change) {
  if (const auto object = current_skeleton()) {
    iocontrol_state_emit_port_changed(object.get(), change.number, change.is_virtual, change.hidden,
                                      change.input, change.virtual_trig, change.state,
                                      change.activelow);
  }
}

void emit_action_sequence_done(int number) {
  if (const auto object = current_skeleton()) {
    iocontrol_state_emit_action_sequence_done(object.get(), number);
  }
}

void on_bus_acquired(GDBusConnection *connection, const char * /*name*/, gpointer /*user_data*/) {
  bus.reset(static_cast<GDBusConnection *>(g_object_ref(connection)));
  GObjectPtr<IOControlState> object(iocontrol_state_skeleton_new());
  iocontrol_connect_handlers(object.get());
  export_object(G_DBUS_INTERFACE_SKELETON(object.get()), connection, kPath);
  connector_export(connection);
  const std::lock_guard lock(skeleton_lock);
  skeleton = std::move(object);
}

}  // namespace

void iocontrol_state_start() {
  io_error_domains_register();
  port_listener().port_changed = emit_port_changed;
  port_listener().action_sequence_done = emit_action_sequence_done;
  control_name = BusName(kName, on_bus_acquired);
  connector_name = BusName(kConnectorName, nullptr);
}

void iocontrol_state_stop() {
  GObjectPtr<IOControlState> object;
  {
    const std::lock_guard lock(skeleton_lock);
    object = std::move(skeleton);
  }
  if (object) {
    g_dbus_interface_skeleton_unexport(G_DBUS_INTERFACE_SKELETON(object.get()));
  }
  connector_withdraw();
  control_name.reset();
  connector_name.reset();
}

void iocontrol_state_flush() {
  if (bus) {
    flush_bus(bus.get());
    bus.reset();
  }
}
