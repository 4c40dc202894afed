#include "platform/confutils.h"

#include <fcntl.h>
#include <glib/gstdio.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <map>
#include <mutex>
#include <string>
#include <string_view>

#include "base/glib-ptr.h"
#include "base/trusted-file.h"
#include "base/unique-fd.h"

namespace {

constexpr mode_t kModeOfNewFile = 0644;

bool fail(GError **error, const char *what, const std::string &path) {
  const int code = errno;
  g_set_error(error, G_FILE_ERROR, g_file_error_from_errno(code), "%s '%s': %s", what, path.c_str(),
              g_strerror(code));
  return false;
}

// --- What is on storage ---

bool is_before(const timespec &one, const timespec &other) {
  return one.tv_sec != other.tv_sec ? one.tv_sec < other.tv_sec : one.tv_nsec < other.tv_nsec;
}

timespec time_by(clockid_t clock) {
  timespec time{};
  clock_gettime(clock, &time);
  return time;
}

// Times of files are those of the last tick, or finer, so a file of this run is never older.
const timespec kProcessStart = time_by(CLOCK_REALTIME_COARSE);

// The file of a path as this process left it. One that somebody else replaced or wrote to since is
// another.
struct Version {
  dev_t device;
  ino_t inode;
  off_t size;
  timespec changed;

  explicit Version(const struct stat &status)
      : device(status.st_dev),
        inode(status.st_ino),
        size(status.st_size),
        changed(status.st_mtim) {}
  bool operator==(const Version &other) const {
    return device == other.device && inode == other.inode && size == other.size &&
           !is_before(changed, other.changed) && !is_before(other.changed, changed);
  }
};

// Never destroyed: a thread may still store a file while the process ends.
struct SyncedFiles {
  std::mutex lock;
  std::map<std::string, Version> versions;
};

SyncedFiles &synced_files() {
  static auto *const files = new SyncedFiles;
  return *files;
}

void mark_synced(const std::string &path, const struct stat &status) {
  SyncedFiles &files = synced_files();
  const std::lock_guard lock(files.lock);
  files.versions.insert_or_assign(path, Version(status));
}

bool is_marked_synced(const std::string &path, const struct stat &status) {
  SyncedFiles &files = synced_files();
  const std::lock_guard lock(files.lock);
  const auto found = files.versions.find(path);
  return found != files.versions.end() && found->second == Version(status);
}

// A device without a clock of its own starts in the past, where its files are from the future.
bool is_of_this_run(const timespec &time) {
  return !is_before(time, kProcessStart) && !is_before(time_by(CLOCK_REALTIME), time);
}

// A file from before the start of the process is taken to be on storage. From then on it is known
// by more than its times.
bool is_synced(const std::string &path, const struct stat &status) {
  if (is_marked_synced(path, status)) {
    return true;
  }
  if (is_of_this_run(status.st_mtim) || is_of_this_run(status.st_ctim)) {
    return false;
  }
  mark_synced(path, status);
  return true;
}

bool is_stored(const std::string &path, const RegularFile &file, std::string_view contents) {
  if (!file.fd || static_cast<std::size_t>(file.status.st_size) != contents.size() ||
      !is_synced(path, file.status)) {
    return false;
  }
  Error unreadable;
  return read_file(file, contents.size(), unreadable.out()) == contents;
}

// --- Storing ---

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
bool copy_owner_and_mode(int fd, const struct stat &old) {
  if (fchown(fd, old.st_uid, old.st_gid) != 0 && errno != EPERM) {
    return false;
  }
  return fchmod(fd, old.st_mode & ALLPERMS) == 0;
}

// `old`: what is to be replaced.
bool write_temporary(int fd, const struct stat *old, std::string_view data) {
  const bool prepared = old ? copy_owner_and_mode(fd, *old) : fchmod(fd, kModeOfNewFile) == 0;
  return prepared && write_all(fd, data) && fsync(fd) == 0;
}

// The rename is on storage only when the directory that holds the name is.
bool sync_directory(const std::string &path) {
  const GCharPtr directory(g_path_get_dirname(path.c_str()));
  const UniqueFd fd(open(directory.get(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  return fd && fsync(fd.get()) == 0;
}

bool replace(const std::string &target, const struct stat *old, std::string_view contents,
             GError **error) {
  std::string temporary = target + CONFUTILS_TEMPORARY_SUFFIX "XXXXXX";
  const UniqueFd fd(g_mkstemp_full(temporary.data(), O_WRONLY | O_CLOEXEC, S_IRUSR | S_IWUSR));
  if (!fd) {
    return fail(error, "Could not create a file beside", target);
  }
  if (!write_temporary(fd.get(), old, contents)) {
    fail(error, "Could not write", temporary);
    unlink(temporary.c_str());
    return false;
  }
  if (rename(temporary.c_str(), target.c_str()) != 0) {
    fail(error, "Could not replace", target);
    unlink(temporary.c_str());
    return false;
  }
  if (!sync_directory(target)) {
    return fail(error, "Could not sync the directory of", target);
  }
  struct stat status {};
  if (fstat(fd.get(), &status) == 0) {
    mark_synced(target, status);
  }
  return true;
}

}  // namespace

gboolean confutils_set_file_contents_with_sync(const gchar *path, const gchar *data, gssize length,
                                               GError **error) {
  const std::string_view contents(data, length < 0 ? strlen(data) : static_cast<size_t>(length));
  // A link is followed, so that the file that it names is replaced and not the link.
  std::string target = path;
  Error reason;
  RegularFile file = open_trusted_file(target, reason.out());
  if (target.empty()) {
    g_propagate_error(error, g_error_copy(reason.get()));
    return FALSE;
  }
  if (is_stored(target, file, contents)) {
    return TRUE;
  }
  const bool exists = file.fd || lstat(target.c_str(), &file.status) == 0;
  return replace(target, exists ? &file.status : nullptr, contents, error);
}
