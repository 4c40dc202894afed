// The objects of the ports on the bus.
#include <cstdio>
#include <set>

#include "base/fatal.h"
#include "dbus/legacy-controller.h"
#include "dbus/legacy-names.h"
#include "dbus/legacy-properties.h"
#include "hwdesc/hwdesc.h"
#include "port/ioport.h"
#include "port/port-registry.h"

namespace {

// How many ports older tools know of when the hardware description does not say.
constexpr int kDefaultPorts = 5;

constexpr GDBusInterfaceVTable kCallbacks = {iocontrol_conf_legacy_dbus_handle_method_call,
                                             iocontrol_conf_legacy_dbus_get_property,
                                             iocontrol_conf_legacy_dbus_set_property,
                                             {}};

[[noreturn]] void end_without_objects() {
  end_daemon("Unable to register objects on DBus");
}

// The numbers in use, since the hardware description may ask for any count at all.
std::set<int> numbers_below(int count) {
  std::set<int> numbers;
  const auto lock = port_registry_lock();
  for (const IOPort *ioport : port_registry_active_locked()) {
    const int number = io_port_get_number(ioport);
    if (number >= 0 && number < count) {
      numbers.insert(number);
    }
  }
  return numbers;
}

void register_or_end(LegacyController &controller, int number, LegacyInterface interface) {
  if (!iocontrol_conf_legacy_dbus_register_object(controller, number, interface)) {
    end_without_objects();
  }
}

void register_port(LegacyController &controller, const IOPort *ioport) {
  const int number = io_port_get_number(ioport);
  register_or_end(controller, number, LEGACY_INTERFACE_PORT);
  if (io_port_get_type(ioport) != PORT_OUTPUT) {
    register_or_end(controller, number, LEGACY_INTERFACE_INPUT);
  }
  if (io_port_get_type(ioport) != PORT_INPUT) {
    register_or_end(controller, number, LEGACY_INTERFACE_OUTPUT);
  }
}

}  // namespace

// Older tools hold this document against their own, so its form is fixed.
const char *const kLegacyIntrospection =
    "<node>"
    "<interface name='com.kelv.Configuration.Legacy.IOControl1.IOPort'>"
    "<property name='NbrOfIOPorts' type='i' access='read'/>"
    "<property name='NbrOfInputs' type='i' access='read'/>"
    "<property name='NbrOfOutputs' type='i' access='read'/>"
    "<property name='Configurable' type='b' access='read'/>"
    "<property name='Direction' type='ay' access='readwrite'/>"
    "</interface>"
    "<interface name='com.kelv.Configuration.Legacy.IOControl1.Input'>"
    "<property name='Name' type='ay' access='readwrite'/>"
    "<property name='Trig' type='ay' access='readwrite'/>"
    "</interface>"
    "<interface name='com.kelv.Configuration.Legacy.IOControl1.Output'>"
    "<property name='Name' type='ay' access='readwrite'/>"
    "<property name='Active' type='ay' access='readwrite'/>"
    "<property name='Button' type='ay' access='readwrite'/>"
    "<property name='PulseTime' type='i' access='readwrite'/>"
    "<property name='Mode' type='ay' access='readwrite'/>"
    "<property name='DelayTime' type='i' access='readwrite'/>"
    "</interface>"
    "</node>";

GDBusNodeInfoPtr legacy_introspection_parse(const char *document) {
  GDBusNodeInfoPtr introspection(g_dbus_node_info_new_for_xml(document, nullptr));
  if (!introspection) {
    end_without_objects();
  }
  return introspection;
}

bool iocontrol_conf_legacy_dbus_register_object(LegacyController &controller, int number,
                                                LegacyInterface interface) {
  constexpr int message_number = 487;  // support staff look messages up by it
  Error error;
  const guint id = g_dbus_connection_register_object(
      controller.connection.get(), legacy_object_path(number).c_str(),
      controller.introspection->interfaces[interface], &kCallbacks, &controller.announcer, nullptr,
      error.out());
  if (id == 0) {
    std::fprintf(stderr, "%s@%d: Error: \"%s\" when registering DBUS object for port %d\n",
                 __func__, message_number, error.message(), number);
    return false;
  }
  controller.object_ids.push_back(id);
  return true;
}

void legacy_register_objects(LegacyController &controller) {
  const int count = hwdesc_first_virtual_input().value_or(kDefaultPorts);
  // The counts are read from the first object, whatever ports there are.
  if (count <= 0 || !port_registry_find(0)) {
    register_or_end(controller, 0, LEGACY_INTERFACE_PORT);
  }
  for (const int number : numbers_below(count)) {
    if (const IOPortRef ioport = port_registry_find(static_cast<std::uint32_t>(number))) {
      register_port(controller, ioport.get());
    }
  }
}

void unreg_port_objects(LegacyController &controller) {
  constexpr int message_number = 627;
  for (const guint id : controller.object_ids) {
    if (!g_dbus_connection_unregister_object(controller.connection.get(), id)) {
      std::fprintf(stderr, "%s@%d: Failed to unregister object\n", __func__, message_number);
    }
  }
  controller.object_ids.clear();
}

void iocontrol_conf_legacy_dbus_handle_method_call(
    GDBusConnection * /*connection*/, const char * /*sender*/, const char *object_path,
    const char *interface_name, const char *method_name, GVariant * /*parameters*/,
    GDBusMethodInvocation *invocation, gpointer /*user_data*/) {
  g_assert(object_path && interface_name && method_name);
  g_dbus_method_invocation_return_error(invocation, G_DBUS_ERROR, G_DBUS_ERROR_UNKNOWN_METHOD,
                                        "No such method: %s", method_name);
}
