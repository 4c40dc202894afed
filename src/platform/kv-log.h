// The device's logging library.
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

// Routes everything that GLib logs in this process to standard output, one line a message: the
// level, then the text. Call once, early, from the main thread; messages may then come from any
// thread.
void kv_log_stdout(void);

#ifdef __cplusplus
}
#endif
