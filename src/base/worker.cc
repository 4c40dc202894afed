#include "base/worker.h"

#include <utility>
#include <vector>

#include "base/log.h"

namespace {

// Every worker there is, for stop_all(). Main thread. Never destroyed: static objects have workers.
std::vector<Worker *> &workers() {
  static auto *const instance = new std::vector<Worker *>;
  return *instance;
}

}  // namespace

Worker::Worker(const char *name) : name_(name), cancellable_(g_cancellable_new()) {
  workers().push_back(this);
}

Worker::~Worker() {
  stop();
  std::erase(workers(), this);
}

bool Worker::queue(Job job) {
  const std::lock_guard lock(lock_);
  if (stopped_ || !start_thread()) {
    return false;
  }
  jobs_.push_back({std::move(job), gobject_reference(cancellable_.get())});
  wake_up_.notify_all();
  return true;
}

void Worker::cancel() {
  std::unique_lock lock(lock_);
  const GObjectPtr<GCancellable> cancelled =
      std::exchange(cancellable_, GObjectPtr<GCancellable>(g_cancellable_new()));
  lock.unlock();
  g_cancellable_cancel(cancelled.get());
}

void Worker::stop() {
  std::unique_lock lock(lock_);
  stopped_ = true;
  GThread *thread = std::exchange(thread_, nullptr);
  wake_up_.notify_all();
  lock.unlock();
  cancel();
  if (thread) {
    g_thread_join(thread);
  }
}

void Worker::stop_all() {
  for (Worker *worker : workers()) {
    worker->stop();
  }
}

// The caller holds the lock.
bool Worker::start_thread() {
  if (!thread_) {
    Error error;
    thread_ = g_thread_try_new(name_, run_thread, this, error.out());
    if (!thread_) {
      log_warning("Could not start the thread '%s': %s", name_, error.message());
    }
  }
  return thread_ != nullptr;
}

gpointer Worker::run_thread(gpointer self) {
  static_cast<Worker *>(self)->run();
  return nullptr;
}

void Worker::run() {
  std::unique_lock lock(lock_);
  while (!stopped_ || !jobs_.empty()) {
    if (jobs_.empty()) {
      wake_up_.wait(lock);
      continue;
    }
    Queued next = std::move(jobs_.front());
    jobs_.pop_front();
    lock.unlock();
    next.job(next.cancellable.get());
    next = {};  // what the job holds is released here, not under the lock
    lock.lock();
  }
}
