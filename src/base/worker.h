// A thread that makes blocking calls to one service, so that the main loop does not: jobs run on it
// one after another, in the order in which they were queued.
//
// A job passes its cancellable to every call that blocks, so that stopping does not wait for the
// service. It posts its results to the main loop (base/main-queue.h).
#pragma once

#include <gio/gio.h>

#include <deque>
#include <functional>
#include <mutex>

#include "base/condition.h"
#include "base/glib-ptr.h"

class Worker {
 public:
  using Job = std::function<void(GCancellable *)>;

  // `name` is that of the thread, which the first job starts.
  explicit Worker(const char *name);
  Worker(const Worker &) = delete;
  Worker &operator=(const Worker &) = delete;
  ~Worker();

  // Has the job run after those queued before. False: the worker is stopped, or its thread can't
  // be started, and the job is destroyed instead. Any thread.
  bool queue(Job job);
  // Cancels the jobs queued so far: what they wait for fails at once. Any thread.
  void cancel();
  // Cancels the jobs queued so far and returns when they have run; takes no more. Main thread.
  void stop();

  // Stops all workers. Main thread.
  static void stop_all();

 private:
  struct Queued {
    Job job;
    GObjectPtr<GCancellable> cancellable;
  };

  static gpointer run_thread(gpointer self);
  void run();
  bool start_thread();

  const char *name_;
  std::mutex lock_;  // for what follows; a job runs without it
  MonotonicCondition wake_up_;
  std::deque<Queued> jobs_;
  GObjectPtr<GCancellable> cancellable_;  // of the jobs queued since the last cancel
  GThread *thread_ = nullptr;
  bool stopped_ = false;
};
