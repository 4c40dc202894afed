// What a hardware description and a settings file may say: every element, attribute, backend and
// key with its type, default and effect. Plain data, for the checker, the manual page, the schema
// and the tests. The loader is more lenient than this; nothing here changes what it does.
#pragma once

#include <cstddef>
#include <span>
#include <string_view>

namespace vocabulary {

enum class Type {
  kText,          // anything
  kWord,          // one of `words`
  kSwitch,        // true or false, in any letter case
  kStrictSwitch,  // exactly true, else it counts as false
  kNumber,        // decimal, may be negative
  kUnsigned,      // decimal
  kAnyBase,       // decimal, or hexadecimal after 0x, or octal after 0
  kHexadecimal,   // with or without 0x
};

// In the order in which a reader wants to know.
// NOLINTNEXTLINE(clang-analyzer-optin.performance.Padding)
struct Attribute {
  std::string_view name;
  Type type = Type::kText;
  std::string_view fallback = {};  // what holds without it, in words; empty: see `required`
  std::string_view effect = {};
  std::string_view words = {};  // of kWord, separated by blanks
  bool required = false;        // the element makes no sense without
};

struct Element {
  std::string_view name;
  std::span<const Attribute> attributes;
  std::string_view effect;
  bool any_attribute = false;  // each is a flag of this very name, of the type kSwitch
};

// A section that a port of some type can't do without.
struct Need {
  std::string_view port_type;  // as in port_type; empty: any
  std::string_view section;
};

struct Backend {
  std::string_view name;
  std::string_view port_types;  // that it serves, separated by blanks
  std::string_view effect;
  std::span<const Element> sections;
  std::span<const Need> needs;
  std::string_view example;  // what stands in the port element
  bool any_section = false;  // takes whatever it is told
  bool supervised = false;   // its ranges tell states of a measured line
};

// A key of a port's group in the settings file.
struct Setting {
  std::string_view key;
  Type type;
  std::string_view port_types;  // whose groups have it; empty: those that can be supervised
  std::string_view fallback;
  std::string_view effect = {};
  std::string_view words = {};
};

std::span<const Element> elements();  // all but the sections of backends
std::span<const Backend> backends();
std::span<const Setting> settings();
// Flags of the element `properties` that mean something to the daemon.
std::span<const Attribute> flags();
// Event names that are built in.
std::span<const std::string_view> built_in_events();

template <typename Entry>
const Entry *find(std::span<const Entry> entries, std::string_view name) {
  for (const auto &entry : entries) {
    if (entry.name == name) {
      return &entry;
    }
  }
  return nullptr;
}

// Whether `words`, separated by blanks, hold `word`.
constexpr bool holds_word(std::string_view words, std::string_view word) {
  while (!words.empty()) {
    const auto end = words.find(' ');
    if (words.substr(0, end) == word) {
      return true;
    }
    words.remove_prefix(end == std::string_view::npos ? words.size() : end + 1);
  }
  return false;
}

// The type in words: "true or false", "decimal number" and so on.
std::string_view type_in_words(Type type);

}  // namespace vocabulary
