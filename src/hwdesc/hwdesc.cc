#include "hwdesc/hwdesc.h"

#include <string_view>
#include <vector>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "hwdesc/hardware-id.h"
#include "port/ioport.h"
#include "port/port-registry.h"
#include "vocabulary/vocabulary.h"

namespace {

// Ports from this number on are given to virtual ones; a document that uses it by hand may collide.
constexpr int kFirstVirtualPort = 6;
constexpr int kDecimal = 10;

struct Attribute {
  std::string_view name;
  const char *value;
};
using Attributes = std::vector<Attribute>;

// What the parser remembers between the tags of one document. The next document starts afresh: one
// that breaks off within a port or a backend must not make tags of another be skipped or handed to
// a backend.
struct Loader {
  bool skip_port = false;                  // until the end tag of the port
  bool in_backend = false;                 // attributes go to the port's backend too
  std::optional<std::string> hardware_id;  // once it is known
  bool has_root = false;                   // the outermost element may have any name
};

std::optional<int> first_virtual_input;

// Whether a document has elements or attributes without effect. The checker tells which.
bool has_unknown_content = false;

bool is_true(const char *text) {
  return g_ascii_strcasecmp(text, "true") == 0;
}

void set_if_boolean(bool &flag, const char *text) {
  if (is_true(text)) {
    flag = true;
  } else if (g_ascii_strcasecmp(text, "false") == 0) {
    flag = false;
  }
}

// Not a number reads as 0; a number beyond 32 bits wraps.
int parse_int(const char *text) {
  return static_cast<int>(static_cast<guint32>(g_ascii_strtoll(text, nullptr, kDecimal)));
}

// --- The hardware filter ---

// Asked for until there is an answer: the service may be coming up beside the daemon.
const std::optional<std::string> &hardware_id(Loader &loader) {
  if (!loader.hardware_id) {
    loader.hardware_id = read_hardware_id("HWID");
  }
  return loader.hardware_id;
}

bool begins_with_any(const std::string &id, const char *prefixes) {
  const GStrvPtr pieces(g_strsplit(prefixes, ":", -1));
  for (char **piece = pieces.get(); *piece; ++piece) {
    if (g_str_has_prefix(id.c_str(), *piece)) {
      return true;
    }
  }
  return false;
}

// A filter that can't be judged does not cost the device a port.
bool fits_hardware(Loader &loader, const char *prefixes) {
  const auto &id = hardware_id(loader);
  if (!id || *prefixes == '\0') {
    log_warning("Could not get the hardware id");
    return true;
  }
  return begins_with_any(*id, prefixes);
}

// --- Elements ---

// Makes the port, in place of an earlier one of the same name. False: it is for other hardware.
bool open_port(Loader &loader, const Attributes &attributes) {
  auto attribute = attributes.begin();
  if (attribute != attributes.end() && attribute->name == "hwid") {
    if (!fits_hardware(loader, attribute->value)) {
      return false;
    }
    ++attribute;
  }
  if (attribute != attributes.end() && attribute->name == "name") {
    port_registry_remove_by_id(attribute->value);
  }
  const IOPortRef port(io_port_new());
  port_registry_add(port.get());
  return true;
}

void apply_port(IOPort *port, const Attribute &attribute) {
  if (attribute.name == "name") {
    io_port_set_id(port, attribute.value);
  } else if (attribute.name == "optional") {
    io_port_set_optional(port, std::string_view(attribute.value) == "true");
  }
}

void apply_port_type(IOPort *port, const Attribute &attribute) {
  if (attribute.name != "type") {
    return;
  }
  const std::string_view type = attribute.value;
  if (type == "io_ctrl") {
    io_port_set_type(port, PORT_CONFIGURABLE);
    return;
  }
  if (type == "input") {
    io_port_set_type(port, PORT_INPUT);
  } else if (type == "output") {
    io_port_set_type(port, PORT_OUTPUT);
  } else {
    log_critical("Unsupported port type %s\n", attribute.value);
  }
  io_port_restore_direction(port, io_port_direction_input(port));
}

void apply_properties(IOPort *port, const Attribute &attribute) {
  io_port_set_flag(port, std::string(attribute.name), attribute.value);
}

void apply_port_no(IOPort *port, const Attribute &attribute) {
  if (attribute.name != "nbr") {
    return;
  }
  // The number that the port had until now is what counts: only giving a second one is odd.
  if (io_port_get_number(port) >= kFirstVirtualPort) {
    log_warning(
        "You have a port with higher number than FIRST_VIRTUAL_PORT this might lead to unexpected "
        "behaviour");
  }
  io_port_set_number(port, parse_int(attribute.value));
}

void apply_param_default_name(IOPort *port, const Attribute &attribute) {
  if (attribute.name == "input" || attribute.name == "output") {
    io_port_restore_name(port, attribute.value, attribute.name == "input");
  }
}

void apply_backend(IOPort *port, const Attribute &attribute) {
  if (attribute.name != "name") {
    return;
  }
  if (const auto kind = io_port_backend_kind(attribute.value)) {
    io_port_set_backend(port, *kind);
  } else {
    log_warning("Port %s: no backend is called %s", io_port_describe(port), attribute.value);
  }
}

void apply_event(IOPort *port, const Attribute &attribute) {
  IoEvent &event = io_port_events(port).front();
  if (attribute.name == "declaration") {
    event.name = attribute.value;
  } else if (attribute.name == "input") {
    set_if_boolean(event.input, attribute.value);
  } else if (attribute.name == "output") {
    set_if_boolean(event.output, attribute.value);
  } else if (attribute.name == "supervised_input") {
    set_if_boolean(event.supervised_input, attribute.value);
  } else if (attribute.name == "declare_only") {
    set_if_boolean(event.declare_only, attribute.value);
  }
}

void apply_keyvalue(IOPort *port, const Attribute &attribute) {
  auto &events = io_port_events(port);
  if (events.empty() || events.front().keys.empty()) {
    return;  // a key before any event; said when the element was opened
  }
  IoEventKey &key = events.front().keys.front();
  if (attribute.name == "key") {
    key.name = attribute.value;
  } else if (attribute.name == "value") {
    key.value = attribute.value;
  } else if (attribute.name == "type") {
    key.type = attribute.value;
  } else if (attribute.name == "key-nice-name") {
    key.key_nice_name = attribute.value;
  } else if (attribute.name == "value-nice-name") {
    key.value_nice_name = attribute.value;
  } else if (attribute.name == "property") {
    set_if_boolean(key.property, attribute.value);
  }
}

void open_event(IOPort *port) {
  io_port_events(port).emplace_front();
}

void open_keyvalue(IOPort *port) {
  auto &events = io_port_events(port);
  if (events.empty()) {
    log_warning("Port %s: a keyvalue element comes before any event", io_port_describe(port));
    return;
  }
  events.front().keys.emplace_front();
}

// Which attributes an element has is in the vocabulary.
struct Element {
  std::string_view name;
  void (*open)(IOPort *port);  // null: nothing is made
  void (*apply)(IOPort *port, const Attribute &attribute);
};

constexpr Element kElements[] = {
    {"port", nullptr, apply_port},
    {"port_type", nullptr, apply_port_type},
    {"properties", nullptr, apply_properties},
    {"port_no", nullptr, apply_port_no},
    {"param_default_name", nullptr, apply_param_default_name},
    {"backend", nullptr, apply_backend},
    {"event", open_event, apply_event},
    {"keyvalue", open_keyvalue, apply_keyvalue},
};

const Element *find_element(std::string_view name) {
  for (const auto &element : kElements) {
    if (element.name == name) {
      return &element;
    }
  }
  return nullptr;
}

// A backend takes any attribute.
bool has_effect(const Element &element, const Attribute &attribute) {
  const auto *known = vocabulary::find(vocabulary::elements(), element.name);
  return element.apply == apply_backend || known->any_attribute ||
         vocabulary::find(known->attributes, attribute.name);
}

void apply_first_virtual_input(const Attributes &attributes) {
  for (const auto &attribute : attributes) {
    if (attribute.name == "nbr") {
      first_virtual_input = parse_int(attribute.value);
    }
  }
}

// What follows the name of a backend, in the same tag already, is for that backend.
bool names_backend(const Element *element, const Attribute &attribute) {
  return element && element->apply == apply_backend && attribute.name == "name";
}

// Hands each attribute to the backend while its part of the document lasts, then to the port.
void apply_element(Loader &loader, const char *name, const Element *element,
                   const Attributes &attributes) {
  const IOPortRef port = port_registry_nth(0);
  if (!port) {
    if (element) {
      log_warning("Element %s comes before any port", name);
    }
    return;
  }
  if (element && element->open) {
    element->open(port.get());
  }
  for (const auto &attribute : attributes) {
    if (loader.in_backend) {
      io_port_set_backend_property(port.get(), name, std::string(attribute.name).c_str(),
                                   attribute.value);
    }
    if (element) {
      element->apply(port.get(), attribute);
      has_unknown_content |= !loader.in_backend && !has_effect(*element, attribute);
    }
    if (names_backend(element, attribute)) {
      loader.in_backend = true;
    }
  }
}

// --- Tags ---

void start_element(GMarkupParseContext * /*context*/, const gchar *name, const gchar **names,
                   const gchar **values, gpointer user_data, GError ** /*error*/) {
  auto &loader = *static_cast<Loader *>(user_data);
  if (loader.skip_port) {
    return;
  }
  Attributes attributes;
  for (; *names; ++names, ++values) {
    attributes.push_back({*names, *values});
  }
  const std::string_view element = name;
  const bool known = vocabulary::find(vocabulary::elements(), element) != nullptr;
  has_unknown_content |= !known && !loader.in_backend && loader.has_root;
  loader.has_root = true;
  if (element == "port" && !open_port(loader, attributes)) {
    loader.skip_port = true;
    return;
  }
  if (element == "first_virtual_input") {
    apply_first_virtual_input(attributes);
  }
  apply_element(loader, name, find_element(element), attributes);
  if (element == "backend") {
    loader.in_backend = true;
  }
}

void end_element(GMarkupParseContext * /*context*/, const gchar *name, gpointer user_data,
                 GError ** /*error*/) {
  auto &loader = *static_cast<Loader *>(user_data);
  const std::string_view element = name;
  if (element == "backend") {
    loader.in_backend = false;
  } else if (element == "port") {
    loader.skip_port = false;
  }
}

constexpr GMarkupParser kParser = {start_element, end_element, nullptr, nullptr, nullptr};

// What the parser says, without its own note of the place.
std::string reason_of(const Error &error) {
  const std::string_view message = error.message();
  const auto place_end = message.starts_with("Error on line ") ? message.find(": ") : message.npos;
  return std::string(place_end == message.npos ? message : message.substr(place_end + 2));
}

// Ending the parse detects a truncated document, whose missing ports would be hard to notice. An
// empty file is fine.
bool parse(const std::string &path, std::string_view text) {
  Loader loader;
  const GMarkupContextPtr context(
      g_markup_parse_context_new(&kParser, static_cast<GMarkupParseFlags>(0), &loader, nullptr));
  Error error;
  const bool whole = g_markup_parse_context_parse(context.get(), text.data(),
                                                  static_cast<gssize>(text.size()), error.out()) &&
                     g_markup_parse_context_end_parse(context.get(), error.out());
  if (whole || error.matches(G_MARKUP_ERROR, G_MARKUP_ERROR_EMPTY)) {
    return true;
  }
  int line = 0;
  int column = 0;
  g_markup_parse_context_get_position(context.get(), &line, &column);
  log_critical("Couldn't parse markup file (%s)\n", path.c_str());
  log_warning("%s:%d:%d: %s", path.c_str(), line, column, reason_of(error).c_str());
  return false;
}

}  // namespace

bool hwdesc_load_file(const std::string &path) {
  char *contents = nullptr;
  gsize length = 0;
  // Reading a pipe or a device could go on for ever.
  if (!g_file_test(path.c_str(), G_FILE_TEST_IS_REGULAR) ||
      !g_file_get_contents(path.c_str(), &contents, &length, nullptr)) {
    log_critical("Couldn't load XML (%s)\n", path.c_str());
    return false;
  }
  const GCharPtr text(contents);
  const bool parsed = parse(path, {contents, length});
  has_unknown_content |= !parsed;
  return parsed;
}

void hwdesc_load_directory(const std::string &path) {
  if (!g_file_test(path.c_str(), G_FILE_TEST_IS_DIR)) {
    return;
  }
  const GDirPtr directory(g_dir_open(path.c_str(), 0, nullptr));
  if (!directory) {
    return;
  }
  while (const char *name = g_dir_read_name(directory.get())) {
    if (!hwdesc_load_file(path + "/" + name)) {
      return;
    }
  }
}

void hwdesc_finish() {
  if (has_unknown_content) {
    log_warning("Parts of the hardware description have no effect: \"portctl check\" lists them");
  }
  release_hardware_id_service();
}

std::optional<int> hwdesc_first_virtual_input() {
  return first_virtual_input;
}
