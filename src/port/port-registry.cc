#include "port/port-registry.h"

#include <algorithm>
#include <iterator>
#include <memory>
#include <utility>

#include "base/log.h"
#include "base/main-queue.h"
#include "port/ioport-private.h"

namespace {

using Ports = std::vector<IOPort *>;

struct Registry {
  std::mutex lock;
  Ports active;
  Ports parked;
};

Registry &registry() {
  static Registry instance;
  return instance;
}

bool is_addressable(const IOPort *port) {
  return io_port_is_ioport(port) || io_port_get_flag(port, "virtual");
}

IOPortRef find_in(const Ports &ports, std::uint32_t number) {
  const auto found = std::find_if(ports.rbegin(), ports.rend(), [&](const IOPort *port) {
    return std::cmp_equal(port->number, number) && is_addressable(port);
  });
  return found == ports.rend() ? nullptr : io_port_new_reference(*found);
}

void prepend(Ports &ports, IOPort *port) {
  ports.insert(ports.begin(), port);
}

std::uint32_t count_role(bool input) {
  const std::lock_guard lock(registry().lock);
  const auto &ports = registry().active;
  return static_cast<std::uint32_t>(
      std::count_if(ports.begin(), ports.end(), [&](const IOPort *port) {
        return io_port_is_ioport(port) && io_port_direction_input(port) == input;
      }));
}

// A document may declare a port without a backend, or name one that does not exist. Such a port is
// kept, so that it can be listed, but it never comes into service.
void set_up(IOPort *port) {
  if (io_port_has_backend(port)) {
    io_port_begin_setup(port);
  } else {
    io_port_note_fault(port, "it has no backend");
    log_warning("Port %s has no backend and stays out of service", io_port_describe(port));
  }
}

// Moves the ports of `from` that satisfy `moves` to the front of `to`, first to last.
template <typename Predicate>
std::size_t move_ports(Ports &from, Ports &to, Predicate moves) {
  Ports stay;
  std::size_t moved = 0;
  for (IOPort *port : std::exchange(from, {})) {
    if (moves(port)) {
      prepend(to, port);
      ++moved;
    } else {
      stay.push_back(port);
    }
  }
  from = std::move(stay);
  return moved;
}

// References to the ports of a list, for passes that must not hold the lock.
std::vector<IOPortRef> snapshot(const Ports &list) {
  const std::lock_guard lock(registry().lock);
  std::vector<IOPortRef> ports;
  std::transform(list.begin(), list.end(), std::back_inserter(ports), io_port_new_reference);
  return ports;
}

// The ports in service that can be called.
std::vector<IOPortRef> snapshot_with_backend() {
  auto ports = snapshot(registry().active);
  std::erase_if(ports, [](const IOPortRef &port) { return !io_port_has_backend(port.get()); });
  return ports;
}

void when_all_idle(const std::vector<IOPortRef> &ports, std::function<void()> done) {
  const auto left = std::make_shared<std::size_t>(ports.size() + 1);
  const auto one_idle = [left, done = std::move(done)] {
    if (--*left == 0) {
      done();
    }
  };
  for (const auto &port : ports) {
    io_port_when_idle(port.get(), one_idle);
  }
  one_idle();
}

// Sets up the ports of a list, without the lock: a backend may declare events, whose library may
// ask the registry. `done` is called when it is clear which of them came up.
void set_up_all(const Ports &list, std::function<void()> done) {
  const auto ports = snapshot(list);
  for (const auto &port : ports) {
    set_up(port.get());
  }
  when_all_idle(ports, std::move(done));
}

// Who asked for the parked ports to be tried, and whether a pass is under way. Main thread.
struct Retries {
  std::vector<std::function<void(std::size_t)>> waiting;
  bool running = false;
};

Retries &retries() {
  static Retries instance;
  return instance;
}

std::size_t unpark_set_up() {
  const std::lock_guard lock(registry().lock);
  return move_ports(registry().parked, registry().active,
                    [](const IOPort *port) { return port->set_up.load(); });
}

void retry_parked() {
  const auto callers = std::exchange(retries().waiting, {});
  retries().running = true;
  set_up_all(registry().parked, [callers] {
    retries().running = false;
    const std::size_t count = unpark_set_up();
    for (const auto &done : callers) {
      done(count);
    }
    if (!retries().waiting.empty() && !retries().running) {
      retry_parked();
    }
  });
}

// In the order of the description. Gives the number of those in service.
std::size_t log_service_of(const std::vector<IOPortRef> &ports, const char *otherwise) {
  std::size_t in_service = 0;
  std::for_each(ports.rbegin(), ports.rend(), [&](const IOPortRef &port) {
    if (io_port_in_service(port.get())) {
      ++in_service;
    } else {
      log_warning("Port %s, number %d, is out of service %s: %s", io_port_describe(port.get()),
                  port->number, otherwise, io_port_fault(port.get()).c_str());
    }
  });
  return in_service;
}

std::string default_input_name(const IOPort *port, int inputs_seen) {
  return port->id == "pir_detector" ? "PIR sensor" : "Input " + std::to_string(inputs_seen);
}

struct NameCounters {
  int inputs = 0;
  int outputs = 0;
};

void assign_default_name(IOPort *port, NameCounters &seen) {
  if (port->type != PORT_OUTPUT) {
    ++seen.inputs;
    if (!port->input_name) {
      port->input_name = default_input_name(port, seen.inputs);
    }
  }
  if (port->type != PORT_INPUT) {
    ++seen.outputs;
    if (!port->output_name) {
      port->output_name = "Output " + std::to_string(seen.outputs);
    }
  }
}

}  // namespace

void port_registry_add(IOPort *port) {
  const std::lock_guard lock(registry().lock);
  io_port_ref(port);
  prepend(registry().active, port);
}

IOPortRef port_registry_nth(std::size_t n) {
  const std::lock_guard lock(registry().lock);
  const auto &ports = registry().active;
  return n < ports.size() ? io_port_new_reference(ports[n]) : nullptr;
}

IOPortRef port_registry_find(std::uint32_t number) {
  const std::lock_guard lock(registry().lock);
  return find_in(registry().active, number);
}

IOPortRef port_registry_find_parked(std::uint32_t number) {
  const std::lock_guard lock(registry().lock);
  return find_in(registry().parked, number);
}

IOPort *port_registry_find_by_id_locked(const std::string &id) {
  const auto &ports = registry().active;
  const auto found =
      std::find_if(ports.begin(), ports.end(), [&](const IOPort *port) { return port->id == id; });
  return found == ports.end() ? nullptr : *found;
}

IOPortRef port_registry_get_by_id(const std::string &id) {
  const std::lock_guard lock(registry().lock);
  return io_port_new_reference(port_registry_find_by_id_locked(id));
}

void port_registry_remove_by_id(const std::string &id) {
  IOPortRef removed;  // released after the lock: freeing a port withdraws its events
  const std::lock_guard lock(registry().lock);
  removed.reset(port_registry_find_by_id_locked(id));
  if (removed) {
    std::erase(registry().active, removed.get());
  }
}

std::size_t port_registry_count() {
  const std::lock_guard lock(registry().lock);
  return registry().active.size();
}

std::uint32_t port_registry_count_outputs() {
  return count_role(false);
}

std::uint32_t port_registry_count_inputs() {
  return count_role(true);
}

std::vector<std::uint32_t> port_registry_supervisable_numbers() {
  std::vector<std::uint32_t> numbers;
  port_registry_for_each([&](IOPort *port) {
    if (io_port_is_supervisable(port)) {
      numbers.push_back(static_cast<std::uint32_t>(port->number));
    }
  });
  return numbers;
}

bool port_registry_any_port_active() {
  const std::lock_guard lock(registry().lock);
  const auto &ports = registry().active;
  return std::any_of(ports.begin(), ports.end(), [](IOPort *port) {
    return io_port_got_port_any(port) && io_port_get_state(port);
  });
}

void port_registry_for_each(const std::function<void(IOPort *)> &visit) {
  const std::lock_guard lock(registry().lock);
  for (IOPort *port : registry().active) {
    if (io_port_has_backend(port)) {
      visit(port);
    }
  }
}

void port_registry_assign_default_names() {
  NameCounters seen;
  for (std::uint32_t number = 0; number < port_registry_count(); ++number) {
    if (const IOPortRef port = port_registry_find(number)) {
      assign_default_name(port.get(), seen);
    }
  }
}

void port_registry_setup_all() {
  bool idle = false;
  set_up_all(registry().active, [&] { idle = true; });
  serve_main_loop_until([&] { return idle; });
  const std::lock_guard lock(registry().lock);
  move_ports(registry().active, registry().parked,
             [](const IOPort *port) { return port->optional && !port->set_up; });
}

void port_registry_retry_parked(std::function<void(std::size_t)> done) {
  retries().waiting.push_back(std::move(done));
  if (!retries().running) {
    retry_parked();
  }
}

void port_registry_park(IOPort *port) {
  const std::lock_guard lock(registry().lock);
  if (port->optional && std::erase(registry().active, port) > 0) {
    prepend(registry().parked, port);
  }
}

void port_registry_arm_watches() {
  for (const auto &port : snapshot_with_backend()) {
    io_port_set_watch(port.get());
  }
}

void port_registry_log_service() {
  const auto listed = snapshot(registry().active);
  const auto parked = snapshot(registry().parked);
  const std::size_t in_service =
      log_service_of(listed, "(listed)") + log_service_of(parked, "(not listed)");
  log_info("%zu of %zu ports are in service", in_service, listed.size() + parked.size());
}

void port_registry_declare_events() {
  for (const auto &port : snapshot_with_backend()) {
    if (io_port_events_enabled(port.get())) {
      io_port_declare_events(port.get());
    }
  }
}

void port_registry_drop_all() {
  std::unique_lock lock(registry().lock);
  Ports ports = std::exchange(registry().active, {});
  for (IOPort *port : std::exchange(registry().parked, {})) {
    ports.push_back(port);
  }
  lock.unlock();
  for (IOPort *port : ports) {
    io_port_stop_sequence_and_lock(port).unlock();
  }
  io_port_wait_for_action_threads();
  run_posted_work();  // what is still under way for a port must not outlive it
  for (IOPort *port : ports) {
    io_port_destroy(port);
  }
}

std::unique_lock<std::mutex> port_registry_lock() {
  return std::unique_lock(registry().lock);
}

const std::vector<IOPort *> &port_registry_active_locked() {
  return registry().active;
}
