#include "dbus/reannounce.h"

#include "dbus/iocontrol-conf-legacy-dbus.h"
#include "dbus/legacy-interface.h"
#include "dbus/legacy-mappings.h"
#include "port/port-registry.h"

namespace {

// Objects and files are to name exactly the ports in service.
void renew_legacy_interface() {
  iocontrol_conf_legacy_dbus_destroy();
  legacy_write_mappings();
  iocontrol_conf_legacy_dbus_create();
}

}  // namespace

void reannounce_ports() {
  if (legacy_interface_enabled()) {
    renew_legacy_interface();
  }
  port_registry_arm_watches();
  port_registry_declare_events();
}
