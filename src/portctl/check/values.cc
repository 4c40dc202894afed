#include "portctl/check/values.h"

#include <glib.h>

#include <algorithm>
#include <cctype>
#include <limits>

using vocabulary::Attribute;
using vocabulary::Type;

namespace {

int base_of(Type type) {
  if (type == Type::kAnyBase) {
    return 0;
  }
  return type == Type::kHexadecimal ? 16 : 10;
}

std::string_view number_hint(Type type) {
  switch (type) {
    case Type::kAnyBase:
      return "write a number, such as 100 or 0x64";
    case Type::kHexadecimal:
      return "write a hexadecimal number, such as 98";
    default:
      return "write a decimal number, such as 17";
  }
}

std::optional<std::string> number_mistake(Type type, const std::string &value) {
  const auto number = parse_number_as(type, value);
  if (!number) {
    const auto read = g_ascii_strtoll(value.c_str(), nullptr, base_of(type));
    return quoted(value) + " is not a number, the daemon reads " + std::to_string(read) + ": " +
           std::string(number_hint(type));
  }
  if (*number < 0 && type != Type::kNumber) {
    return quoted(value) + " is negative: write a number from 0 on";
  }
  if (*number > std::numeric_limits<std::int32_t>::max() ||
      *number < std::numeric_limits<std::int32_t>::min()) {
    return quoted(value) + " is beyond 32 bits: write a smaller number";
  }
  return std::nullopt;
}

std::vector<std::string_view> split(std::string_view words) {
  std::vector<std::string_view> list;
  while (!words.empty()) {
    const auto end = words.find(' ');
    list.push_back(words.substr(0, end));
    words.remove_prefix(end == std::string_view::npos ? words.size() : end + 1);
  }
  return list;
}

std::optional<std::string> word_mistake(std::string_view words, const std::string &value) {
  if (vocabulary::holds_word(words, value)) {
    return std::nullopt;
  }
  std::string all;
  for (const auto word : split(words)) {
    all += (all.empty() ? "" : ", ") + std::string(word);
  }
  const auto best = nearest(value, split(words));
  return quoted(value) + " is not known: write " +
         (best.empty() ? "one of " + all : quoted(best) + " (known are " + all + ")");
}

std::optional<std::string> switch_mistake(const std::string &value, bool strict) {
  const bool known = strict ? value == "true" || value == "false"
                            : g_ascii_strcasecmp(value.c_str(), "true") == 0 ||
                                  g_ascii_strcasecmp(value.c_str(), "false") == 0;
  if (known) {
    return std::nullopt;
  }
  return quoted(value) + R"( is neither true nor false: write "true" or "false")" +
         (strict ? ", in small letters" : "");
}

std::vector<std::string_view> names_of(std::span<const Attribute> attributes) {
  std::vector<std::string_view> names;
  for (const auto &attribute : attributes) {
    names.push_back(attribute.name);
  }
  return names;
}

}  // namespace

std::optional<std::int64_t> parse_number_as(Type type, const std::string &text) {
  const char *begin = text.c_str();
  char *end = nullptr;
  const auto number = g_ascii_strtoll(begin, &end, base_of(type));
  const bool whole =
      end != begin && *end == '\0' && !std::isspace(static_cast<unsigned char>(*begin));
  return whole ? std::optional<std::int64_t>(number) : std::nullopt;
}

std::optional<std::string> value_mistake(const Attribute &attribute, const std::string &value) {
  switch (attribute.type) {
    case Type::kText:
      return attribute.required && value.empty()
                 ? std::optional<std::string>("the value is empty: " +
                                              std::string(attribute.effect))
                 : std::nullopt;
    case Type::kWord:
      return word_mistake(attribute.words, value);
    case Type::kSwitch:
    case Type::kStrictSwitch:
      return switch_mistake(value, attribute.type == Type::kStrictSwitch);
    default:
      return number_mistake(attribute.type, value);
  }
}

void check_attributes(const DocumentElement &element, std::span<const Attribute> attributes,
                      const std::string &owner, Findings &findings) {
  std::vector<std::string_view> meant;
  for (const auto &given : element.attributes) {
    const Attribute *known = vocabulary::find(attributes, given.name);
    if (!known) {
      const auto names = names_of(attributes);
      meant.push_back(nearest(given.name, names));
      findings.error(given.place, owner + " knows no " + quoted(given.name) + ", it is ignored" +
                                      suggestion(given.name, names));
    } else if (const auto mistake = value_mistake(*known, given.value)) {
      findings.error(given.place, given.name + ": " + *mistake);
    }
  }
  for (const auto &attribute : attributes) {
    const bool misspelt = std::find(meant.begin(), meant.end(), attribute.name) != meant.end();
    if (attribute.required && !element.find(attribute.name) && !misspelt) {
      findings.error(element.place, owner + " needs " + std::string(attribute.name) +
                                        "=\"...\": " + std::string(attribute.effect));
    }
  }
}
