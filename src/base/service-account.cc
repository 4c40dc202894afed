#include "base/service-account.h"

#include <pwd.h>
#include <unistd.h>

bool is_own_account(uid_t uid) {
  if (uid == 0 || uid == geteuid()) {
    return true;
  }
  const passwd *account = getpwnam(kServiceAccount);
  return account && account->pw_uid == uid;
}
