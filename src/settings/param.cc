#include "settings/param.h"

#include <algorithm>
#include <cstdio>
#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <utility>
#include <vector>

#include "base/glib-ptr.h"
#include "base/main-queue.h"
#include "base/trusted-file.h"
#include "platform/confutils.h"
#include "port/ioport.h"
#include "port/port-registry.h"
#include "settings/port-settings.h"
#include "settings/storage-writer.h"

namespace {

// The file in memory, and the order in which files are read and replaced. Held while storage is
// waited for, so never taken by a request.
std::mutex settings_lock;
GKeyFilePtr key_file;  // guarded by settings_lock; none between two operations in normal service
std::string key_file_path;  // guarded by settings_lock; where it was read from

// What was asked for and is not being stored yet, by file. The lock is taken last.
struct Pending {
  std::vector<PortSettings> settings;
  std::vector<std::function<void()>> ended;  // whom to tell
};
std::mutex pending_lock;
std::map<std::string, Pending> pending;  // guarded by pending_lock

// --- Requests ---

// A later request of the same port takes the place of the earlier one.
void insert_or_replace(std::vector<PortSettings> &all, PortSettings settings) {
  const auto same = std::find_if(all.begin(), all.end(), [&](const PortSettings &earlier) {
    return earlier.group == settings.group;
  });
  if (same != all.end()) {
    *same = std::move(settings);
  } else {
    all.push_back(std::move(settings));
  }
}

void add_pending(const std::string &file, PortSettings settings, std::function<void()> ended) {
  const std::lock_guard lock(pending_lock);
  Pending &all = pending[file];
  insert_or_replace(all.settings, std::move(settings));
  if (ended) {
    all.ended.push_back(std::move(ended));
  }
}

Pending take_pending(const std::string &file) {
  const std::lock_guard lock(pending_lock);
  auto taken = pending.extract(file);
  return taken ? std::move(taken.mapped()) : Pending();
}

std::vector<std::string> pending_files() {
  const std::lock_guard lock(pending_lock);
  std::vector<std::string> files;
  files.reserve(pending.size());
  for (const auto &[file, settings] : pending) {
    files.push_back(file);
  }
  return files;
}

bool is_pending(const std::string &file) {
  const std::lock_guard lock(pending_lock);
  return pending.contains(file);
}

// --- The operations, with the lock held ---

// Only a file that is known not to exist reads as empty: an error must not make good settings give
// way to defaults.
bool load(GKeyFile *into, const std::string &file, GError **error) {
  Error reason;
  std::string path = file;
  const RegularFile opened = open_trusted_file(path, reason.out());
  if (reason.matches(G_FILE_ERROR, G_FILE_ERROR_NOENT)) {
    return true;
  }
  const auto text = opened.fd ? read_file(opened, kNoSizeLimit, reason.out()) : std::nullopt;
  // Translations are kept too: a key of another's in a language of its own is not ours to lose.
  constexpr auto keep_all =
      static_cast<GKeyFileFlags>(G_KEY_FILE_KEEP_COMMENTS | G_KEY_FILE_KEEP_TRANSLATIONS);
  if (!text ||
      !g_key_file_load_from_data(into, text->data(), text->size(), keep_all, reason.out())) {
    g_propagate_prefixed_error(error, g_error_copy(reason.get()), "%s: ", file.c_str());
    return false;
  }
  return true;
}

bool read_configuration(const std::string &file) {
  key_file.reset(g_key_file_new());
  key_file_path = file;
  Error error;
  if (!load(key_file.get(), file, error.out())) {
    std::fprintf(stderr, "Could not read key file: %s\n", error.message());
    key_file.reset();
    return false;
  }
  return true;
}

bool write_configuration(const std::string &file) {
  gsize length = 0;
  const GCharPtr text(g_key_file_to_data(key_file.get(), &length, nullptr));
  Error error;
  confutils_set_file_contents_with_sync(file.c_str(), text.get(), static_cast<gssize>(length),
                                        error.out());
  if (error) {
    std::fprintf(stderr, "Failed to store key file %s: %s\n", file.c_str(), error.message());
  }
  return !error;
}

void set_conf_vals(IOPort *port) {
  if (const auto settings = port_settings_take(port)) {
    port_settings_store(*settings, key_file.get());
  }
}

// Brings the file into memory, unless it is there, for the time of `change`, and writes it back.
template <typename Change>
void change_and_write(const std::string &file, Change change) {
  const bool held = key_file != nullptr;
  if (!held && !read_configuration(file)) {
    g_return_if_fail_warning(G_LOG_DOMAIN, "param_save_for_port",
                             "param_read_configuration (file)");
    return;
  }
  change();
  write_configuration(file);
  if (!held) {
    key_file.reset();
  }
}

// The same with what waits to be stored in the file, which is older than what `change` brings.
template <typename Change>
void store(const std::string &file, Change change) {
  Pending earlier = take_pending(file);
  change_and_write(file, [&] {
    for (const PortSettings &settings : earlier.settings) {
      port_settings_store(settings, key_file.get());
    }
    change();
  });
  for (auto &ended : earlier.ended) {
    post_to_main_loop(std::move(ended));
  }
}

// On the thread of the storage writer.
void store_pending() {
  const std::lock_guard lock(settings_lock);
  for (const std::string &file : pending_files()) {
    store(file, [] {});
  }
}

}  // namespace

bool param_read_configuration(const std::string &file) {
  const std::lock_guard lock(settings_lock);
  key_file.reset();
  if (is_pending(file)) {
    store(file, [] {});
  }
  return read_configuration(file);
}

bool param_write_configuration(const std::string &file) {
  const std::lock_guard lock(settings_lock);
  g_return_val_if_fail(key_file != NULL, false);
  return write_configuration(file);
}

void param_free_configuration() {
  const std::lock_guard lock(settings_lock);
  key_file.reset();
}

bool param_get_conf_vals(IOPort *port) {
  const std::lock_guard lock(settings_lock);
  g_return_val_if_fail(key_file != NULL, false);
  return port_settings_apply(key_file.get(), key_file_path, port);
}

void param_set_conf_vals(IOPort *port) {
  const std::lock_guard lock(settings_lock);
  g_return_if_fail(key_file != NULL);
  set_conf_vals(port);
}

void param_save_for_port(IOPort *port, const std::string &file) {
  const std::lock_guard lock(settings_lock);
  store(file, [&] { set_conf_vals(port); });
}

void param_request_save(IOPort *port, const std::string &file, std::function<void()> ended) {
  auto settings = port_settings_take(port);
  if (!settings) {
    if (ended) {
      post_to_main_loop(std::move(ended));
    }
    return;
  }
  add_pending(file, std::move(*settings), std::move(ended));
  storage_writer_request(store_pending);
}

void param_save_all(const std::string &file) {
  std::vector<IOPortRef> ports;
  for (std::uint32_t number = 0; number < port_registry_count(); ++number) {
    if (IOPortRef port = port_registry_find(number)) {
      ports.push_back(std::move(port));
    }
  }
  if (ports.empty()) {
    return;
  }
  const std::lock_guard lock(settings_lock);
  store(file, [&] {
    for (const auto &port : ports) {
      set_conf_vals(port.get());
    }
  });
}
