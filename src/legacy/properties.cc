#include "legacy/properties.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "legacy/announcer.h"
#include "legacy/names.h"
#include "port/ioport.h"
#include "port/port-error.h"
#include "port/port-name.h"
#include "port/port-registry.h"
#include "settings/param.h"
#include "settings/setting-words.h"

namespace {

constexpr unsigned kDecimal = 10;

IOPortRef find_port(const char *object_path, GError **error) {
  const std::string prefix = std::string(kLegacyBasePath) + "/";
  guint64 number = 0;
  IOPortRef port;
  if (g_str_has_prefix(object_path, prefix.c_str()) &&
      g_ascii_string_to_unsigned(object_path + prefix.size(), kDecimal, 0, G_MAXINT, &number,
                                 nullptr)) {
    port = port_registry_find(static_cast<std::uint32_t>(number));
  }
  if (!port) {
    g_set_error_literal(error, io_control_error_quark(), IO_CONTROL_ERROR_NO_PORT, "No such port.");
  }
  return port;
}

bool contains(std::string_view text, std::string_view part) {
  return text.find(part) != std::string_view::npos;
}

// --- Reading ---

GVariant *new_text(const std::string &text) {
  return g_variant_new_take_string(
      g_utf8_make_valid(text.data(), static_cast<gssize>(text.size())));
}

GVariant *new_count(std::uint32_t count) {
  return g_variant_new_int32(static_cast<gint32>(count));
}

GVariant *get_name(const IOPort *port, std::string_view interface) {
  std::optional<std::string> input;
  std::optional<std::string> output;
  io_port_get_names(port, &input, &output);
  const bool of_input = contains(interface, "Input") ||
                        (!contains(interface, "Output") && io_port_direction_input(port));
  return new_text((of_input ? input : output).value_or("<NULL>"));
}

GVariant *get_nbr_of_ports(const IOPort * /*port*/, std::string_view /*interface*/) {
  return new_count(port_registry_count_inputs() + port_registry_count_outputs());
}

GVariant *get_trig(const IOPort *port, std::string_view /*interface*/) {
  return new_text(activelow_word(io_port_get_activelow(port, true)));
}

GVariant *get_active(const IOPort *port, std::string_view /*interface*/) {
  return new_text(activelow_word(io_port_get_activelow(port, false)));
}

GVariant *get_configurable(const IOPort *port, std::string_view /*interface*/) {
  return io_port_is_ioport(port)
             ? g_variant_new_boolean(io_port_get_type(port) == PORT_CONFIGURABLE)
             : nullptr;
}

GVariant *get_direction(const IOPort *port, std::string_view /*interface*/) {
  return io_port_is_ioport(port) ? new_text(direction_word(io_port_direction_input(port)))
                                 : nullptr;
}

GVariant *get_button(const IOPort *port, std::string_view /*interface*/) {
  return new_text(button_word(io_port_get_button(port)));
}

GVariant *get_pulse_time(const IOPort *port, std::string_view /*interface*/) {
  return new_count(io_port_get_pulse_time(port));
}

GVariant *get_mode(const IOPort *port, std::string_view /*interface*/) {
  return new_text(mode_word(io_port_get_mode(port)));
}

GVariant *get_delay_time(const IOPort *port, std::string_view /*interface*/) {
  return g_variant_new_int32(io_port_get_delay_time(port));
}

// --- Writing ---

enum class Outcome { kRefused, kUnchanged, kStore };

struct Request {
  IOPort *port;
  std::string_view interface;
  const char *property;
  GVariant *value;
  GError **error;
};

Outcome refuse(const Request &request, const std::string &message) {
  g_set_error_literal(request.error, G_DBUS_ERROR, G_DBUS_ERROR_INVALID_ARGS, message.c_str());
  return Outcome::kRefused;
}

Outcome refuse_value(const Request &request) {
  return refuse(request, std::string("Incorrect value for ") + request.property);
}

// Unset for bytes that are no text: those would read as an empty one, or go where only UTF-8 may.
std::optional<std::string> text_of(GVariant *value) {
  if (!g_variant_is_of_type(value, G_VARIANT_TYPE_BYTESTRING)) {
    return std::nullopt;
  }
  gsize size = 0;
  const auto *bytes =
      static_cast<const char *>(g_variant_get_fixed_array(value, &size, sizeof(char)));
  if (size == 0 || bytes[size - 1] != '\0' || !g_utf8_validate(bytes, -1, nullptr)) {
    return std::nullopt;
  }
  return bytes;
}

std::optional<std::int32_t> number_of(GVariant *value) {
  return g_variant_is_of_type(value, G_VARIANT_TYPE_INT32)
             ? std::optional(g_variant_get_int32(value))
             : std::nullopt;
}

Outcome set_name(const Request &request) {
  const auto name = text_of(request.value);
  if (!name || !port_name_valid(*name)) {
    return refuse_value(request);
  }
  if (contains(request.interface, "Input")) {
    io_port_set_input_name(request.port, *name);
  } else if (contains(request.interface, "Output")) {
    io_port_set_output_name(request.port, *name);
  } else {
    return refuse_value(request);
  }
  return Outcome::kStore;
}

std::optional<bool> activelow_of(const Request &request) {
  const auto word = text_of(request.value);
  return word ? parse_activelow(*word) : std::nullopt;
}

bool set_activelow(const Request &request, bool activelow) {
  return io_port_set_activelow(request.port, activelow, request.interface.ends_with("Input"));
}

Outcome set_trig(const Request &request) {
  const auto activelow = activelow_of(request);
  if (!activelow) {
    return refuse_value(request);
  }
  set_activelow(request, *activelow);
  return Outcome::kStore;
}

Outcome set_active(const Request &request) {
  const auto activelow = activelow_of(request);
  if (!activelow) {
    return refuse_value(request);
  }
  return set_activelow(request, *activelow) ? Outcome::kStore
                                            : refuse(request, "Setting Active failed");
}

Outcome change_direction(const Request &request, bool input) {
  if (io_port_direction_input(request.port) == input) {
    return Outcome::kUnchanged;
  }
  if (io_port_get_type(request.port) != PORT_CONFIGURABLE) {
    return refuse(request, "Port Direction is not settable");
  }
  if (!io_port_set_direction(request.port, input)) {
    return refuse(request, "Setting Direction failed");
  }
  legacy_announce_counts(legacy_announcer());
  return Outcome::kStore;
}

Outcome set_direction(const Request &request) {
  const std::string word = text_of(request.value).value_or("");
  const auto input = parse_direction(word);
  if (!input) {
    log_warning("Undefined input: %s, for property: %s", word.c_str(), request.property);
    return refuse(request, "Bad Direction '" + word + "'");
  }
  return change_direction(request, *input);
}

// An unknown word changes nothing and is no error.
Outcome set_button(const Request &request) {
  const auto word = text_of(request.value);
  if (!word) {
    return refuse_value(request);
  }
  if (const auto button = parse_button(*word)) {
    io_port_set_button(request.port, *button);
  }
  return Outcome::kStore;
}

Outcome set_pulse_time(const Request &request) {
  const auto time = number_of(request.value);
  if (!time) {
    return refuse_value(request);
  }
  io_port_set_pulse_time(request.port, static_cast<std::uint32_t>(*time));
  return Outcome::kStore;
}

Outcome set_delay_time(const Request &request) {
  const auto time = number_of(request.value);
  if (!time) {
    return refuse_value(request);
  }
  io_port_set_delay_time(request.port, *time);
  return Outcome::kStore;
}

Outcome set_mode(const Request &request) {
  const auto word = text_of(request.value);
  const auto mode = word ? parse_mode(*word) : std::nullopt;
  if (!mode) {
    return refuse_value(request);
  }
  io_port_set_mode(request.port, *mode);
  return Outcome::kStore;
}

struct Property {
  std::string_view name;
  GVariant *(*get)(const IOPort *port, std::string_view interface);
  Outcome (*set)(const Request &request);  // null: can't be written
};

constexpr Property kProperties[] = {
    {"Name", get_name, set_name},
    {"NbrOfIOPorts", get_nbr_of_ports, nullptr},
    {"Trig", get_trig, set_trig},
    {"Active", get_active, set_active},
    {"Configurable", get_configurable, nullptr},
    {"Direction", get_direction, set_direction},
    {"Button", get_button, set_button},
    {"PulseTime", get_pulse_time, set_pulse_time},
    {"Mode", get_mode, set_mode},
    {"DelayTime", get_delay_time, set_delay_time},
};

const Property *find_property(std::string_view name) {
  for (const auto &property : kProperties) {
    if (property.name == name) {
      return &property;
    }
  }
  return nullptr;
}

}  // namespace

GVariant *iocontrol_conf_legacy_dbus_get_property(GDBusConnection * /*connection*/,
                                                  const char * /*sender*/, const char *object_path,
                                                  const char *interface_name,
                                                  const char *property_name, GError **error,
                                                  gpointer /*user_data*/) {
  g_assert(object_path && interface_name && property_name);
  const std::string_view name = property_name;
  if (name == "NbrOfInputs") {
    return new_count(port_registry_count_inputs());
  }
  if (name == "NbrOfOutputs") {
    return new_count(port_registry_count_outputs());
  }
  const IOPortRef port = find_port(object_path, error);
  if (!port) {
    return nullptr;
  }
  const Property *property = find_property(name);
  GVariant *value = property ? property->get(port.get(), interface_name) : nullptr;
  if (!value) {
    g_set_error(error, G_DBUS_ERROR, G_DBUS_ERROR_INVALID_ARGS, "The port has no value for '%s'",
                property_name);
  }
  return value;
}

LegacyWrite legacy_write_property(const LegacyValue &written, std::function<void()> stored,
                                  GError **error) {
  const std::shared_ptr<IOPort> port = find_port(written.object_path, error);
  if (!port) {
    return LegacyWrite::kRefused;
  }
  const Request request = {port.get(), written.interface_name, written.property_name, written.value,
                           error};
  const Property *property = find_property(written.property_name);
  const Outcome outcome = property && property->set
                              ? property->set(request)
                              : refuse(request, std::string("Unsupported write of property '") +
                                                    written.property_name + "'");
  if (outcome == Outcome::kStore) {
    // The setting is stored before the caller is answered.
    io_port_when_idle(port.get(), [port, stored = std::move(stored)] {
      param_request_save(port.get(), kSettingsFile, stored);
    });
    return LegacyWrite::kBeingStored;
  }
  return outcome == Outcome::kRefused ? LegacyWrite::kRefused : LegacyWrite::kDone;
}

gboolean iocontrol_conf_legacy_dbus_set_property(GDBusConnection * /*connection*/,
                                                 const char * /*sender*/, const char *object_path,
                                                 const char *interface_name,
                                                 const char *property_name, GVariant *value,
                                                 GError **error, gpointer /*user_data*/) {
  g_assert(object_path && interface_name && property_name);
  return legacy_write_property({object_path, interface_name, property_name, value}, nullptr,
                               error) != LegacyWrite::kRefused;
}
