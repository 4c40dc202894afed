// Just enough JSON to print what portctl knows. Texts are escaped; what is no UTF-8 is replaced.
#pragma once

#include <glib.h>

#include <cstdint>
#include <string>
#include <string_view>

// A quoted and escaped string.
std::string json_string(std::string_view text);

// Any value that travels on the bus: numbers, booleans, strings, arrays, structures (as arrays),
// and dictionaries (as objects, with keys turned to text).
std::string json_variant(GVariant *value);

// The keys of an event but for its topic, with their values as JSON: "port=3 state=true".
std::string event_keys_text(GVariant *keys, std::string_view assign = "=",
                            std::string_view separator = " ");

class JsonObject {
 public:
  JsonObject &add(std::string_view key, std::string_view text) {
    return add_raw(key, json_string(text));
  }
  JsonObject &add(std::string_view key, const char *text) {
    return add(key, std::string_view(text));
  }
  JsonObject &add(std::string_view key, bool value) {
    return add_raw(key, value ? "true" : "false");
  }
  JsonObject &add(std::string_view key, std::int64_t value) {
    return add_raw(key, std::to_string(value));
  }
  JsonObject &add(std::string_view key, int value) { return add(key, std::int64_t{value}); }
  JsonObject &add(std::string_view key, std::uint32_t value) {
    return add(key, std::int64_t{value});
  }
  // `json` is JSON already.
  JsonObject &add_raw(std::string_view key, std::string_view json);
  std::string text() const { return "{" + members_ + "}"; }

 private:
  std::string members_;
};

class JsonArray {
 public:
  JsonArray &add_raw(std::string_view json);
  std::string text() const { return "[" + elements_ + "]"; }

 private:
  std::string elements_;
};
