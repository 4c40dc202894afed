// The parameters of an older parameter store, where each port has the groups IOPort.I<n>,
// IOPort.I<n>.Input and IOPort.I<n>.Output.
#include "settings/param-legacy.h"

#include <cstdint>
#include <cstdio>
#include <limits>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "base/service-account.h"
#include "base/trusted-file.h"
#include "platform/confutils.h"
#include "port/ioport.h"
#include "port/port-error.h"
#include "port/port-name.h"
#include "port/port-registry.h"
#include "settings/setting-words.h"

namespace {

constexpr std::string_view kPortPrefix = "IOPort.I";
constexpr std::string_view kInput = "Input";
constexpr std::string_view kOutput = "Output";
constexpr int kDecimal = 10;
constexpr std::size_t kMostBytes = 1'048'576;

// Whether to go on after a key.
enum class Next { kKey, kGroup, kStop };

// One group of the file while its keys are read.
struct Group {
  const char *name;
  GError **error;
};

struct Entry {
  const char *key;
  std::string_view value;  // raw, as it stands in the file
};

// Only the first report reaches the caller; the others are not to get lost.
Next report(const Group &group, const std::string &message) {
  if (group.error && !*group.error) {
    g_set_error_literal(group.error, io_control_error_quark(), IO_CONTROL_ERROR_GENERIC,
                        message.c_str());
  } else {
    log_warning("%s in group %s", message.c_str(), group.name);
  }
  return Next::kGroup;
}

Next report_unreadable(const Group &group, const char *what) {
  return report(group, "Failed to read " + std::string(what) + " parameter");
}

// The digits that the text begins with, if any. A number too large to be held reads as the largest
// one, which is too large for everything that it is read for.
std::optional<std::uint64_t> leading_number(std::string_view text) {
  if (text.empty() || !g_ascii_isdigit(text.front())) {
    return std::nullopt;
  }
  return g_ascii_strtoull(std::string(text).c_str(), nullptr, kDecimal);
}

std::optional<std::uint64_t> port_number(std::string_view group) {
  return group.size() < kPortPrefix.size() ? std::nullopt
                                           : leading_number(group.substr(kPortPrefix.size()));
}

IOPortRef find_port(std::uint64_t number) {
  constexpr std::uint64_t highest = std::numeric_limits<int>::max();
  return number > highest ? nullptr : port_registry_find(static_cast<std::uint32_t>(number));
}

// Names come from firmware that did not check them, and go where only UTF-8 is allowed.
std::string readable_name(std::string_view raw) {
  const GCharPtr valid(g_utf8_make_valid(raw.data(), static_cast<gssize>(raw.size())));
  const std::string_view name = valid.get();
  if (name.empty() || name.front() != '"') {
    return std::string(name);
  }
  const char *last = g_utf8_prev_char(name.data() + name.size());
  return last == name.data() ? std::string() : std::string(name.data() + 1, last);
}

void import_name(const Group &group, const Entry &entry, IOPort *port, bool input) {
  const std::string name = readable_name(entry.value);
  if (!port_name_valid(name)) {
    log_warning("%s in group %s is too long for a name of port %s and is ignored", entry.key,
                group.name, io_port_describe(port));
  } else if (input) {
    io_port_set_input_name(port, name);
  } else {
    io_port_set_output_name(port, name);
  }
}

// A number that 32 bits can't hold is no time that the older store could have meant.
std::optional<std::uint32_t> import_time(const Group &group, const Entry &entry) {
  const auto number = leading_number(entry.value);
  if (number && *number > std::numeric_limits<std::uint32_t>::max()) {
    log_warning("%s in group %s is too large", entry.key, group.name);
    return std::nullopt;
  }
  return number ? std::optional(static_cast<std::uint32_t>(*number)) : std::nullopt;
}

Next import_sense(const Group &group, const Entry &entry, IOPort *port, bool input) {
  const auto activelow = parse_activelow(entry.value);
  if (!activelow) {
    return report_unreadable(group, entry.key);
  }
  io_port_set_activelow(port, *activelow, input);
  return Next::kKey;
}

Next import_input(const Group &group, const Entry &entry, std::uint64_t number) {
  const IOPortRef port = find_port(number);
  if (!port) {
    std::fprintf(stderr, "No port %" G_GUINT64_FORMAT " to write parhand data to.\n", number);
    return Next::kStop;
  }
  const std::string_view key = entry.key;
  if (key == "Name") {
    import_name(group, entry, port.get(), true);
    return Next::kKey;
  }
  return key == "Trig" ? import_sense(group, entry, port.get(), true)
                       : report_unreadable(group, entry.key);
}

// The keys that can't be refused. False: it is another key.
bool import_output_behaviour(const Group &group, const Entry &entry, IOPort *port) {
  const std::string_view key = entry.key;
  if (key == "Name") {
    import_name(group, entry, port, false);
  } else if (key == "Button") {
    io_port_set_button(port, parse_button(entry.value).value_or(io_port_get_button(port)));
  } else if (key == "PulseTime") {
    io_port_set_pulse_time(port, import_time(group, entry).value_or(io_port_get_pulse_time(port)));
  } else if (key == "DelayTime") {
    if (const auto time = import_time(group, entry)) {
      io_port_set_delay_time(port, static_cast<std::int32_t>(*time));
    }
  } else if (key == "Mode") {
    io_port_set_mode(port, parse_mode(entry.value).value_or(PORT_MODE_MONOSTABLE));
  } else {
    return false;
  }
  return true;
}

Next import_output(const Group &group, const Entry &entry, std::uint64_t number) {
  const IOPortRef port = find_port(number);
  if (!port) {
    log_warning("No port for the parhand data of group %s", group.name);
    return Next::kGroup;
  }
  if (import_output_behaviour(group, entry, port.get())) {
    return Next::kKey;
  }
  return std::string_view(entry.key) == "Active" ? import_sense(group, entry, port.get(), false)
                                                 : report_unreadable(group, "Output");
}

// The backend gets the direction when the port is set up.
Next import_port(const Group &group, const Entry &entry, std::uint64_t number) {
  const IOPortRef port = find_port(number);
  if (!port || io_port_get_type(port.get()) != PORT_CONFIGURABLE ||
      std::string_view(entry.key) != "Direction") {
    return Next::kKey;
  }
  const auto input = parse_direction(entry.value);
  if (!input) {
    return report_unreadable(group, entry.key);
  }
  io_port_restore_direction(port.get(), *input);
  return Next::kKey;
}

using ImportEntry = Next (*)(const Group &group, const Entry &entry, std::uint64_t number);

// What reads the keys of a group, or null for a group of no interest. The store kept values for
// inputs and outputs as a whole too, which no port has.
ImportEntry importer_of(std::string_view group) {
  if (group == kInput || group == kOutput) {
    return nullptr;
  }
  if (group.ends_with(kInput)) {
    return import_input;
  }
  if (group.ends_with(kOutput)) {
    return import_output;
  }
  return group.starts_with(kPortPrefix) ? import_port : nullptr;
}

Next import_entry(const Group &group, const Entry &entry) {
  const ImportEntry import = importer_of(group.name);
  if (!import) {
    return Next::kKey;
  }
  const auto number = port_number(group.name);
  return number ? import(group, entry, *number) : report(group, "Failed to parse port number");
}

Next import_group(GKeyFile *file, const Group &group) {
  Error error;
  const GStrvPtr keys(g_key_file_get_keys(file, group.name, nullptr, error.out()));
  if (!keys) {
    log_warning("Error parsing parhand file %s", error.message());
    return Next::kStop;
  }
  Next next = Next::kKey;
  for (char **key = keys.get(); *key && next == Next::kKey; ++key) {
    const GCharPtr value(g_key_file_get_value(file, group.name, *key, nullptr));
    next = import_entry(group, {*key, value ? value.get() : ""});
  }
  return next;
}

// All of the file or nothing.
GKeyFilePtr load(const char *path, GKeyFileFlags flags) {
  GKeyFilePtr file(g_key_file_new());
  return g_key_file_load_from_file(file.get(), path, flags, nullptr) ? std::move(file) : nullptr;
}

void copy_group(GKeyFile *from, GKeyFile *into, const char *group) {
  const GStrvPtr keys(g_key_file_get_keys(from, group, nullptr, nullptr));
  for (char **key = keys.get(); key && *key; ++key) {
    const GCharPtr value(g_key_file_get_value(from, group, *key, nullptr));
    g_key_file_set_value(into, group, *key, value ? value.get() : "");
  }
}

// Fixed: the operation and the numbers in the messages.
bool store(GKeyFile *file, const char *path) {
  gsize length = 0;
  const GCharPtr text(g_key_file_to_data(file, &length, nullptr));
  Error error;
  const bool stored = confutils_set_file_contents_with_sync(
      path, text.get(), static_cast<gssize>(length), error.out());
  if (error) {
    log_user("%s@%d: failed to save key file: %s, error: %s\n", "param_upgrade", 793, path,
             error.message());
  }
  if (!stored) {
    log_user("%s@%d: save operation failed! [%s]\n", "param_upgrade", 799, path);
  }
  return stored;
}

}  // namespace

std::optional<std::string> param_read_parhand(const char *path) {
  Error error;
  const RegularFile file = open_regular_file(path, error.out());
  if (error.matches(G_FILE_ERROR, G_FILE_ERROR_NOENT)) {
    return std::nullopt;
  }
  if (file.fd && !is_own_account(file.status.st_uid)) {
    log_warning("Ignored %s: it belongs to uid %u", path,
                static_cast<unsigned>(file.status.st_uid));
    return std::nullopt;
  }
  auto text = file.fd ? read_file(file, kMostBytes, error.out()) : std::nullopt;
  if (!text) {
    log_warning("Ignored %s: %s", path, error.message());
  }
  return text;
}

void param_import_parhand_text(const std::string &text, GError **error) {
  const GKeyFilePtr key_file(g_key_file_new());
  if (!g_key_file_load_from_data(key_file.get(), text.data(), text.size(), G_KEY_FILE_KEEP_COMMENTS,
                                 nullptr)) {
    return;
  }
  const GStrvPtr groups(g_key_file_get_groups(key_file.get(), nullptr));
  for (char **name = groups.get(); *name; ++name) {
    if (import_group(key_file.get(), {*name, error}) == Next::kStop) {
      return;
    }
  }
}

void param_import_parhand(const char *file, GError **error) {
  if (const auto text = param_read_parhand(file)) {
    param_import_parhand_text(*text, error);
  } else {
    log_warning("Unable to read from parhand file");
  }
}

bool param_upgrade(const char *input, const char *output, GError **error) {
  constexpr auto keep_all =
      static_cast<GKeyFileFlags>(G_KEY_FILE_KEEP_COMMENTS | G_KEY_FILE_KEEP_TRANSLATIONS);
  const GKeyFilePtr from = load(input, keep_all);
  if (!from) {
    g_set_error(error, io_control_error_quark(), IO_CONTROL_ERROR_GENERIC,
                "Unable to open input file: %s", input);
    return false;
  }
  const GKeyFilePtr into = load(output, keep_all);
  if (!into) {
    // Fixed: the message names the input file here too.
    g_set_error(error, io_control_error_quark(), IO_CONTROL_ERROR_GENERIC,
                "Unable to open output file: %s", input);
    return false;
  }
  const GStrvPtr groups(g_key_file_get_groups(from.get(), nullptr));
  for (char **group = groups.get(); *group; ++group) {
    copy_group(from.get(), into.get(), *group);
  }
  return store(into.get(), output);
}
