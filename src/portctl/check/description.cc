#include "portctl/check/description.h"

#include <glib.h>

#include <algorithm>

#include "portctl/check/values.h"

using vocabulary::Element;

namespace {

std::vector<std::string_view> element_names() {
  std::vector<std::string_view> names;
  for (const auto &element : vocabulary::elements()) {
    names.push_back(element.name);
  }
  return names;
}

std::string tag(std::string_view name) {
  return "<" + std::string(name) + ">";
}

// Where an element has its place; empty: anywhere but in a port.
std::string_view parent_of(std::string_view name) {
  if (name == "port" || name == "first_virtual_input") {
    return "";
  }
  return name == "keyvalue" ? "event" : "port";
}

std::optional<std::int64_t> number_of(const DocumentElement &element, std::string_view key,
                                      vocabulary::Type type) {
  const auto *attribute = element.find(key);
  return attribute ? parse_number_as(type, attribute->value) : std::nullopt;
}

}  // namespace

void DescriptionChecker::read(const std::string &file, const std::string &text) {
  first_in_file_ = ports_.size();
  open_.clear();
  read_document(file, text, *this, findings_);
}

bool DescriptionChecker::inside(std::string_view name) const {
  return std::find(open_.begin(), open_.end(), name) != open_.end();
}

void DescriptionChecker::begin(const DocumentElement &element) {
  if (inside("backend")) {
    check_section(element);
    open_.push_back(element.name);
    return;
  }
  const auto names = element_names();
  const bool known = vocabulary::find(vocabulary::elements(), element.name) != nullptr;
  std::string meant = element.name;
  const bool outermost = open_.empty();
  if (!known) {
    // The outermost element may have any name.
    meant = outermost ? "" : nearest(element.name, names);
    if (outermost && g_ascii_strcasecmp(element.name.c_str(), "port") == 0) {
      meant = "port";
    }
    if (!outermost || !meant.empty()) {
      findings_.error(element.place, tag(element.name) + " is not known, it is ignored" +
                                         suggestion(element.name, names));
    }
  }
  open_.push_back(meant);
  if (vocabulary::find(vocabulary::elements(), open_.back())) {
    check_place(element, meant);
    apply(element, meant);
  }
}

void DescriptionChecker::end() {
  if (!open_.empty()) {
    open_.pop_back();
  }
}

void DescriptionChecker::text(const Place &place) {
  const bool in_number = !open_.empty() && open_.back() == "port_no";
  findings_.error(place, std::string("text between tags is ignored: write ") +
                             (in_number ? "<port_no nbr=\"...\"/>"
                                        : "values as attributes, and remarks in <!-- -->"));
}

void DescriptionChecker::check_place(const DocumentElement &element, const std::string &name) {
  const auto parent = parent_of(name);
  const std::string around = open_.size() > 1 ? open_[open_.size() - 2] : "";
  if (parent.empty() && inside("port") && !(name == "port" && open_.size() == 1) &&
      !around.empty()) {
    findings_.error(element.place,
                    tag(element.name) + " stands inside " + tag(around) + ": close that first");
  } else if (!parent.empty() && around != parent) {
    findings_.error(element.place, tag(element.name) + " must stand inside " + tag(parent) +
                                       ": the daemon takes it for the " +
                                       (parent == "event" ? "event" : "port") + " before it");
  }
}

void DescriptionChecker::apply(const DocumentElement &element, const std::string &name) {
  const Element &known = *vocabulary::find(vocabulary::elements(), name);
  const bool for_backend =
      name == "backend" && element.find("name") && element.find("name")->value == "check";
  if (!known.any_attribute && !for_backend) {
    check_attributes(element, known.attributes, tag(name), findings_);
  }
  if (name == "port") {
    begin_port(element);
  } else if (name == "first_virtual_input") {
    has_first_virtual_input_ = true;
  } else if (ports_.empty()) {
    return;
  } else if (name == "port_type") {
    apply_type(element);
  } else if (name == "port_no") {
    apply_number(element);
  } else if (name == "properties") {
    apply_flags(element);
  } else if (name == "param_default_name") {
    ports_.back().input_named |= element.find("input") != nullptr;
    ports_.back().output_named |= element.find("output") != nullptr;
  } else if (name == "backend") {
    apply_backend(element);
  } else if (name == "event") {
    check_event(element);
  } else if (name == "keyvalue") {
    check_keyvalue(element);
  }
}

// --- Ports ---

void DescriptionChecker::begin_port(const DocumentElement &element) {
  check_port_order(element);
  replace_earlier(element);
  DescribedPort port;
  port.place = element.place;
  port.by_hardware = element.find("hwid") != nullptr;
  if (const auto *name = element.find("name")) {
    port.id = name->value;
  }
  ports_.push_back(std::move(port));
}

void DescriptionChecker::check_port_order(const DocumentElement &element) {
  const auto &attributes = element.attributes;
  std::size_t next = 0;
  for (std::size_t i = 0; i < attributes.size(); ++i) {
    const auto &attribute = attributes[i];
    if (attribute.name == "hwid" && i != 0) {
      findings_.error(attribute.place,
                      "hwid must stand first: here it is ignored, and the port exists everywhere");
    } else if (attribute.name == "hwid") {
      next = 1;
      if (attribute.value.empty()) {
        findings_.warning(attribute.place,
                          "an empty hwid excludes nothing: leave it out, or name the hardware");
      }
    } else if (attribute.name == "name" && i != next) {
      findings_.error(attribute.place,
                      "name must stand first, or right after hwid: here the port does not take "
                      "the place of an earlier one of this name");
    }
  }
}

// As the daemon does, which takes the earlier one out.
void DescriptionChecker::replace_earlier(const DocumentElement &element) {
  const auto *name = element.find("name");
  if (!name) {
    return;
  }
  const auto earlier = std::find_if(ports_.begin(), ports_.end(), [&](const DescribedPort &port) {
    return port.id == name->value;
  });
  if (earlier == ports_.end()) {
    return;
  }
  const auto index = static_cast<std::size_t>(earlier - ports_.begin());
  const bool variants = earlier->by_hardware && element.find("hwid");
  if (index >= first_in_file_ && !variants) {
    findings_.error(name->place, "the name " + quoted(name->value) +
                                     " is taken by the port in line " +
                                     std::to_string(earlier->place.line) +
                                     ", which this one replaces: give it another name");
  }
  if (!variants) {
    if (index < first_in_file_) {
      --first_in_file_;
    }
    ports_.erase(earlier);
  }
}

void DescriptionChecker::apply_type(const DocumentElement &element) {
  DescribedPort &port = ports_.back();
  if (port.type_place) {
    findings_.error(element.place, "the port has a <port_type> in line " +
                                       std::to_string(port.type_place->line) +
                                       " already: keep one of them");
  }
  port.type_place = element.place;
  if (const auto *type = element.find("type")) {
    port.type = type->value;
  }
}

void DescriptionChecker::apply_number(const DocumentElement &element) {
  DescribedPort &port = ports_.back();
  if (port.number_place) {
    findings_.error(element.place, "the port has a <port_no> in line " +
                                       std::to_string(port.number_place->line) +
                                       " already: keep one of them");
  }
  const auto *attribute = element.find("nbr");
  port.number_place = attribute ? attribute->place : element.place;
  port.number = number_of(element, "nbr", vocabulary::Type::kUnsigned);
}

void DescriptionChecker::apply_flags(const DocumentElement &element) {
  std::vector<std::string_view> names;
  for (const auto &flag : vocabulary::flags()) {
    names.push_back(flag.name);
  }
  for (const auto &attribute : element.attributes) {
    const auto *flag = vocabulary::find(vocabulary::flags(), attribute.name);
    const auto near = flag ? std::string_view() : nearest(attribute.name, names);
    if (!near.empty()) {
      findings_.error(attribute.place, "the flag " + quoted(attribute.name) +
                                           " is unknown to the daemon; did you mean " +
                                           quoted(near) + "?");
    }
    constexpr vocabulary::Attribute any_flag = {.name = "flag", .type = vocabulary::Type::kSwitch};
    if (const auto mistake = value_mistake(flag ? *flag : any_flag, attribute.value)) {
      findings_.error(attribute.place, attribute.name + ": " + *mistake);
    }
    // What is misspelt need not be missed too.
    const bool meant = flag || !near.empty();
    ports_.back().has_flag |= meant && attribute.name != "hidden";
    ports_.back().port |=
        attribute.name == "ioport" && g_ascii_strcasecmp(attribute.value.c_str(), "true") == 0;
  }
}

void DescriptionChecker::apply_backend(const DocumentElement &element) {
  DescribedPort &port = ports_.back();
  if (port.backend_place) {
    findings_.error(element.place, "the port has a <backend> in line " +
                                       std::to_string(port.backend_place->line) +
                                       " already: keep one of them");
  }
  port.backend_place = element.place;
  if (const auto *name = element.find("name")) {
    port.backend = vocabulary::find(vocabulary::backends(), name->value);
  }
}

// --- Events ---

void DescriptionChecker::check_event(const DocumentElement &element) {
  ports_.back().has_event = true;
  const auto *declaration = element.find("declaration");
  event_ = declaration ? declaration->value : "";
  const auto built_in = vocabulary::built_in_events();
  const std::vector<std::string_view> names(built_in.begin(), built_in.end());
  if (declaration && std::find(names.begin(), names.end(), event_) == names.end()) {
    const auto near = nearest(event_, names);
    // Types of the event system look alike, so only what differs in a letter or two is a slip.
    if (!near.empty() && near.size() + 2 > event_.size() && event_.size() + 2 > near.size()) {
      findings_.error(declaration->place, "no event is called " + quoted(event_) +
                                              "; did you mean " + quoted(near) + "?");
    }
  }
}

void DescriptionChecker::check_keyvalue(const DocumentElement &element) {
  const auto built_in = vocabulary::built_in_events();
  if (std::find(built_in.begin(), built_in.end(), event_) != built_in.end()) {
    findings_.warning(element.place, "the event " + event_ +
                                         " brings its own keys, this one is ignored: leave it out");
  }
  const auto *type = element.find("type");
  const auto *value = element.find("value");
  if (type && value && type->value == "double" && value->value.starts_with("PORT_")) {
    findings_.error(value->place, value->value +
                                      " can't be a double: give the key the type "
                                      "\"int\", \"bool\" or \"string\"");
  }
  const bool is_switch = value && (value->value == "true" || value->value == "false" ||
                                   value->value == "1" || value->value == "0");
  if (type && value && type->value == "bool" && !is_switch && !value->value.starts_with("PORT_")) {
    findings_.error(value->place,
                    quoted(value->value) + R"( counts as false: write "true" or "false")");
  }
}
