#include "dbus/legacy-mappings.h"

#include <unistd.h>

#include <cstdint>
#include <cstdio>

#include "base/log.h"
#include "dbus/legacy-documents.h"
#include "port/port-registry.h"

namespace {

constexpr const char *kTemporary = "/etc/portd.d/legacy.tmp";
constexpr const char *kRegistry = "/etc/service_registry/services.d/portd_service_registry.conf";
constexpr const char *kMappings = "/etc/legacyconfig/legacymappings.d/portd.xml";

std::vector<LegacyPort> legacy_ports() {
  std::vector<LegacyPort> ports;
  for (std::uint32_t number = 0; number < port_registry_count(); ++number) {
    const IOPortRef ioport = port_registry_find(number);
    if (io_port_is_ioport(ioport.get())) {
      ports.push_back({io_port_get_number(ioport.get()), io_port_get_type(ioport.get())});
    }
  }
  return ports;
}

// What can't be moved must not stay: the folder is that of the hardware descriptions, and the next
// start would read it as one.
bool replace(const char *path, const std::string &text) {
  if (!g_file_set_contents(kTemporary, text.data(), static_cast<gssize>(text.size()), nullptr)) {
    return false;
  }
  if (rename(kTemporary, path) != 0) {
    unlink(kTemporary);
    return false;
  }
  return true;
}

}  // namespace

void legacy_write_mappings() {
  const std::vector<LegacyPort> ports = legacy_ports();
  if (!replace(kRegistry, legacy_registry_document(ports))) {
    log_warning("Couldn't write to service registry");
  }
  if (!replace(kMappings, legacy_mapping_document(ports))) {
    log_warning("Couldn't write to legacy mappings");
  }
}
