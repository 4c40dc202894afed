// The port object as the port layer's own files see it.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "base/condition.h"
#include "base/glib-ptr.h"
#include "port/ioport.h"

// One attribute of the backend's part of the hardware description.
struct BackendProperty {
  std::string section;
  std::string key;
  std::string value;
};

// What goes on for the port in the background (port-work.h), counted.
struct BackgroundWork {
  struct Waiting {
    std::uint64_t until;  // how many must have ended
    std::function<void()> done;
  };

  std::mutex lock;  // for the rest; nothing else is locked while it is held
  MonotonicCondition changed;
  std::uint64_t begun = 0;
  std::uint64_t ended = 0;
  std::vector<Waiting> waiting;  // in the order of `until`
};

struct IOPort {
  PortType type = PORT_INPUT;
  BackendKind backend = BACKEND_VIRTUAL;
  const PortFunctions *functions = nullptr;
  std::unique_ptr<PortBackendData> backend_data;
  // Kept so that a port that was dropped can be brought back with what the document said of it.
  std::vector<BackendProperty> backend_properties;
  bool backend_released = false;

  std::map<std::string, bool> properties;
  std::optional<std::string> id;
  std::optional<std::string> input_name;
  std::optional<std::string> output_name;
  int number = -1;
  bool optional = false;

  int button = BUTTON_NONE;
  std::uint32_t pulse_time = 0;
  std::int32_t delay_time = 0;
  int mode = PORT_MODE_BISTABLE;
  std::uint32_t spare_setting = 1;

  IoEvents events;

  // An action thread classifies a line while the main thread replaces the list. Nothing else is
  // locked while this is held.
  mutable std::mutex ranges_lock;
  SupervisedRanges supervised_ranges;

  // What an action thread reads while the main thread may write it.
  std::atomic<bool> activelow_output = false;
  std::atomic<bool> activelow_input = false;
  std::atomic<bool> direction = true;  // true: input
  std::atomic<bool> supervised = false;
  std::atomic<bool> events_enabled = true;
  std::atomic<bool> set_up = false;

  // For the log. Main thread.
  std::string fault;         // what was noted since the last set-up began
  bool idle_logged = false;  // supervised without being set up, and the log says so

  // Serialises state writes, and keeps what a step sends apart from a new declaration. An action
  // thread holds it for each step, not between them.
  std::mutex lock;

  BackgroundWork background;

  // Guards what follows. Taken before `lock`, never while `lock` is held.
  std::mutex sequence_lock;
  MonotonicCondition sequence_cond;           // a running sequence is asked to end
  MonotonicCondition sequence_done_cond;      // a running sequence has ended
  std::atomic<bool> cancel_sequence = false;  // also read by an action thread that waits for a box
  bool sequence_running = false;
  GObjectPtr<GCancellable> sequence_cancelled;  // of the last sequence, for what waits elsewhere

  std::atomic<int> refcount = 1;
};

// Ends a running sequence and returns holding the port's lock, so that no other can begin to drive
// the port until the lock is given up.
[[nodiscard]] std::unique_lock<std::mutex> io_port_stop_sequence_and_lock(IOPort *port);

// Waits until what was begun in the background for the port so far has ended. False: the port's
// sequence was cancelled meanwhile. Action threads, without any lock.
bool io_port_wait_until_idle(IOPort *port);
// Wakes who waits there, once `cancel_sequence` is set.
void io_port_cancel_wait(IOPort *port);

// Whether the backend can be asked: not while it has given up its record.
inline bool io_port_backend_serves(const IOPort *port) {
  return port->functions && !port->backend_released;
}

// The raw level that the backend reads, and the one that it is to write.
std::uint32_t io_port_read_level(IOPort *port);
void io_port_write_level(IOPort *port, std::int32_t level);

// Frees the port, whoever may still hold references.
void io_port_destroy(IOPort *port);

// Sends those events of the port that apply to its role, while its events are enabled.
void io_port_fire_events(IOPort *port, std::int32_t state);
// The same with the state of the line, which events for supervised inputs are sent with.
void io_port_fire_line_events(IOPort *port, std::int32_t state, std::int32_t line);
void io_port_undeclare_events(IOPort *port);
// As io_port_redeclare_events. The caller holds the port's lock.
void io_port_redeclare_events_locked(IOPort *port);
// Declares the events that apply to the port's role, anew when it has changed, and withdraws the
// others.
void io_port_declare_events_for_role(IOPort *port, bool role_changed);
