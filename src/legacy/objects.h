// What serves older configuration tools, and the steps of putting it on the bus, each for itself.
#pragma once

#include <gio/gio.h>

#include <cstddef>
#include <memory>
#include <vector>

#include "base/glib-ptr.h"

struct LegacyController {
  GObjectPtr<GDBusConnection> connection;
  GDBusNodeInfoPtr introspection;
  std::vector<guint> object_ids;
  bool name_owned = false;
};

// Indexes of the interfaces in the introspection data.
enum class LegacyInterface : std::size_t {
  kPort = 0,
  kInput = 1,
  kOutput = 2,
};

// The interfaces of an introspection document. One that can't be parsed ends the daemon.
GDBusNodeInfoPtr legacy_introspection_parse(const char *document);
extern const char *const kLegacyIntrospection;

// Puts one interface of a port on the controller's connection. False, with a message on standard
// error, when it is there already.
bool iocontrol_conf_legacy_dbus_register_object(LegacyController &controller, int number,
                                                LegacyInterface interface);
// Puts all ports there, as far as the hardware description wants them seen. A failure ends the
// daemon.
void legacy_register_objects(LegacyController &controller);
// Takes everything off the connection again.
void unreg_port_objects(LegacyController &controller);

// The callback for methods, of which the interfaces have none, and for writes of properties.
void iocontrol_conf_legacy_dbus_handle_method_call(GDBusConnection *connection, const char *sender,
                                                   const char *object_path,
                                                   const char *interface_name,
                                                   const char *method_name, GVariant *parameters,
                                                   GDBusMethodInvocation *invocation,
                                                   gpointer user_data);
