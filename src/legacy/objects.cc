#include "legacy/objects.h"

#include <cstdio>
#include <set>
#include <string_view>

#include "base/fatal.h"
#include "hwdesc/hwdesc.h"
#include "legacy/names.h"
#include "legacy/properties.h"
#include "port/ioport.h"
#include "port/port-registry.h"

namespace {

// How many ports older tools know of when the hardware description does not say.
constexpr int kDefaultPorts = 5;

// No callback for writes: GDBus would run a queued one even after its object was unregistered, with
// the vtable and the introspection data gone. Without it writes come as method calls, which GDBus
// answers itself when the object is no longer there.
constexpr GDBusInterfaceVTable kCallbacks = {iocontrol_conf_legacy_dbus_handle_method_call,
                                             iocontrol_conf_legacy_dbus_get_property,
                                             nullptr,
                                             {}};

[[noreturn]] void end_without_objects() {
  end_daemon("Unable to register objects on DBus");
}

// The numbers in use, since the hardware description may ask for any count at all.
std::set<int> numbers_below(int count) {
  std::set<int> numbers;
  const auto lock = port_registry_lock();
  for (const IOPort *port : port_registry_active_locked()) {
    const int number = io_port_get_number(port);
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

void register_port(LegacyController &controller, const IOPort *port) {
  const int number = io_port_get_number(port);
  register_or_end(controller, number, LegacyInterface::kPort);
  if (io_port_get_type(port) != PORT_OUTPUT) {
    register_or_end(controller, number, LegacyInterface::kInput);
  }
  if (io_port_get_type(port) != PORT_INPUT) {
    register_or_end(controller, number, LegacyInterface::kOutput);
  }
}

// GDBus has checked by then that there is such a property, that it can be written, and its type.
bool is_property_write(GDBusMethodInvocation *invocation, std::string_view method) {
  return g_dbus_method_invocation_get_property_info(invocation) && method == "Set";
}

void write_property(const char *object_path, GVariant *parameters,
                    GDBusMethodInvocation *invocation) {
  const char *interface = nullptr;
  const char *property = nullptr;
  GVariant *value = nullptr;
  g_variant_get(parameters, "(&s&sv)", &interface, &property, &value);
  const GVariantPtr owned(value);
  const auto answer = [invocation] { g_dbus_method_invocation_return_value(invocation, nullptr); };
  Error error;
  const LegacyWrite outcome =
      legacy_write_property({object_path, interface, property, value}, answer, error.out());
  if (outcome == LegacyWrite::kDone) {
    answer();
  } else if (outcome == LegacyWrite::kRefused) {
    g_dbus_method_invocation_return_gerror(invocation, error.get());
  }
}

}  // namespace

// Fixed: the document, to the letter.
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
  constexpr int message_number = 487;  // fixed
  Error error;
  const guint id = g_dbus_connection_register_object(
      controller.connection.get(), legacy_object_path(number).c_str(),
      controller.introspection->interfaces[static_cast<std::size_t>(interface)], &kCallbacks,
      nullptr, nullptr, error.out());
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
    register_or_end(controller, 0, LegacyInterface::kPort);
  }
  for (const int number : numbers_below(count)) {
    if (const IOPortRef port = port_registry_find(static_cast<std::uint32_t>(number))) {
      register_port(controller, port.get());
    }
  }
}

void unreg_port_objects(LegacyController &controller) {
  constexpr int message_number = 627;  // fixed
  for (const guint id : controller.object_ids) {
    if (!g_dbus_connection_unregister_object(controller.connection.get(), id)) {
      std::fprintf(stderr, "%s@%d: Failed to unregister object\n", __func__, message_number);
    }
  }
  controller.object_ids.clear();
}

void iocontrol_conf_legacy_dbus_handle_method_call(GDBusConnection * /*connection*/,
                                                   const char * /*sender*/, const char *object_path,
                                                   const char *interface_name,
                                                   const char *method_name, GVariant *parameters,
                                                   GDBusMethodInvocation *invocation,
                                                   gpointer /*user_data*/) {
  g_assert(object_path && interface_name && method_name);
  if (is_property_write(invocation, method_name)) {
    write_property(object_path, parameters, invocation);
  } else {
    g_dbus_method_invocation_return_error(invocation, G_DBUS_ERROR, G_DBUS_ERROR_UNKNOWN_METHOD,
                                          "No such method: %s", method_name);
  }
}
