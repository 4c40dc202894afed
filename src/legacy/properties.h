// The properties of the objects that older configuration tools read and write: the settings of a
// port in the words of those tools.
//
// Texts are byte strings on the way in and strings on the way out. Both operations are callbacks of
// GDBus, on the main thread; `user_data` is not used. The port is that of the number at the end of
// the path.
#pragma once

#include <gio/gio.h>

#include <functional>

// A new floating value; or none, always with `error`, when there is no such port or the port has no
// such value.
GVariant *iocontrol_conf_legacy_dbus_get_property(GDBusConnection *connection, const char *sender,
                                                  const char *object_path,
                                                  const char *interface_name,
                                                  const char *property_name, GError **error,
                                                  gpointer user_data);

// Changes a setting and has the port's settings stored. False, always with `error` and with nothing
// changed, when there is no such port or the value does not fit.
gboolean iocontrol_conf_legacy_dbus_set_property(GDBusConnection *connection, const char *sender,
                                                 const char *object_path,
                                                 const char *interface_name,
                                                 const char *property_name, GVariant *value,
                                                 GError **error, gpointer user_data);

// The same, for whoever answers when the setting is stored: `stored` is then called from the main
// loop, once, also where storing has failed.
struct LegacyValue {
  const char *object_path;
  const char *interface_name;
  const char *property_name;
  GVariant *value;
};
enum class LegacyWrite { kRefused, kDone, kBeingStored };
LegacyWrite legacy_write_property(const LegacyValue &written, std::function<void()> stored,
                                  GError **error);
