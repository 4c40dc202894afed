// Files in folders that lesser accounts may write: opened once, without waiting for anybody, and
// judged by what was opened. Any thread.
#pragma once

#include <glib.h>
#include <sys/stat.h>

#include <cstddef>
#include <optional>
#include <string>

#include "base/unique-fd.h"

struct RegularFile {
  UniqueFd fd;  // for reading; none when the file could not be opened
  struct stat status {};
};

// Opens a regular file; a link is not followed. None, with errno and `error` (domain G_FILE_ERROR;
// code G_FILE_ERROR_NOENT only when there is no such file), for everything else.
RegularFile open_regular_file(const std::string &path, GError **error);

// The same, but a link at the end of the path is followed where root or the caller owns it: whoever
// owns a link chooses the file. `path` becomes the path that the links led to, whether or not there
// is a file, and empty when a link may not be followed.
RegularFile open_trusted_file(std::string &path, GError **error);

// The contents from the descriptor's position on; the file may grow meanwhile. None, with `error`
// (domain G_FILE_ERROR), when it can't be read or holds more than `limit` bytes.
inline constexpr std::size_t kNoSizeLimit = static_cast<std::size_t>(-1);
std::optional<std::string> read_file(const RegularFile &file, std::size_t limit, GError **error);
