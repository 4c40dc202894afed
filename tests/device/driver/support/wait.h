// Waiting for what the daemon or the kernel is about to do: always for a condition, never for a
// time.
#pragma once

#include <glib.h>

#include <functional>

// Generous: an emulated machine on a busy host is slow, and only a failure waits this long.
inline constexpr gint64 kTimeout = 20 * G_TIME_SPAN_SECOND;

// Runs the main loop, which delivers signals, until the condition holds. False: it never did.
bool wait_until(const std::function<bool()> &condition, gint64 timeout = kTimeout);
// Runs the main loop for this long. Only to see that something does not happen.
void run_loop_for(gint64 microseconds);
