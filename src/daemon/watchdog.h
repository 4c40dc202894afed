// The service manager's watchdog. The main loop itself answers it, so that a daemon whose loop no
// longer runs is restarted.
#pragma once

#include <sys/socket.h>
#include <sys/un.h>

#include "base/source.h"
#include "base/unique-fd.h"

// Tells the service manager twice in each interval that the main loop runs, if it asks for that
// (NOTIFY_SOCKET and WATCHDOG_USEC in the environment, and WATCHDOG_PID, where it is set, is this
// process). Does nothing otherwise. What can't be sent is left out: the manager then restarts the
// daemon. Main thread.
class Watchdog {
 public:
  Watchdog();

 private:
  static gboolean on_tick(gpointer self);

  UniqueFd socket_;
  sockaddr_un manager_{};
  socklen_t manager_size_ = 0;
  Source tick_;
};
