#include "dbus/legacy-interface.h"

namespace {
bool enabled = true;
}

bool legacy_interface_enabled() {
  return enabled;
}

void legacy_interface_disable() {
  enabled = false;
}
