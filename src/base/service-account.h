// The account that the daemon runs under once its ports are set up: a user and a group of this
// name.
#pragma once

#include <sys/types.h>

inline constexpr const char *kServiceAccount = "pcd";

// Whether files of the user may be taken for the daemon's own: root's, the service account's, and
// those of whoever runs the daemon. Main thread.
bool is_own_account(uid_t uid);
