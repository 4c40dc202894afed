#include "legacy/mappings.h"

#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <mutex>
#include <string_view>
#include <utility>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "base/trusted-file.h"
#include "legacy/documents.h"
#include "platform/confutils.h"
#include "port/port-registry.h"
#include "settings/storage-writer.h"

namespace {

constexpr const char *kTemporary = "/etc/portd.d/legacy.tmp";
constexpr const char *kRegistry = "/etc/service_registry/services.d/portd_service_registry.conf";
constexpr const char *kMappings = "/etc/legacyconfig/legacymappings.d/portd.xml";

std::vector<LegacyPort> legacy_ports() {
  std::vector<LegacyPort> ports;
  for (std::uint32_t number = 0; number < port_registry_count(); ++number) {
    const IOPortRef port = port_registry_find(number);
    if (io_port_is_ioport(port.get())) {
      ports.push_back({io_port_get_number(port.get()), io_port_get_type(port.get())});
    }
  }
  return ports;
}

bool has_contents(const char *path, const std::string &text) {
  const RegularFile file = open_regular_file(path, nullptr);
  return file.fd && static_cast<std::size_t>(file.status.st_size) == text.size() &&
         read_file(file, text.size(), nullptr) == text;
}

// Whether the error is of a file system or a folder, which the next one need not share.
bool is_folder_error(const Error &error) {
  return error.matches(G_FILE_ERROR, G_FILE_ERROR_ACCES) ||
         error.matches(G_FILE_ERROR, G_FILE_ERROR_PERM) ||
         error.matches(G_FILE_ERROR, G_FILE_ERROR_ROFS);
}

// What can't be moved must not stay: the folder is that of the hardware descriptions, and the next
// start would read it as one. The folder is root's, so the service account writes beside the file,
// if there at all; and a service manager that lets the daemon write single folders makes each a
// mount of its own.
//
// The bytes are on storage before the file gets its name: after a power cut it is the old or the
// new one, whole.
bool replace(const char *path, const std::string &text) {
  constexpr auto on_storage = static_cast<GFileSetContentsFlags>(G_FILE_SET_CONTENTS_CONSISTENT |
                                                                 G_FILE_SET_CONTENTS_DURABLE);
  constexpr int readable_by_all = 0666;  // as far as the umask lets
  if (has_contents(path, text)) {
    return true;
  }
  const auto size = static_cast<gssize>(text.size());
  Error error;
  bool elsewhere = false;
  if (g_file_set_contents_full(kTemporary, text.data(), size, on_storage, readable_by_all,
                               error.out())) {
    if (rename(kTemporary, path) == 0) {
      return true;
    }
    elsewhere = errno == EXDEV;
    unlink(kTemporary);
  } else {
    elsewhere = is_folder_error(error);
  }
  return elsewhere && confutils_set_file_contents_with_sync(path, text.data(), size, nullptr);
}

bool has_folder(const char *path) {
  const GCharPtr folder(g_path_get_dirname(path));
  return g_file_test(folder.get(), G_FILE_TEST_IS_DIR);
}

void write_files(const std::vector<LegacyPort> &ports) {
  // A device without the older configuration service needs no files.
  if (!has_folder(kRegistry) && !has_folder(kMappings)) {
    return;
  }
  if (!replace(kRegistry, legacy_registry_document(ports))) {
    log_warning("Couldn't write to service registry");
  }
  if (!replace(kMappings, legacy_mapping_document(ports))) {
    log_warning("Couldn't write to legacy mappings");
  }
}

std::mutex pending_lock;
std::vector<LegacyPort> pending;  // guarded by pending_lock; the ports of the latest request

// On the thread of the storage writer.
void write_pending() {
  std::unique_lock lock(pending_lock);
  const std::vector<LegacyPort> ports = pending;
  lock.unlock();
  write_files(ports);
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
  const GDirPtr entries(g_dir_open(folder.get(), 0, nullptr));
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
  write_files(legacy_ports());
}

void legacy_request_mappings() {
  std::vector<LegacyPort> ports = legacy_ports();
  {
    const std::lock_guard lock(pending_lock);
    pending = std::move(ports);
  }
  storage_writer_request(write_pending);
}
