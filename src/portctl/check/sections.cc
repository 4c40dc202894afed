// The part of the checker for what stands in a backend.
#include <algorithm>

#include "portctl/check/description.h"
#include "portctl/check/values.h"

using vocabulary::Backend;
using vocabulary::Element;

namespace {

constexpr std::int64_t kLevels = 65536;

std::vector<std::string_view> section_names(const Backend &backend) {
  std::vector<std::string_view> names;
  for (const auto &section : backend.sections) {
    names.push_back(section.name);
  }
  return names;
}

bool is_pin(const Element &section) {
  return vocabulary::find(section.attributes, "pin") != nullptr;
}

}  // namespace

void DescriptionChecker::check_section(const DocumentElement &element) {
  if (ports_.empty() || !ports_.back().backend || ports_.back().backend->any_section) {
    return;  // said where the backend was named
  }
  const Backend &backend = *ports_.back().backend;
  const std::string owner = "the backend " + std::string(backend.name);
  const Element *section = vocabulary::find(backend.sections, element.name);
  if (open_.back() != "backend") {
    findings_.error(element.place, "<" + element.name + "> must stand right inside <backend>");
    return;
  }
  if (!section) {
    const auto names = section_names(backend);
    findings_.error(element.place,
                    owner + " ignores <" + element.name + ">" +
                        (names.empty() ? ": it takes nothing" : suggestion(element.name, names)));
    const auto meant = nearest(element.name, names);
    ports_.back().sections.try_emplace(std::string(meant), element.place);
    return;
  }
  ports_.back().sections.try_emplace(element.name, element.place);
  if (backend.name == "spiadc" && element.name == "range") {
    check_spiadc_range(element);
    return;
  }
  check_attributes(element, section->attributes, owner + " in <" + element.name + ">", findings_);
  if (is_pin(*section)) {
    check_pin(element);
  } else if (element.name == "range") {
    check_range(element);
  } else if (const auto *timeout = element.find("timeout");
             timeout && parse_number_as(vocabulary::Type::kAnyBase, timeout->value) == 0) {
    findings_.error(timeout->place,
                    "0 makes the daemon look all the time: write milliseconds, such as 500");
  } else if (const auto *mode = element.find("mode"); mode) {
    ports_.back().always_measured = mode->value == "adc";
    if (!ports_.back().ranges.empty()) {
      findings_.error(mode->place, "mode must stand before the first <range>");
    }
  }
}

void DescriptionChecker::check_pin(const DocumentElement &element) {
  const bool spelt =
      std::any_of(element.attributes.begin(), element.attributes.end(),
                  [](const auto &attribute) { return attribute.name != "inverted"; });
  if (!element.find("pin") && !element.find("alias")) {
    findings_.error(element.place,
                    std::string("<") + element.name +
                        "> names no line, the daemon takes GPIO 0: write alias=\"...\" or pin" +
                        (spelt ? "=\"...\" (it knows no other word for it)" : "=\"...\""));
  }
}

// Any attribute begins a range.
void DescriptionChecker::check_spiadc_range(const DocumentElement &element) {
  if (element.attributes.empty()) {
    findings_.error(element.place,
                    "a <range> without an attribute begins no range: write <range nbr=\"1\"/>");
  } else if (element.attributes.size() > 1) {
    findings_.error(element.attributes[1].place,
                    "each attribute begins a range: write one, and the limits in an <input> that "
                    "follows, as active_min and active_max");
  } else if (element.attributes[0].name != "nbr") {
    findings_.warning(element.attributes[0].place,
                      "the value of " + quoted(element.attributes[0].name) +
                          " has no effect: limits are active_min and active_max of the <input> "
                          "that follows");
  }
}

void DescriptionChecker::check_range(const DocumentElement &element) {
  const auto *state = element.find("state");
  const auto *lower = element.find("lower");
  const auto *upper = element.find("upper");
  if (!state || !lower || !upper) {
    return;  // said already
  }
  if (!(state < lower && lower < upper)) {
    findings_.error(element.place,
                    "write state, lower, upper in this order: upper completes the range, with what "
                    "was read before it, and what follows counts for the next one");
  }
  const auto low = parse_number_as(vocabulary::Type::kUnsigned, lower->value);
  const auto high = parse_number_as(vocabulary::Type::kUnsigned, upper->value);
  if (!low || !high) {
    return;
  }
  if (*low >= *high) {
    findings_.error(lower->place, "lower must be below upper, this range is not taken");
  }
  if (*high >= kLevels) {
    findings_.error(upper->place, "levels are below 65536, this range is not taken");
  }
  for (const auto &other : ports_.back().ranges) {
    if (other.state == state->value) {
      findings_.error(state->place, "the range in line " + std::to_string(other.place.line) +
                                        " is for " + quoted(other.state) +
                                        " too: this one replaces it");
    } else if (*low <= other.upper && other.lower <= *high) {
      findings_.error(element.place, "the range overlaps that of " + quoted(other.state) +
                                         " in line " + std::to_string(other.place.line) +
                                         ": levels in both count as " + quoted(state->value));
    }
  }
  ports_.back().ranges.push_back({state->value, *low, *high, element.place});
}
