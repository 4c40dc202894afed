#include "dbus/reannounce.h"

#include "port/port-registry.h"

void reannounce_ports() {
  port_registry_arm_watches();
  port_registry_declare_events();
}
