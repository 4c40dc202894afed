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

// Action threads emit signals while the main thread starts or stops the interface, and an object
// that is being withdrawn must not be emitted on: both happen under the lock.
std::mutex skeleton_lock;
GObjectPtr<IOControlState> skeleton;
GObjectPtr<GDBusConnection> bus;  // once it is there
BusName control_name;
BusName connector_name;

void emit_port_changed(const PortChange &change) {
  const std::lock_guard lock(skeleton_lock);
  if (skeleton) {
    iocontrol_state_emit_port_changed(skeleton.get(), change.number, change.is_virtual,
                                      change.hidden, change.input, change.virtual_trig,
                                      change.state, change.activelow);
  }
}

void emit_action_sequence_done(int number) {
  const std::lock_guard lock(skeleton_lock);
  if (skeleton) {
    iocontrol_state_emit_action_sequence_done(skeleton.get(), number);
  }
}

void withdraw_object() {
  const std::lock_guard lock(skeleton_lock);
  if (skeleton) {
    g_dbus_interface_skeleton_unexport(G_DBUS_INTERFACE_SKELETON(skeleton.get()));
    skeleton.reset();
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
  withdraw_object();
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
