#include "settings/storage-writer.h"

#include <algorithm>
#include <deque>
#include <mutex>

#include "base/condition.h"
#include "base/glib-ptr.h"
#include "base/log.h"

namespace {

struct Writer {
  std::mutex lock;
  MonotonicCondition changed;
  std::deque<StorageWork> queued;  // each at most once
  bool busy = false;
  bool finishing = false;
  GThread *thread = nullptr;
};

// Never destroyed: a thread that blocks in storage outlives everything else.
Writer &writer() {
  static auto *const the_writer = new Writer;
  return *the_writer;
}

gpointer run(gpointer /*user_data*/) {
  Writer &self = writer();
  std::unique_lock lock(self.lock);
  for (;;) {
    while (self.queued.empty() && !self.finishing) {
      self.changed.wait(lock);
    }
    if (self.queued.empty()) {
      return nullptr;
    }
    const StorageWork work = self.queued.front();
    self.queued.pop_front();
    self.busy = true;
    lock.unlock();
    work();
    lock.lock();
    self.busy = false;
    self.changed.notify_all();
  }
}

// With the lock held.
bool make_thread(Writer &self) {
  if (!self.thread) {
    Error error;
    self.thread = g_thread_try_new("Storage writer", run, nullptr, error.out());
    if (!self.thread) {
      log_warning("Could not start the thread that stores settings: %s", error.message());
    }
  }
  return self.thread != nullptr;
}

// Whether the thread has the work to do.
bool enqueue(StorageWork work) {
  Writer &self = writer();
  const std::lock_guard lock(self.lock);
  if (!make_thread(self)) {
    return false;
  }
  if (std::find(self.queued.begin(), self.queued.end(), work) == self.queued.end()) {
    self.queued.push_back(work);
  }
  self.changed.notify_all();
  return true;
}

bool wait_until_done(Writer &self, std::int64_t deadline_us) {
  std::unique_lock lock(self.lock);
  self.finishing = true;
  self.changed.notify_all();
  while (self.thread && (self.busy || !self.queued.empty())) {
    if (g_get_monotonic_time() >= deadline_us) {
      return false;
    }
    self.changed.wait_until(lock, deadline_us);
  }
  return true;
}

}  // namespace

void storage_writer_request(StorageWork work) {
  if (!enqueue(work)) {
    work();
  }
}

bool storage_writer_finish(std::int64_t deadline_us) {
  Writer &self = writer();
  if (!wait_until_done(self, deadline_us)) {
    return false;
  }
  if (self.thread) {
    g_thread_join(self.thread);
  }
  const std::lock_guard lock(self.lock);
  self.thread = nullptr;
  self.finishing = false;
  return true;
}
