#include "portctl/json.h"

#include <cmath>
#include <cstdio>

#include "base/glib-ptr.h"
#include "portctl/text.h"

namespace {

std::string escaped(gunichar character) {
  switch (character) {
    case '"':
      return "\\\"";
    case '\\':
      return "\\\\";
    case '\n':
      return "\\n";
    case '\t':
      return "\\t";
    default:
      break;
  }
  char text[8];
  if (is_unsafe(character)) {
    std::snprintf(text, sizeof text, "\\u%04x", character);
    return text;
  }
  return {text, static_cast<std::size_t>(g_unichar_to_utf8(character, text))};
}

std::string json_number(GVariant *value) {
  if (g_variant_is_of_type(value, G_VARIANT_TYPE_DOUBLE)) {
    const double number = g_variant_get_double(value);
    char text[G_ASCII_DTOSTR_BUF_SIZE];
    return std::isfinite(number) ? g_ascii_dtostr(text, sizeof text, number) : "null";
  }
  const GCharPtr text(g_variant_print(value, false));
  std::string_view digits = text.get();
  return digits.starts_with("0x") ? std::to_string(g_variant_get_byte(value)) : std::string(digits);
}

std::string json_dictionary(GVariant *value) {
  JsonObject object;
  for (gsize i = 0; i < g_variant_n_children(value); ++i) {
    const GVariantPtr entry(g_variant_get_child_value(value, i));
    const GVariantPtr key(g_variant_get_child_value(entry.get(), 0));
    const GVariantPtr content(g_variant_get_child_value(entry.get(), 1));
    const bool is_text = g_variant_is_of_type(key.get(), G_VARIANT_TYPE_STRING);
    object.add_raw(
        is_text ? g_variant_get_string(key.get(), nullptr) : json_variant(key.get()).c_str(),
        json_variant(content.get()));
  }
  return object.text();
}

}  // namespace

std::string json_string(std::string_view text) {
  const GCharPtr valid(g_utf8_make_valid(text.data(), static_cast<gssize>(text.size())));
  std::string quoted = "\"";
  for (const char *at = valid.get(); *at; at = g_utf8_next_char(at)) {
    quoted += escaped(g_utf8_get_char(at));
  }
  return quoted + "\"";
}

std::string json_variant(GVariant *value) {
  if (g_variant_is_of_type(value, G_VARIANT_TYPE_VARIANT)) {
    const GVariantPtr inner(g_variant_get_variant(value));
    return json_variant(inner.get());
  }
  if (g_variant_is_of_type(value, G_VARIANT_TYPE_BOOLEAN)) {
    return g_variant_get_boolean(value) ? "true" : "false";
  }
  if (g_variant_is_of_type(value, G_VARIANT_TYPE_STRING)) {
    return json_string(g_variant_get_string(value, nullptr));
  }
  if (g_variant_is_of_type(value, G_VARIANT_TYPE_DICTIONARY)) {
    return json_dictionary(value);
  }
  if (!g_variant_is_container(value)) {
    return json_number(value);
  }
  JsonArray array;
  for (gsize i = 0; i < g_variant_n_children(value); ++i) {
    const GVariantPtr child(g_variant_get_child_value(value, i));
    array.add_raw(json_variant(child.get()));
  }
  return array.text();
}

std::string event_keys_text(GVariant *keys, std::string_view assign, std::string_view separator) {
  std::string text;
  GVariantIter iter;
  const char *key = nullptr;
  GVariant *value = nullptr;
  g_variant_iter_init(&iter, keys);
  while (g_variant_iter_next(&iter, "{&sv}", &key, &value)) {
    const GVariantPtr owned(value);
    if (!std::string_view(key).starts_with("topic")) {
      text.append(text.empty() ? "" : separator).append(key).append(assign);
      text += json_variant(value);
    }
  }
  return text;
}

JsonObject &JsonObject::add_raw(std::string_view key, std::string_view json) {
  members_ += (members_.empty() ? "" : ", ") + json_string(key) + ": " + std::string(json);
  return *this;
}

JsonArray &JsonArray::add_raw(std::string_view json) {
  elements_ += (elements_.empty() ? "" : ", ") + std::string(json);
  return *this;
}
