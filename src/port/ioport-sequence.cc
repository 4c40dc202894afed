// Action sequences: timed lists of states on a thread of their own, and how they are stopped.
//
// A sequence counts as running from before its thread starts until after its end was announced, so
// that there is no moment at which a cancel could be lost. The thread gives up the port's lock for
// each wait and waits on the sequence lock, under which a cancel is asked for: no wake-up is lost.
#include <algorithm>

#include "base/assert.h"
#include "base/glib-ptr.h"
#include "base/heap.h"
#include "base/log.h"
#include "port/ioport-private.h"
#include "port/port-listener.h"

namespace {

constexpr const char *kThreadName = "Action thread";

// After so many steps the thread waits until their signals have been sent, so that a sequence
// without pauses fills neither the memory nor the queue of the bus.
constexpr int kMaxUnsentSteps = 64;
// How late that may make a step when the bus hangs.
constexpr std::int64_t kMaxDelay = 1'000'000;  // microseconds

struct ActionJob {
  IOPortRef port;
  GObjectPtr<GCancellable> cancelled;
  ActionSequence sequence;
};

// The action threads of all ports, counted until they no longer touch any port.
std::mutex threads_lock;
MonotonicCondition threads_gone;
int threads_alive = 0;

void thread_started() {
  const std::lock_guard lock(threads_lock);
  ++threads_alive;
}

void thread_ended() {
  const std::lock_guard lock(threads_lock);
  --threads_alive;
  threads_gone.notify_all();
}

bool can_run(const IOPort *port, const ActionSequence &sequence) {
  const bool may_drive = !io_port_input(port) && port->backend != BACKEND_VIRTUAL;
  return !sequence.steps.empty() && (sequence.is_virtual || may_drive) && port->set_up;
}

// What ends the waits of the sequence that may begin now. Null: one runs already.
GObjectPtr<GCancellable> begin_sequence(IOPort *port) {
  const std::lock_guard lock(port->sequence_lock);
  if (port->sequence_running) {
    return nullptr;
  }
  port->sequence_running = true;
  port->cancel_sequence = false;
  port->sequence_cancelled.reset(g_cancellable_new());
  return gobject_reference(port->sequence_cancelled.get());
}

// Fixed: the product wraps in 32 bits.
std::int64_t deadline_after(std::int32_t time_ms) {
  const auto wrapped = static_cast<std::int32_t>(static_cast<std::uint32_t>(time_ms) * 1000U);
  return g_get_monotonic_time() + wrapped;
}

// Holds the step's state until then. False: the sequence is cancelled.
bool hold(IOPort *port, std::int64_t deadline) {
  std::unique_lock lock(port->sequence_lock);
  while (!port->cancel_sequence && g_get_monotonic_time() < deadline) {
    port->sequence_cond.wait_until(lock, deadline);
  }
  return !port->cancel_sequence;
}

void apply_step(IOPort *port, bool is_virtual, bool state) {
  const std::lock_guard lock(port->lock);
  if (is_virtual) {
    io_port_set_virtual(port, state);
  } else {
    io_port_set_state_internal(port, state);
  }
}

void release(IOPort *port) {
  const std::lock_guard lock(port->sequence_lock);
  port->cancel_sequence = false;
  port->sequence_running = false;
  port->sequence_done_cond.notify_all();
}

void announce_end(IOPort *port) {
  if (const auto done = port_listener().action_sequence_done) {
    done(port->number);
  }
}

void wait_until_sent(GCancellable *cancelled, std::int64_t step_deadline) {
  if (const auto wait = port_listener().wait_until_sent) {
    wait(cancelled, std::max(step_deadline, g_get_monotonic_time() + kMaxDelay));
  }
}

void run_steps(const ActionJob &job) {
  IOPort *port = job.port.get();
  int unsent_steps = 0;
  for (const auto &step : job.sequence.steps) {
    apply_step(port, job.sequence.is_virtual, step.state);
    // A step's time begins when the port has the state. That is waited for without a
    // lock.
    if (!io_port_wait_until_idle(port)) {
      return;
    }
    const std::int64_t deadline = deadline_after(step.time_ms);
    if (++unsent_steps == kMaxUnsentSteps) {
      wait_until_sent(job.cancelled.get(), deadline);
      unsent_steps = 0;
    }
    if (!hold(port, deadline)) {
      return;
    }
  }
}

// The allocator would keep the memory of a long sequence and of the message that it came with.
void trim_heap_after(std::size_t steps) {
  constexpr std::size_t many = 1024;
  if (steps > many) {
    heap_trim();
  }
}

gpointer run_sequence(gpointer data) {
  std::size_t steps = 0;
  {
    const std::unique_ptr<ActionJob> job(static_cast<ActionJob *>(data));
    steps = job->sequence.steps.size();
    run_steps(*job);
    announce_end(job->port.get());
    release(job->port.get());
  }
  trim_heap_after(steps);
  thread_ended();
  return nullptr;
}

bool start_thread(IOPort *port, GObjectPtr<GCancellable> cancelled, ActionSequence sequence) {
  auto job = std::make_unique<ActionJob>(
      ActionJob{io_port_new_reference(port), std::move(cancelled), std::move(sequence)});
  thread_started();
  Error error;
  GThread *thread = g_thread_try_new(kThreadName, run_sequence, job.get(), error.out());
  if (!thread) {
    log_warning("Could not start action thread: %s", error.message());
    thread_ended();
    release(port);
    return false;
  }
  (void)job.release();  // the thread owns it
  g_thread_unref(thread);
  return true;
}

}  // namespace

bool io_port_run_action_sequence(IOPort *port, ActionSequence sequence) {
  assert_port(port);
  auto cancelled = can_run(port, sequence) ? begin_sequence(port) : nullptr;
  if (!cancelled) {
    log_warning("Set action seq on incorrect port");
    return false;
  }
  return start_thread(port, std::move(cancelled), std::move(sequence));
}

bool io_port_is_busy(IOPort *port) {
  {
    const std::lock_guard lock(port->sequence_lock);
    if (port->sequence_running) {
      return true;
    }
  }
  const std::unique_lock lock(port->lock, std::try_to_lock);
  return !lock.owns_lock();
}

std::unique_lock<std::mutex> io_port_stop_sequence_and_lock(IOPort *port) {
  std::unique_lock sequence(port->sequence_lock);
  while (port->sequence_running) {
    // Asked for anew at each wake-up: another sequence may have begun since the last one ended.
    port->cancel_sequence = true;
    port->sequence_cond.notify_all();
    g_cancellable_cancel(port->sequence_cancelled.get());
    io_port_cancel_wait(port);
    port->sequence_done_cond.wait(sequence);
  }
  return std::unique_lock(port->lock);
}

void io_port_wait_for_action_threads() {
  std::unique_lock lock(threads_lock);
  while (threads_alive > 0) {
    threads_gone.wait(lock);
  }
}
