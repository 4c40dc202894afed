// Follows one GPIO line of a port by its edges. After an edge the line is given time to settle;
// then the port's state is read and reported until the line rests at what was reported. Reading a
// line acknowledges its edge, so reads by others are noted here, and what they would have hidden is
// reported all the same. A line that can't be read is looked at once a second until it can.
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
  // `handles` is what the owner uses its pins' handles under, since a line wants one thread at a
  // time; nothing else is locked while it is held. An edge makes `condition` true.
  EdgeWatch(std::mutex &handles, GIOCondition condition)
      : handles_(handles), condition_(condition) {}

  // Follows the line from now on. Followed already: arms anew, and forgets nothing. No pin, or one
  // without a handle: there is nothing to follow.
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

  void look_soon();
  void look_again();
  void arm();
  void see(int level);
  void note(int level);
  void report_soon();
  void recheck_later();
  bool wants_report();
  void settle();
  void begin_settling();
  void report_until_rest();
  void end_settling();
  bool signals_in_vain(int fd);

  std::mutex &handles_;
  const GIOCondition condition_;
  // All that follows is guarded by `handles_`, also what only the main thread changes.
  IOPort *port_ = nullptr;
  const GpioPin *pin_ = nullptr;
  int seen_ = kNone;         // what the line last read
  int told_ = kNone;         // what it read when its state was last reported
  bool settling_ = false;    // its changes are being read and reported
  bool was_hidden_ = false;  // a change was read and not reported
  // Main thread only: sources belong to its loop.
  Source watch_;    // of the line's descriptor
  Source recheck_;  // an unreadable line must be looked at again
  // The line must be looked at without an edge. Made and destroyed by the main thread; any thread
  // may make it ready.
  std::unique_ptr<GSource, DestroySource> wake_;
};
