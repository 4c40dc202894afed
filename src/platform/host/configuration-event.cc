#include "platform/configuration-event.h"

#include <algorithm>
#include <memory>
#include <string>
#include <tuple>
#include <vector>

#include "base/glib-ptr.h"

namespace {

constexpr const char *kObject = "/com/kelv/Configuration/Event";
constexpr const char *kInterface = "com.kelv.Configuration.Event";

struct Declared {
  std::string interface;
  std::string path;
  std::string changed_interface;

  bool operator==(const Declared &other) const = default;
};

}  // namespace

struct ConfigurationEvent {
  std::vector<Declared> declared;
  std::string change;
};

namespace {

bool is_interface(const gchar *name) {
  return name && g_dbus_is_interface_name(name);
}

bool is_path(const gchar *path) {
  return path && g_variant_is_object_path(path);
}

gboolean fail(GError **error, GIOErrorEnum code, const char *text) {
  g_set_error_literal(error, G_IO_ERROR, code, text);
  return FALSE;
}

gboolean fail_argument(GError **error) {
  return fail(error, G_IO_ERROR_INVALID_ARGUMENT, "Not an interface and a path of the bus");
}

auto find_declared(std::vector<Declared> &all, const Declared &wanted) {
  return std::find(all.begin(), all.end(), wanted);
}

std::string escape(const gchar *text) {
  const GCharPtr escaped(g_uri_escape_string(text, nullptr, TRUE));
  return escaped.get();
}

}  // namespace

ConfigurationEvent *configuration_event_new(const gchar *name, EventProducer *producer,
                                            guint /*flags*/) {
  if (!name || *name == '\0' || !g_utf8_validate(name, -1, nullptr) || !producer) {
    return nullptr;
  }
  return std::make_unique<ConfigurationEvent>().release();
}

void configuration_event_free(ConfigurationEvent *handle) {
  const std::unique_ptr<ConfigurationEvent> owned(handle);
}

gboolean configuration_event_declare(ConfigurationEvent *handle, const gchar *interface,
                                     const gchar *path, const gchar *changed_interface,
                                     GError **error) {
  if (!handle || !is_interface(interface) || !is_path(path) || !is_interface(changed_interface)) {
    return fail_argument(error);
  }
  Declared wanted{interface, path, changed_interface};
  if (find_declared(handle->declared, wanted) != handle->declared.end()) {
    return fail(error, G_IO_ERROR_EXISTS, "The configuration event is declared already");
  }
  handle->declared.push_back(std::move(wanted));
  return TRUE;
}

gboolean configuration_event_undeclare(ConfigurationEvent *handle, const gchar *interface,
                                       const gchar *path, const gchar *changed_interface,
                                       GError **error) {
  if (!handle || !is_interface(interface) || !is_path(path) || !is_interface(changed_interface)) {
    return fail_argument(error);
  }
  const auto found = find_declared(handle->declared, {interface, path, changed_interface});
  if (found == handle->declared.end()) {
    return fail(error, G_IO_ERROR_NOT_FOUND, "The configuration event is not declared");
  }
  handle->declared.erase(found);
  return TRUE;
}

gboolean configuration_event_initialize_change_string(ConfigurationEvent *handle) {
  if (!handle) {
    return FALSE;
  }
  handle->change.clear();
  return TRUE;
}

gboolean configuration_event_append_escaped_pair_to_change_string(ConfigurationEvent *handle,
                                                                  const gchar *key,
                                                                  const gchar *value) {
  if (!handle || !key || *key == '\0' || !value || !g_utf8_validate(key, -1, nullptr) ||
      !g_utf8_validate(value, -1, nullptr)) {
    return FALSE;
  }
  if (!handle->change.empty()) {
    handle->change += '&';
  }
  handle->change += escape(key) + '=' + escape(value);
  return TRUE;
}

gboolean configuration_event_send(ConfigurationEvent *handle, const gchar *interface,
                                  const gchar *path, const gchar *changed_interface,
                                  const gchar *changed_path, guint /*consumers*/, GError **error) {
  if (!handle || !is_interface(interface) || !is_path(path) || !is_interface(changed_interface) ||
      !is_path(changed_path)) {
    return fail_argument(error);
  }
  if (find_declared(handle->declared, {interface, path, changed_interface}) ==
      handle->declared.end()) {
    return fail(error, G_IO_ERROR_NOT_FOUND, "The configuration event is not declared");
  }
  const GObjectPtr<GDBusConnection> connection(g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, error));
  return connection &&
         g_dbus_connection_emit_signal(
             connection.get(), nullptr, kObject, kInterface, "Changed",
             g_variant_new("(sss)", changed_interface, changed_path, handle->change.c_str()),
             error);
}
