// One port's settings, and the group of the settings file that they are kept in.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "base/glib-ptr.h"

struct IOPort;

using SettingValue = std::variant<bool, std::uint64_t, std::string>;
using SettingValues = std::vector<std::pair<const char *, SettingValue>>;

// The settings of a port at one moment, so that the port may change while they are stored.
struct PortSettings {
  std::string group;
  SettingValues values;  // by key, in the order of the file
};

// None, said on standard error, for a port whose identifier can't name a group. Main thread.
std::optional<PortSettings> port_settings_take(IOPort *port);
// Puts them into their group; other keys stay as they are. Any thread.
void port_settings_store(const PortSettings &settings, GKeyFile *file);

// Copies the port's group into the port. False when there is none, or when reading stopped at a key
// that is missing or malformed, which is said on standard error with `path`, that of the file; what
// was read before that key stays. Main thread.
bool port_settings_apply(GKeyFile *file, const std::string &path, IOPort *port);
