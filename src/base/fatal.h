// The end of the daemon for want of something that it has no use without. Nothing else may end it:
// what comes from outside is answered, or logged.
#pragma once

#include <cstdlib>
#include <string>

#include "base/log.h"

// Logs the reason at GLib's error level, which ends the process.
[[noreturn]] inline void end_daemon(const std::string &reason) {
  log_at(G_LOG_LEVEL_ERROR, "%s", reason.c_str());
  std::abort();
}
