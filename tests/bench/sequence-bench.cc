// How late the steps of an action sequence are, and how long cancelling one takes. Prints figures
// and judges nothing: they belong to the machine that they are taken on.
#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <numeric>
#include <vector>

#include "base/condition.h"
#include "daemon/backends.h"
#include "port/ioport.h"
#include "port/port-listener.h"

namespace {

constexpr std::int32_t kStepMs = 5;
constexpr int kDefaultSteps = 400;
constexpr int kCancels = 10'000;

std::mutex lock;
MonotonicCondition ended;
bool done = false;
std::vector<gint64> step_times;

void on_port_changed(const PortChange & /*change*/) {
  step_times.push_back(g_get_monotonic_time());
}

void on_done(int /*number*/) {
  const std::lock_guard guard(lock);
  done = true;
  ended.notify_all();
}

IOPortRef make_output() {
  IOPortRef port(io_port_new());
  io_port_set_type(port.get(), PORT_OUTPUT);
  io_port_set_backend(port.get(), BACKEND_CHECK);
  io_port_setup(port.get());
  return port;
}

void run(IOPort *port, int steps) {
  ActionSequence sequence = {false, {}};
  for (int i = 0; i < steps; ++i) {
    sequence.steps.push_back({i % 2 == 0, kStepMs});
  }
  io_port_run_action_sequence(port, std::move(sequence));
  std::unique_lock guard(lock);
  while (!done) {
    ended.wait(guard);
  }
}

std::vector<double> lateness(IOPort *port, int steps) {
  run(port, steps);
  io_port_wait_for_action_threads();
  std::vector<double> late;
  for (std::size_t i = 1; i < step_times.size(); ++i) {
    late.push_back(static_cast<double>(step_times[i] - step_times[i - 1]) - kStepMs * 1000.0);
  }
  return late;
}

// Each cancel meets its sequence at another moment, from before the first step to well into the
// wait.
std::vector<double> cancels(IOPort *port) {
  constexpr std::int32_t long_ms = 100'000;
  constexpr int delays = 50;
  std::vector<double> times;
  for (int i = 0; i < kCancels; ++i) {
    io_port_run_action_sequence(port, {false, {{true, long_ms}, {false, long_ms}}});
    g_usleep(static_cast<gulong>(i % delays));
    const gint64 begin = g_get_monotonic_time();
    io_port_set_activelow(port, i % 2 == 0, false);
    times.push_back(static_cast<double>(g_get_monotonic_time() - begin));
  }
  return times;
}

void print(const char *what, std::vector<double> times) {
  std::sort(times.begin(), times.end());
  std::printf("%s, %zu times: min %.0f us, mean %.1f us, 99%% %.0f us, max %.0f us\n", what,
              times.size(), times.front(),
              std::accumulate(times.begin(), times.end(), 0.0) / static_cast<double>(times.size()),
              times[times.size() * 99 / 100], times.back());
}

}  // namespace

int main(int argc, char **argv) {
  const int steps = argc > 1 ? std::max(2, std::atoi(argv[1])) : kDefaultSteps;
  backends_register();
  port_listener().port_changed = on_port_changed;
  port_listener().action_sequence_done = on_done;
  const IOPortRef port = make_output();
  print("lateness of a step of 5 ms", lateness(port.get(), steps));
  print("cancelling a sequence", cancels(port.get()));
  return 0;
}
