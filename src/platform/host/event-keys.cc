#include "platform/host/event-keys.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <string_view>

namespace {

std::optional<EventValue> int_from_text(const gchar *text) {
  gint64 number = 0;
  if (!g_ascii_string_to_signed(text, 10, G_MININT32, G_MAXINT32, &number, nullptr)) {
    return std::nullopt;
  }
  return EventValue{.type = EVENT_KEY_INT, .integer = static_cast<gint32>(number)};
}

std::optional<EventValue> bool_from_text(std::string_view text) {
  if (text == "1" || text == "true") {
    return EventValue{.type = EVENT_KEY_BOOL, .boolean = true};
  }
  if (text == "0" || text == "false") {
    return EventValue{.type = EVENT_KEY_BOOL, .boolean = false};
  }
  return std::nullopt;
}

// The C library would also take hexadecimal, "inf" and blanks in front.
std::optional<EventValue> double_from_text(const gchar *text) {
  if (*text == '\0' || text[strspn(text, "0123456789+-.eE")] != '\0') {
    return std::nullopt;
  }
  gchar *end = nullptr;
  const double number = g_ascii_strtod(text, &end);
  if (*end != '\0' || !std::isfinite(number)) {
    return std::nullopt;
  }
  return EventValue{.type = EVENT_KEY_DOUBLE, .real = number};
}

}  // namespace

bool is_text(const gchar *text) {
  return text && g_utf8_validate(text, -1, nullptr);
}

bool is_name(const gchar *text) {
  return is_text(text) && *text != '\0';
}

bool is_key_type(gint type) {
  return type >= EVENT_KEY_INT && type <= EVENT_KEY_STRING;
}

std::optional<EventValue> value_from_text(gint type, const gchar *text) {
  if (!is_text(text)) {
    return std::nullopt;
  }
  switch (type) {
    case EVENT_KEY_INT:
      return int_from_text(text);
    case EVENT_KEY_BOOL:
      return bool_from_text(text);
    case EVENT_KEY_DOUBLE:
      return double_from_text(text);
    case EVENT_KEY_STRING:
      return EventValue{.type = EVENT_KEY_STRING, .text = text};
    default:
      return std::nullopt;
  }
}

Inspectable empty_inspectable(const Inspectable &declared) {
  Inspectable empty;
  for (const auto &key : declared.keys) {
    EventKey &copy = empty.keys.emplace_back();
    copy.name = key.name;
    copy.type = key.type;
  }
  return empty;
}

bool merge_values(Inspectable &into, const Inspectable &values) {
  const bool agree =
      std::equal(values.keys.begin(), values.keys.end(), into.keys.begin(), into.keys.end(),
                 [](const EventKey &from, const EventKey &to) {
                   return !from.value || to.type == kTypeUnknown || to.type == from.value->type;
                 });
  if (!agree) {
    return false;
  }
  auto to = into.keys.begin();
  for (const auto &from : values.keys) {
    if (from.value) {
      to->type = from.value->type;
      to->value = from.value;
    }
    ++to;
  }
  return true;
}

Inspectable query_property(const EventDeclaration &declaration) {
  Inspectable values = empty_inspectable(declaration.inspectable);
  if (declaration.callback) {
    declaration.callback(&values, declaration.user_data);
  }
  return values;
}
