// Follows one GPIO line of a port by its edges. After an edge the line is debounced; then the
// port's state is read and reported until the line is stable. Reading a line acknowledges its edge,
// so every read goes through here, and a change that a read has acknowledged is still reported. A
// line that can't be read is read again once a second.
//
// Main thread unless said otherwise.
#pragma once

#include <glib.h>

#include <memory>
#include <mutex>

#include "backends/libugpio-utils.h"
#include "base/source.h"

struct IOPort;

class EdgeWatch {
 public:
  // `handles` is the lock under which the owner uses its pins' handles, since a line may be used by
  // one thread at a time. An edge makes `condition` true.
  EdgeWatch(std::mutex &handles, GIOCondition condition)
      : handles_(handles), condition_(condition) {}

  // Follows the line. When it is followed already it is armed again, and its last levels are kept.
  // Without a pin, or without a handle, nothing is followed.
  void start(IOPort *port, const GpioPin *pin);
  void stop();
  [[nodiscard]] bool is_on() const;

  // The level of the pin, or -1. To be used by all who read an input pin. Any thread.
  int read(const GpioPin *pin);

 private:
  static constexpr int kNone = -1;        // nothing was read yet
  static constexpr int kUnreadable = -2;  // the last read failed

  static gboolean on_signal(gint fd, GIOCondition condition, gpointer self);
  static gboolean on_wake(gpointer self);
  static gboolean on_recheck(gpointer self);

  struct DestroySource {
    void operator()(GSource *source) const {
      g_source_destroy(source);
      g_source_unref(source);
    }
  };

  void request_check();
  void check();
  void arm();
  void set_level(int level);
  void note_read(int level);
  void request_report();
  void schedule_recheck();
  bool needs_report();
  void debounce();
  void begin_debounce();
  void report_until_stable();
  void end_debounce();
  bool is_stuck(int fd);

  std::mutex &handles_;
  const GIOCondition condition_;
  // All that follows is guarded by `handles_`, also what only the main thread changes.
  IOPort *port_ = nullptr;
  const GpioPin *pin_ = nullptr;
  int level_ = kNone;             // what the line last read
  int reported_level_ = kNone;    // what it read when its state was last reported
  bool debouncing_ = false;       // its changes are being read and reported
  bool unreported_edge_ = false;  // a change was read and not reported
  // Main thread only: sources belong to its loop.
  Source watch_;    // of the line's descriptor
  Source recheck_;  // an unreadable line must be looked at again
  // The line must be read without an edge. Made and destroyed by the main thread; any thread
  // may make it ready.
  std::unique_ptr<GSource, DestroySource> wake_;
};
