// The request to end, SIGTERM, for what waits where the main loop can't serve it.
#pragma once

#include <gio/gio.h>

// Cancelled once SIGTERM has arrived: a call that is waited for with it ends then. Any thread.
GCancellable *termination_cancellable();
// From here on SIGTERM cancels it, on a thread of its own. Should the daemon still run a few
// seconds later, that thread ends it with status 0: whatever hangs then is not in our hands. False,
// logged: the thread can't be started. Main thread, once, before the first call that may have to be
// ended.
[[nodiscard]] bool termination_watch();
