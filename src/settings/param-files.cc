// Who the settings file belongs to, and what lies beside it.
#include <fcntl.h>
#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <string>
#include <string_view>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "base/service-account.h"
#include "base/trusted-file.h"
#include "platform/confutils.h"
#include "settings/param.h"

namespace {

constexpr std::size_t kRandomLetters = 6;

// False with errno.
bool change_owner(std::string path, uid_t uid, gid_t gid) {
  const RegularFile file = open_trusted_file(path, nullptr);
  if (!file.fd) {
    return false;
  }
  // What has another name too may be somebody else's file.
  if (file.status.st_nlink != 1) {
    errno = EMLINK;
    return false;
  }
  // A file that is the account's already keeps the time of its last change.
  return (file.status.st_uid == uid && file.status.st_gid == gid) ||
         fchown(file.fd.get(), uid, gid) == 0;
}

// The name of a temporary file for the file `base`.
bool is_temporary_name(std::string_view name, const std::string &base) {
  const std::string beginning = base + CONFUTILS_TEMPORARY_SUFFIX;
  return name.starts_with(beginning) && name.size() == beginning.size() + kRandomLetters &&
         std::all_of(name.begin() + static_cast<std::ptrdiff_t>(beginning.size()), name.end(),
                     [](char c) { return g_ascii_isalnum(c); });
}

void remove_if_own(const std::string &path) {
  struct stat status {};
  if (lstat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode) && status.st_nlink == 1 &&
      is_own_account(status.st_uid)) {
    log_info("Removing %s, left by an interrupted save", path.c_str());
    unlink(path.c_str());
  }
}

}  // namespace

void param_chown_to_service_user(const std::string &file) {
  const passwd *user = getpwnam(kServiceAccount);
  if (!user) {
    log_warning("Failed to get uid");
    return;
  }
  const uid_t uid = user->pw_uid;
  const group *service_group = getgrnam(kServiceAccount);
  if (!service_group) {
    log_warning("Failed to get gid");
    return;
  }
  if (!change_owner(file, uid, service_group->gr_gid)) {
    log_warning("chown failed on file '%s': (%d) %s", file.c_str(), errno, g_strerror(errno));
  }
}

void param_remove_unfinished(const std::string &file) {
  std::string path = file;
  (void)open_trusted_file(path, nullptr);
  const GCharPtr folder(g_path_get_dirname(path.c_str()));
  const GCharPtr base(g_path_get_basename(path.c_str()));
  const GDirPtr entries(path.empty() ? nullptr : g_dir_open(folder.get(), 0, nullptr));
  while (const char *name = entries ? g_dir_read_name(entries.get()) : nullptr) {
    if (is_temporary_name(name, base.get())) {
      remove_if_own(std::string(folder.get()) + '/' + name);
    }
  }
}
