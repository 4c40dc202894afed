#include "base/main-queue.h"

#include <glib.h>

#include <mutex>
#include <utility>
#include <vector>

namespace {

using Work = std::vector<std::function<void()>>;

struct Queue {
  std::mutex lock;
  Work work;
};

// Never destroyed: threads of other static objects may post until those have gone.
Queue &queue() {
  static auto *const instance = new Queue;
  return *instance;
}

bool run_batch() {
  Work batch;
  {
    const std::lock_guard lock(queue().lock);
    batch.swap(queue().work);
  }
  for (auto &work : batch) {
    std::exchange(work, nullptr)();  // what it holds goes before the next one runs
  }
  return !batch.empty();
}

gboolean on_posted(gpointer /*user_data*/) {
  run_batch();
  return G_SOURCE_REMOVE;
}

}  // namespace

void post_to_main_loop(std::function<void()> work) {
  const std::lock_guard lock(queue().lock);
  queue().work.push_back(std::move(work));
  if (queue().work.size() == 1) {
    g_idle_add_full(G_PRIORITY_DEFAULT, on_posted, nullptr, nullptr);
  }
}

void run_posted_work() {
  while (run_batch()) {
  }
}

void serve_main_loop_until(const std::function<bool()> &done) {
  while (!done()) {
    g_main_context_iteration(nullptr, TRUE);
  }
}
