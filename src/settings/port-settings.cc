#include "settings/port-settings.h"

#include <algorithm>
#include <cstdio>
#include <string_view>

#include "port/ioport.h"
#include "settings/setting-words.h"

namespace {

// GLib drops a form feed at the front of a value, and unlike for other white space it has no escape
// for it.
constexpr char kFormFeed = '\f';
constexpr std::string_view kFormFeedEscape = "\\f";

bool has_input_side(const IOPort *port) {
  return io_port_get_type(port) != PORT_OUTPUT;
}

bool has_output_side(const IOPort *port) {
  return io_port_get_type(port) != PORT_INPUT;
}

// The port's group, or none, said on standard error, when it can't have one: GLib takes anything
// for a group name but brackets, control characters and nothing at all.
const char *group_of(IOPort *port) {
  const auto &id = io_port_get_id(port);
  if (!id) {
    std::fputs("Port does not have a name!\n", stderr);
    return nullptr;
  }
  const bool usable = !id->empty() && std::none_of(id->begin(), id->end(), [](char c) {
    return c == '[' || c == ']' || g_ascii_iscntrl(c);
  });
  if (!usable) {
    std::fprintf(stderr, "Port name \"%s\" can't name a group of settings\n", id->c_str());
    return nullptr;
  }
  return id->c_str();
}

// --- Reading a group into a port ---

// One port's group. Every step says whether to go on: it does not after a key that is missing or
// malformed, which leaves an error, nor after an unknown word for the button, which leaves none.
class GroupReader {
 public:
  GroupReader(GKeyFile *file, IOPort *port, const char *group)
      : file_(file), ioport_(port), group_(group) {}

  void read() {
    (void)(read_direction() && read_input_side() && read_output_side() && read_supervision());
  }
  const Error &error() const { return error_; }
  // Where reading stopped when there is an error.
  const char *key() const { return key_; }

 private:
  bool get_boolean(const char *key, bool *value) {
    key_ = key;
    *value = g_key_file_get_boolean(file_, group_, key, error_.out());
    return !error_;
  }
  bool get_uint64(const char *key, std::uint64_t *value) {
    key_ = key;
    *value = g_key_file_get_uint64(file_, group_, key, error_.out());
    return !error_;
  }
  // GLib gives what it made of a malformed value beside the error.
  std::optional<std::string> get_string(const char *key) {
    key_ = key;
    const GCharPtr text(g_key_file_get_string(file_, group_, key, error_.out()));
    return text && !error_ ? std::optional<std::string>(text.get()) : std::nullopt;
  }
  std::optional<std::string> get_name(const char *key);

  bool read_direction();
  bool read_side(bool input);
  bool read_input_side();
  bool read_output_side();
  bool read_button();
  bool read_times_and_mode();
  bool read_ranges(SupervisedRanges *ranges);
  bool read_supervision();

  GKeyFile *file_;
  IOPort *ioport_;
  const char *group_;
  const char *key_ = "";
  Error error_;
};

std::optional<std::string> GroupReader::get_name(const char *key) {
  const GCharPtr raw(g_key_file_get_value(file_, group_, key, nullptr));
  if (!raw || !std::string_view(raw.get()).starts_with(kFormFeedEscape)) {
    return get_string(key);
  }
  // In a file of its own, which is never stored, the rest is read like any other value.
  const GKeyFilePtr rest(g_key_file_new());
  g_key_file_set_value(rest.get(), group_, key, raw.get() + kFormFeedEscape.size());
  key_ = key;
  const GCharPtr text(g_key_file_get_string(rest.get(), group_, key, error_.out()));
  return text && !error_ ? std::optional<std::string>(kFormFeed + std::string(text.get()))
                         : std::nullopt;
}

bool GroupReader::read_direction() {
  if (io_port_get_type(ioport_) != PORT_CONFIGURABLE) {
    return true;
  }
  bool input = false;
  if (!get_boolean("input", &input)) {
    return false;
  }
  io_port_restore_direction(ioport_, input);
  return true;
}

bool GroupReader::read_side(bool input) {
  const char *side = input ? "input" : "output";
  io_port_restore_name(ioport_, std::nullopt, input);
  const auto name = get_name(input ? "input_name" : "output_name");
  if (!name) {
    std::printf("No %s name for port %s:%d\n", side, group_, io_port_get_number(ioport_));
    return false;
  }
  io_port_restore_name(ioport_, *name, input);
  bool activelow = false;
  if (!get_boolean(input ? "input_activelow" : "output_activelow", &activelow)) {
    return false;
  }
  io_port_restore_activelow(ioport_, activelow, input);
  return true;
}

bool GroupReader::read_input_side() {
  return !has_input_side(ioport_) || read_side(true);
}

bool GroupReader::read_output_side() {
  return !has_output_side(ioport_) || (read_side(false) && read_button() && read_times_and_mode());
}

bool GroupReader::read_button() {
  const auto word = get_string("button_type");
  const auto button = word ? parse_button(*word) : std::nullopt;
  if (!button) {
    return false;
  }
  io_port_set_button(ioport_, *button);
  return true;
}

bool GroupReader::read_times_and_mode() {
  std::uint64_t time = 0;
  if (!get_uint64("pulse_time", &time)) {
    return false;
  }
  io_port_set_pulse_time(ioport_, static_cast<std::uint32_t>(time));
  const auto mode = get_string("port_mode");
  if (!mode) {
    return false;
  }
  io_port_set_mode(ioport_, parse_mode(*mode).value_or(PORT_MODE_MONOSTABLE));
  if (!get_uint64("delay_time", &time)) {
    return false;
  }
  io_port_set_delay_time(ioport_, static_cast<std::int32_t>(time));
  return true;
}

bool GroupReader::read_ranges(SupervisedRanges *ranges) {
  const auto text = get_string("supervised_input_ranges");
  if (!text) {
    return false;
  }
  const GVariantPtr variant(
      g_variant_parse(G_VARIANT_TYPE("a(suu)"), text->c_str(), nullptr, nullptr, error_.out()));
  if (!variant) {
    return false;
  }
  *ranges = supervised_ranges_from_variant(variant.get());
  return true;
}

// The flag is put in place as it is: the backend learns of it when it is set up.
bool GroupReader::read_supervision() {
  if (!io_port_is_supervisable(ioport_)) {
    return true;
  }
  SupervisedRanges ranges;
  bool supervised = false;
  if (!read_ranges(&ranges) ||
      !io_port_set_supervised_ranges(ioport_, std::move(ranges), error_.out()) ||
      !get_boolean("supervised_input", &supervised)) {
    return false;
  }
  io_port_restore_supervised(ioport_, supervised);
  return true;
}

// --- Taking a port's settings ---

void take_side(IOPort *port, bool input, SettingValues &values) {
  std::optional<std::string> input_name;
  std::optional<std::string> output_name;
  io_port_get_names(port, &input_name, &output_name);
  values.emplace_back(input ? "input_name" : "output_name",
                      (input ? input_name : output_name).value_or(""));
  values.emplace_back(input ? "input_activelow" : "output_activelow",
                      io_port_get_activelow(port, input));
}

void take_output_behaviour(IOPort *port, SettingValues &values) {
  const std::string button = button_word(io_port_get_button(port));
  if (!button.empty()) {
    values.emplace_back("button_type", button);
  }
  values.emplace_back("pulse_time", std::uint64_t{io_port_get_pulse_time(port)});
  values.emplace_back("port_mode", std::string(mode_word(io_port_get_mode(port))));
  // Fixed: a negative time is stored as 64 bits without a sign.
  values.emplace_back("delay_time",
                      static_cast<std::uint64_t>(std::int64_t{io_port_get_delay_time(port)}));
}

void take_supervision(IOPort *port, SettingValues &values) {
  SupervisedRanges ranges;
  io_port_get_supervised_ranges(port, &ranges);
  const GVariantPtr variant(g_variant_ref_sink(supervised_ranges_to_variant(ranges)));
  const GCharPtr text(g_variant_print(variant.get(), TRUE));
  values.emplace_back("supervised_input_ranges", std::string(text.get()));
  values.emplace_back("supervised_input", io_port_is_supervised(port));
}

// --- Storing them in a group ---

void store_string(GKeyFile *file, const char *group, const char *key, const std::string &value) {
  g_key_file_set_string(file, group, key, value.c_str());
  if (value.starts_with(kFormFeed)) {
    const GCharPtr raw(g_key_file_get_value(file, group, key, nullptr));
    const std::string escaped = std::string(kFormFeedEscape) + (raw.get() + 1);
    g_key_file_set_value(file, group, key, escaped.c_str());
  }
}

struct StoreValue {
  GKeyFile *file;
  const char *group;
  const char *key;

  void operator()(bool value) const { g_key_file_set_boolean(file, group, key, value); }
  void operator()(std::uint64_t value) const { g_key_file_set_uint64(file, group, key, value); }
  void operator()(const std::string &value) const { store_string(file, group, key, value); }
};

}  // namespace

bool port_settings_apply(GKeyFile *file, const std::string &path, IOPort *port) {
  const char *group = group_of(port);
  if (!group || !g_key_file_has_group(file, group)) {
    return false;
  }
  GroupReader reader(file, port, group);
  reader.read();
  if (reader.error()) {
    std::fprintf(stderr, "Error parsing param file: %s\n", reader.error().message());
    std::fprintf(stderr, "In file %s, group %s (port %d), key %s\n", path.c_str(), group,
                 io_port_get_number(port), reader.key());
  }
  return !reader.error();
}

std::optional<PortSettings> port_settings_take(IOPort *port) {
  const char *group = group_of(port);
  if (!group) {
    return std::nullopt;
  }
  PortSettings settings{group, {}};
  if (io_port_get_type(port) == PORT_CONFIGURABLE) {
    settings.values.emplace_back("input", io_port_direction_input(port));
  }
  if (has_input_side(port)) {
    take_side(port, true, settings.values);
  }
  if (has_output_side(port)) {
    take_side(port, false, settings.values);
    take_output_behaviour(port, settings.values);
  }
  if (io_port_is_supervisable(port)) {
    take_supervision(port, settings.values);
  }
  return settings;
}

void port_settings_store(const PortSettings &settings, GKeyFile *file) {
  for (const auto &[key, value] : settings.values) {
    std::visit(StoreValue{file, settings.group.c_str(), key}, value);
  }
}
