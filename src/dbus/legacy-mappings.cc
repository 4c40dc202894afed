#include "dbus/legacy-mappings.h"

#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <memory>
#include <string_view>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "dbus/legacy-documents.h"
#include "platform/confutils.h"
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
  const auto size = static_cast<gssize>(text.size());
  if (!g_file_set_contents(kTemporary, text.data(), size, nullptr)) {
    return false;
  }
  if (rename(kTemporary, path) == 0) {
    return true;
  }
  const bool elsewhere = errno == EXDEV;
  unlink(kTemporary);
  // A service manager that lets the daemon write single folders makes each a mount of its own.
  return elsewhere && confutils_set_file_contents_with_sync(path, text.data(), size, nullptr);
}

// The temporary file, or what GLib calls it until it is whole.
bool is_temporary(const std::string &path) {
  constexpr std::size_t suffix = std::string_view(".XXXXXX").size();
  const std::string_view whole(kTemporary);
  return path == whole ||
         (path.starts_with(std::string(whole) + '.') && path.size() == whole.size() + suffix);
}

}  // namespace

void legacy_remove_unfinished() {
  const GCharPtr folder(g_path_get_dirname(kTemporary));
  const std::unique_ptr<GDir, GlibDeleter<g_dir_close>> entries(
      g_dir_open(folder.get(), 0, nullptr));
  if (!entries) {
    return;
  }
  while (const char *name = g_dir_read_name(entries.get())) {
    const std::string path = std::string(folder.get()) + '/' + name;
    if (is_temporary(path)) {
      unlink(path.c_str());
    }
  }
}

void legacy_write_mappings() {
  const std::vector<LegacyPort> ports = legacy_ports();
  if (!replace(kRegistry, legacy_registry_document(ports))) {
    log_warning("Couldn't write to service registry");
  }
  if (!replace(kMappings, legacy_mapping_document(ports))) {
    log_warning("Couldn't write to legacy mappings");
  }
}
