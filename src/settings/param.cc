#include "settings/param.h"

#include <grp.h>
#include <pwd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <mutex>
#include <optional>
#include <utility>
#include <vector>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "platform/confutils.h"
#include "port/ioport.h"
#include "port/port-registry.h"
#include "settings/setting-words.h"

namespace {

constexpr const char *kServiceAccount = "pcd";

std::mutex settings_lock;
GKeyFilePtr key_file;  // guarded by settings_lock; none between two operations in normal service

bool has_input_side(const IOPort *ioport) {
  return io_port_get_type(ioport) != PORT_OUTPUT;
}

bool has_output_side(const IOPort *ioport) {
  return io_port_get_type(ioport) != PORT_INPUT;
}

// --- Reading a group into a port ---

// One port's group. Every step says whether to go on: it does not after a key that is missing or
// malformed, which leaves an error, nor after an unknown word for the button, which leaves none.
class GroupReader {
 public:
  GroupReader(IOPort *ioport, const char *group) : ioport_(ioport), group_(group) {}

  void read() {
    (void)(read_direction() && read_input_side() && read_output_side() && read_supervision());
  }
  const Error &error() const { return error_; }

 private:
  bool get_boolean(const char *key, bool *value) {
    *value = g_key_file_get_boolean(key_file.get(), group_, key, error_.out());
    return !error_;
  }
  bool get_uint64(const char *key, std::uint64_t *value) {
    *value = g_key_file_get_uint64(key_file.get(), group_, key, error_.out());
    return !error_;
  }
  GCharPtr get_string(const char *key) {
    return GCharPtr(g_key_file_get_string(key_file.get(), group_, key, error_.out()));
  }

  bool read_direction();
  bool read_side(bool input);
  bool read_input_side();
  bool read_output_side();
  bool read_button();
  bool read_times_and_mode();
  bool read_ranges(SupervisedRanges *ranges);
  bool read_supervision();

  IOPort *ioport_;
  const char *group_;
  Error error_;
};

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
  const GCharPtr name = get_string(input ? "input_name" : "output_name");
  if (!name) {
    std::printf("No %s name for port %s:%d\n", side, group_, io_port_get_number(ioport_));
    return false;
  }
  io_port_restore_name(ioport_, name.get(), input);
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
  const GCharPtr word = get_string("button_type");
  if (!word) {
    return false;
  }
  const auto button = parse_button(word.get());
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
  const GCharPtr mode = get_string("port_mode");
  if (!mode) {
    return false;
  }
  io_port_set_mode(ioport_, parse_mode(mode.get()).value_or(PORT_MODE_MONOSTABLE));
  if (!get_uint64("delay_time", &time)) {
    return false;
  }
  io_port_set_delay_time(ioport_, static_cast<std::int32_t>(time));
  return true;
}

bool GroupReader::read_ranges(SupervisedRanges *ranges) {
  const GCharPtr text = get_string("supervised_input_ranges");
  if (!text) {
    return false;
  }
  const GVariantPtr variant(
      g_variant_parse(G_VARIANT_TYPE("a(suu)"), text.get(), nullptr, nullptr, error_.out()));
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

// --- Writing a port into its group ---

void set_string(const char *group, const char *key, const std::string &value) {
  g_key_file_set_string(key_file.get(), group, key, value.c_str());
}

void write_side(IOPort *ioport, const char *group, bool input) {
  std::optional<std::string> input_name;
  std::optional<std::string> output_name;
  io_port_get_names(ioport, &input_name, &output_name);
  set_string(group, input ? "input_name" : "output_name",
             (input ? input_name : output_name).value_or(""));
  g_key_file_set_boolean(key_file.get(), group, input ? "input_activelow" : "output_activelow",
                         io_port_get_activelow(ioport, input));
}

void write_output_behaviour(IOPort *ioport, const char *group) {
  const std::string button = button_word(io_port_get_button(ioport));
  if (!button.empty()) {
    set_string(group, "button_type", button);
  }
  g_key_file_set_uint64(key_file.get(), group, "pulse_time", io_port_get_pulse_time(ioport));
  set_string(group, "port_mode", mode_word(io_port_get_mode(ioport)));
  // A negative time becomes a very large number: the file has always been read back that way.
  g_key_file_set_uint64(key_file.get(), group, "delay_time",
                        static_cast<std::uint64_t>(std::int64_t{io_port_get_delay_time(ioport)}));
}

void write_supervision(IOPort *ioport, const char *group) {
  SupervisedRanges ranges;
  io_port_get_supervised_ranges(ioport, &ranges);
  const GVariantPtr variant(g_variant_ref_sink(supervised_ranges_to_variant(ranges)));
  const GCharPtr text(g_variant_print(variant.get(), TRUE));
  set_string(group, "supervised_input_ranges", text.get());
  g_key_file_set_boolean(key_file.get(), group, "supervised_input", io_port_is_supervised(ioport));
}

void write_group(IOPort *ioport, const char *group) {
  if (io_port_get_type(ioport) == PORT_CONFIGURABLE) {
    g_key_file_set_boolean(key_file.get(), group, "input", io_port_direction_input(ioport));
  }
  if (has_input_side(ioport)) {
    write_side(ioport, group, true);
  }
  if (has_output_side(ioport)) {
    write_side(ioport, group, false);
    write_output_behaviour(ioport, group);
  }
  if (io_port_is_supervisable(ioport)) {
    write_supervision(ioport, group);
  }
}

// The port's group, or none, said on standard error, when it can't have one: GLib takes anything
// for a group name but brackets, control characters and nothing at all.
const char *group_of(IOPort *ioport) {
  const auto &id = io_port_get_id(ioport);
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

// --- The operations, with the lock held ---

bool read_configuration(const std::string &file) {
  key_file.reset(g_key_file_new());
  if (!g_file_test(file.c_str(), G_FILE_TEST_EXISTS)) {
    return true;
  }
  // Translations are kept too: a key of another's in a language of its own is not ours to lose.
  constexpr auto keep_all =
      static_cast<GKeyFileFlags>(G_KEY_FILE_KEEP_COMMENTS | G_KEY_FILE_KEEP_TRANSLATIONS);
  Error error;
  if (!g_key_file_load_from_file(key_file.get(), file.c_str(), keep_all, error.out())) {
    std::fprintf(stderr, "Could not read key file: %s\n", error.message());
    key_file.reset();
    return false;
  }
  return true;
}

bool write_configuration(const std::string &file) {
  gsize length = 0;
  const GCharPtr text(g_key_file_to_data(key_file.get(), &length, nullptr));
  Error error;
  confutils_set_file_contents_with_sync(file.c_str(), text.get(), static_cast<gssize>(length),
                                        error.out());
  if (error) {
    std::fprintf(stderr, "Failed to store key file %s: %s\n", file.c_str(), error.message());
  }
  return !error;
}

void set_conf_vals(IOPort *ioport) {
  if (const char *group = group_of(ioport)) {
    write_group(ioport, group);
  }
}

// Brings the file into memory, unless it is there, for the time of `change`, and writes it back.
template <typename Change>
void change_and_write(const std::string &file, Change change) {
  const bool held = key_file != nullptr;
  if (!held && !read_configuration(file)) {
    g_return_if_fail_warning(G_LOG_DOMAIN, "param_save_for_port",
                             "param_read_configuration (file)");
    return;
  }
  change();
  write_configuration(file);
  if (!held) {
    key_file.reset();
  }
}

}  // namespace

bool param_read_configuration(const std::string &file) {
  const std::lock_guard lock(settings_lock);
  return read_configuration(file);
}

bool param_write_configuration(const std::string &file) {
  const std::lock_guard lock(settings_lock);
  g_return_val_if_fail(key_file != NULL, false);
  return write_configuration(file);
}

void param_free_configuration() {
  const std::lock_guard lock(settings_lock);
  key_file.reset();
}

bool param_get_conf_vals(IOPort *ioport) {
  const std::lock_guard lock(settings_lock);
  g_return_val_if_fail(key_file != NULL, false);
  const char *group = group_of(ioport);
  if (!group || !g_key_file_has_group(key_file.get(), group)) {
    return false;
  }
  GroupReader reader(ioport, group);
  reader.read();
  if (reader.error()) {
    std::fprintf(stderr, "Error parsing param file: %s\n", reader.error().message());
  }
  return !reader.error();
}

void param_set_conf_vals(IOPort *ioport) {
  const std::lock_guard lock(settings_lock);
  g_return_if_fail(key_file != NULL);
  set_conf_vals(ioport);
}

void param_save_for_port(IOPort *ioport, const std::string &file) {
  const std::lock_guard lock(settings_lock);
  change_and_write(file, [&] { set_conf_vals(ioport); });
}

void param_save_all(const std::string &file) {
  std::vector<IOPortRef> ports;
  for (std::uint32_t number = 0; number < port_registry_count(); ++number) {
    if (IOPortRef ioport = port_registry_find(number)) {
      ports.push_back(std::move(ioport));
    }
  }
  if (ports.empty()) {
    return;
  }
  const std::lock_guard lock(settings_lock);
  change_and_write(file, [&] {
    for (const auto &ioport : ports) {
      set_conf_vals(ioport.get());
    }
  });
}

void param_chown_to_service_user(const std::string &file) {
  const passwd *user = getpwnam(kServiceAccount);
  if (!user) {
    log_warning("Failed to get uid");
    return;
  }
  const group *service_group = getgrnam(kServiceAccount);
  if (!service_group) {
    log_warning("Failed to get gid");
    return;
  }
  if (chown(file.c_str(), user->pw_uid, service_group->gr_gid) != 0) {
    log_warning("chown failed on file '%s': (%d) %s", file.c_str(), errno, g_strerror(errno));
  }
}
