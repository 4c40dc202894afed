#include "daemon/privileges.h"

#include <grp.h>
#include <pwd.h>
#include <unistd.h>

#include <cstdio>

namespace {
constexpr const char *kAccount = "pcd";
}

void drop_privileges() {
  const passwd *user = getpwnam(kAccount);
  if (!user) {
    std::fprintf(stderr, "Couldn't get uid for user \"%s\".\n", kAccount);
    return;
  }
  const group *account_group = getgrnam(kAccount);
  if (!account_group) {
    std::fprintf(stderr, "Couldn't get gid for group \"%s\".\n", kAccount);
    return;
  }
  const gid_t gid = account_group->gr_gid;
  if (setgid(gid) != 0) {
    std::fprintf(stderr, "Failed setting gid to %d: %m\n", static_cast<int>(gid));
    return;
  }
  if (initgroups(kAccount, gid) != 0) {
    std::fprintf(stderr, "Unable to run initgroups() with username: %s, gid: %d: %m\n", kAccount,
                 static_cast<int>(gid));
    return;
  }
  if (setuid(user->pw_uid) != 0) {
    std::fprintf(stderr, "Failed setting uid to %d: %m\n", static_cast<int>(user->pw_uid));
  }
}
