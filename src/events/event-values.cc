#include "events/event-values.h"

#include <algorithm>
#include <optional>
#include <string_view>

#include "base/log.h"
#include "port/ioport.h"

namespace {

constexpr std::string_view kPortName = "PORT_NAME";

// 0 when there is no such type.
int key_type(const std::optional<std::string> &word) {
  if (word == "int") {
    return EVENT_KEY_INT;
  }
  if (word == "bool") {
    return EVENT_KEY_BOOL;
  }
  if (word == "double") {
    return EVENT_KEY_DOUBLE;
  }
  return word == "string" ? EVENT_KEY_STRING : 0;
}

bool is_state_word(std::string_view value) {
  return value == "PORT_STATUS" || value == "PORT_ACTIVE" || value == "PORT_SUPERVISED_STATUS";
}

const char *bit(bool value) {
  return value ? "1" : "0";
}

std::string populate_port_status(IOPort *port, int type) {
  g_assert(type != EVENT_KEY_DOUBLE);
  const bool state = io_port_get_state(port);
  return type == EVENT_KEY_STRING ? (state ? "true" : "false") : bit(state);
}

std::string populate_port_active(IOPort *port, int type) {
  g_assert(type != EVENT_KEY_DOUBLE);
  const bool state = io_port_get_state(port);
  return type == EVENT_KEY_STRING ? (state ? "active" : "inactive") : bit(state);
}

std::string populate_port_supervised_status(IOPort *port, int type) {
  g_assert(type != EVENT_KEY_DOUBLE);
  const SupervisedRangeState state = io_port_get_supervised_state(port);
  if (type == EVENT_KEY_BOOL) {
    return bit(state == SUPERVISED_STATE_CLOSED);
  }
  return type == EVENT_KEY_INT ? std::to_string(state) : supervised_range_state2string(state);
}

std::string value_text(IOPort *port, const std::string &value, int type) {
  if (value == "PORT_STATUS") {
    return populate_port_status(port, type);
  }
  if (value == "PORT_ACTIVE") {
    return populate_port_active(port, type);
  }
  if (value == "PORT_SUPERVISED_STATUS") {
    return populate_port_supervised_status(port, type);
  }
  return type == EVENT_KEY_BOOL ? bit(value == "true" || value == "1") : value;
}

bool populate_value(IOPort *port, const IoEventKey &key, Inspectable *inspectable) {
  const int type = key_type(key.type);
  const std::string text = value_text(port, key.value.value_or(""), type);
  const std::string name = key.name.value_or("");
  if (!inspectable_set_value_as_string(inspectable, name.c_str(), type, text.c_str())) {
    log_warning("populating event key value failed - Key: %s Val: %s Type: %s", name.c_str(),
                text.c_str(), key.type->c_str());
    return false;
  }
  return true;
}

std::optional<std::string> nice_name(IOPort *port, const std::optional<std::string> &text) {
  return text == kPortName ? io_port_get_name(port) : text;
}

const char *text_or_null(const std::optional<std::string> &text) {
  return text ? text->c_str() : nullptr;
}

bool populate_nice_names(IOPort *port, const IoEventKey &key, Inspectable *inspectable) {
  if (!key.key_nice_name && !key.value_nice_name) {
    return true;
  }
  const auto key_name = nice_name(port, key.key_nice_name);
  const auto value_name = nice_name(port, key.value_nice_name);
  if (!inspectable_set_nice_names(inspectable, text_or_null(key.name), text_or_null(key_name),
                                  text_or_null(value_name))) {
    const std::string key_text = key_name.value_or("");
    log_warning("Failed to set value nice name. Key: %s KNN: %s VNN: %s", key_text.c_str(),
                key_text.c_str(), value_name.value_or("").c_str());
    return false;
  }
  return true;
}

// Of several keys that are to be the property the last one is. The others are part of the
// declaration all the same, since they are sent.
const IoEventKey *property_of(const std::list<IoEventKey> &keys) {
  const auto found =
      std::find_if(keys.rbegin(), keys.rend(), [](const IoEventKey &key) { return key.property; });
  return found == keys.rend() ? nullptr : &*found;
}

bool populate_sent_values(IOPort *port, const std::list<IoEventKey> &keys,
                          Inspectable *inspectable) {
  return std::all_of(keys.begin(), keys.end(), [&](const IoEventKey &key) {
    return !key.property || populate_value(port, key, inspectable);
  });
}

bool populate_declared_values(IOPort *port, const std::list<IoEventKey> &keys,
                              Inspectable *inspectable, std::string *property_key_out) {
  const IoEventKey *property = property_of(keys);
  for (const auto &key : keys) {
    if (!populate_nice_names(port, key, inspectable)) {
      return false;
    }
    if (&key == property) {
      *property_key_out = key.name.value_or("");
    } else if (!populate_value(port, key, inspectable)) {
      return false;
    }
  }
  return true;
}

const char *invalid_reason(const IoEventKey &key) {
  if (!key.name) {
    return "it has no name";
  }
  const int type = key_type(key.type);
  if (type == 0) {
    return "its type is unknown";
  }
  if (type == EVENT_KEY_DOUBLE && is_state_word(key.value.value_or(""))) {
    return "a state of the port is not a double";
  }
  return nullptr;
}

}  // namespace

bool event_keys_are_valid(const IOPort *port, const std::list<IoEventKey> &keys) {
  for (const auto &key : keys) {
    if (const char *fault = invalid_reason(key)) {
      log_warning("Port %s: event key %s is invalid: %s", io_port_describe(port),
                  key.name.value_or("").c_str(), fault);
      return false;
    }
  }
  return true;
}

bool populate_event_values(IOPort *port, const std::list<IoEventKey> &keys,
                           Inspectable *inspectable, bool sending, std::string *property_key_out) {
  for (const auto &key : keys) {
    g_assert(key_type(key.type) != 0);
  }
  return sending ? populate_sent_values(port, keys, inspectable)
                 : populate_declared_values(port, keys, inspectable, property_key_out);
}
