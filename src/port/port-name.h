// Which names a port may have. Any thread.
#pragma once

#include <glib.h>

#include <cstddef>
#include <string_view>

// Enough for any text that people read. Names go into D-Bus messages, which have a limit, and into
// the settings file, which every save writes whole.
inline constexpr std::size_t kPortNameMaxBytes = 4096;

// Whether the text can be the name of a port: valid UTF-8 that is not too long. It may be empty.
inline bool port_name_valid(std::string_view name) {
  return name.size() <= kPortNameMaxBytes &&
         g_utf8_validate_len(name.data(), name.size(), nullptr) != FALSE;
}
