#include "port/port-work.h"

#include <algorithm>
#include <utility>

#include "base/main-queue.h"
#include "port/ioport-private.h"

namespace {

// The callbacks that have waited long enough. The caller holds the lock.
std::vector<std::function<void()>> take_due(BackgroundWork &work) {
  std::vector<std::function<void()>> due;
  const auto first_left = std::find_if(
      work.waiting.begin(), work.waiting.end(),
      [&](const BackgroundWork::Waiting &waiting) { return waiting.until > work.ended; });
  for (auto waiting = work.waiting.begin(); waiting != first_left; ++waiting) {
    due.push_back(std::move(waiting->done));
  }
  work.waiting.erase(work.waiting.begin(), first_left);
  return due;
}

}  // namespace

PortWork::PortWork(IOPort *port) : port_(io_port_new_reference(port)) {
  BackgroundWork &work = port->background;
  const std::lock_guard lock(work.lock);
  ++work.begun;
}

PortWork::~PortWork() {
  BackgroundWork &work = port_->background;
  std::unique_lock lock(work.lock);
  ++work.ended;
  auto due = take_due(work);
  work.changed.notify_all();
  lock.unlock();
  // The reference goes there too: it may be the last one, and ports are freed on the main thread.
  post_to_main_loop([port = std::shared_ptr<IOPort>(std::move(port_)), due = std::move(due)] {
    for (const auto &done : due) {
      done();
    }
  });
}

void io_port_when_idle(IOPort *port, std::function<void()> done) {
  BackgroundWork &work = port->background;
  std::unique_lock lock(work.lock);
  if (work.ended < work.begun) {
    work.waiting.push_back({work.begun, std::move(done)});
    return;
  }
  lock.unlock();
  done();
}

bool io_port_wait_until_idle(IOPort *port) {
  BackgroundWork &work = port->background;
  std::unique_lock lock(work.lock);
  const std::uint64_t until = work.begun;
  while (work.ended < until && !port->cancel_sequence) {
    work.changed.wait(lock);
  }
  return !port->cancel_sequence;
}

void io_port_cancel_wait(IOPort *port) {
  const std::lock_guard lock(port->background.lock);
  port->background.changed.notify_all();
}
