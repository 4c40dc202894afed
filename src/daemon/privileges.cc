#include "daemon/privileges.h"

#include <grp.h>
#include <pwd.h>
#include <unistd.h>

#include <cstdio>

#include "base/service-account.h"

void drop_privileges() {
  const passwd *user = getpwnam(kServiceAccount);
  if (!user) {
    std::fprintf(stderr, "Couldn't get uid for user \"%s\".\n", kServiceAccount);
    return;
  }
  const group *account_group = getgrnam(kServiceAccount);
  if (!account_group) {
    std::fprintf(stderr, "Couldn't get gid for group \"%s\".\n", kServiceAccount);
    return;
  }
  const gid_t gid = account_group->gr_gid;
  if (setgid(gid) != 0) {
    std::fprintf(stderr, "Failed setting gid to %d: %m\n", static_cast<int>(gid));
    return;
  }
  if (initgroups(kServiceAccount, gid) != 0) {
    std::fprintf(stderr, "Unable to run initgroups() with username: %s, gid: %d: %m\n",
                 kServiceAccount, static_cast<int>(gid));
    return;
  }
  if (setuid(user->pw_uid) != 0) {
    std::fprintf(stderr, "Failed setting uid to %d: %m\n", static_cast<int>(user->pw_uid));
  }
}
