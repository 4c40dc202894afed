#include "platform/confutils.h"

#include <fcntl.h>
#include <glib/gstdio.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <string_view>

#include "base/glib-ptr.h"
#include "base/unique-fd.h"

namespace {

constexpr mode_t kModeOfNewFile = 0644;

bool fail(GError **error, const char *what, const std::string &path) {
  const int code = errno;
  g_set_error(error, G_FILE_ERROR, g_file_error_from_errno(code), "%s '%s': %s", what, path.c_str(),
              g_strerror(code));
  return false;
}

bool write_all(int fd, std::string_view data) {
  while (!data.empty()) {
    const ssize_t written = write(fd, data.data(), data.size());
    if (written < 0 && errno == EINTR) {
      continue;
    }
    if (written <= 0) {
      return false;
    }
    data.remove_prefix(static_cast<size_t>(written));
  }
  return true;
}

// The service account can't give a file to root: what it writes then stays its own.
bool take_over_owner_and_mode(int fd, const std::string &path) {
  struct stat old {};
  if (stat(path.c_str(), &old) != 0) {
    return fchmod(fd, kModeOfNewFile) == 0;
  }
  if (fchown(fd, old.st_uid, old.st_gid) != 0 && errno != EPERM) {
    return false;
  }
  return fchmod(fd, old.st_mode & ALLPERMS) == 0;
}

bool write_temporary(int fd, const std::string &path, std::string_view data) {
  return take_over_owner_and_mode(fd, path) && write_all(fd, data) && fsync(fd) == 0;
}

// The rename is on storage only when the directory that holds the name is.
bool sync_directory(const std::string &path) {
  const GCharPtr directory(g_path_get_dirname(path.c_str()));
  const UniqueFd fd(open(directory.get(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  return fd && fsync(fd.get()) == 0;
}

// A link is followed, so that the file that it names is replaced and not the link.
std::string real_path(const char *path) {
  const std::unique_ptr<char, GlibDeleter<free>> resolved(realpath(path, nullptr));
  return resolved ? resolved.get() : path;
}

}  // namespace

gboolean confutils_set_file_contents_with_sync(const gchar *path, const gchar *data, gssize length,
                                               GError **error) {
  const std::string target = real_path(path);
  const std::string_view contents(data, length < 0 ? strlen(data) : static_cast<size_t>(length));
  std::string temporary = target + ".XXXXXX";
  const UniqueFd fd(g_mkstemp_full(temporary.data(), O_WRONLY | O_CLOEXEC, S_IRUSR | S_IWUSR));
  if (!fd) {
    return fail(error, "Could not create a file beside", target);
  }
  if (!write_temporary(fd.get(), target, contents)) {
    fail(error, "Could not write", temporary);
    unlink(temporary.c_str());
    return FALSE;
  }
  if (rename(temporary.c_str(), target.c_str()) != 0) {
    fail(error, "Could not replace", target);
    unlink(temporary.c_str());
    return FALSE;
  }
  if (!sync_directory(target)) {
    return fail(error, "Could not sync the directory of", target);
  }
  return TRUE;
}
