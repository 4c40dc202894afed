// The thread that writes to storage while the daemon serves, so that the main loop never waits.
//
// It does one piece of work after another. Each piece keeps, under a lock of its own, what is to be
// stored; what is added before the work begins is stored with it. The thread starts with the first
// request; where it can't, the caller does the work at once.
#pragma once

#include <cstdint>

using StorageWork = void (*)();

// Has `work` run after what was asked for earlier. Asked for again before it began, it runs once.
// The caller holds no lock that `work` takes. Any thread.
void storage_writer_request(StorageWork work);
// Waits until everything that was asked for is done, and ends the thread. False when storage hangs
// until `deadline_us`, in g_get_monotonic_time(): the thread is still there then. Main thread, when
// no more requests come.
bool storage_writer_finish(std::int64_t deadline_us);
