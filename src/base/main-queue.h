// Work that other threads hand to the main loop, in the order in which it was handed over.
#pragma once

#include <functional>

// Has `work` run on the main loop. It is destroyed there too, so what it holds may be the last
// reference to something of the main thread. Any thread.
void post_to_main_loop(std::function<void()> work);
// Runs what was posted, and what that posts in turn, now. Main thread, at the end, when the loop no
// longer runs.
void run_posted_work();
// Serves the main loop's sources until `done` holds, which something posted must bring about. Main
// thread, at start-up, before clients are served.
void serve_main_loop_until(const std::function<bool()> &done);
