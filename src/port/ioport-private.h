// The port object as the port layer's own files see it.
#pragma once

#include <atomic>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "base/condition.h"
#include "port/ioport.h"

// One attribute of the backend's part of the hardware description.
struct BackendProperty {
  std::string section;
  std::string key;
  std::string value;
};

struct IOPort {
  PortType type = PORT_INPUT;
  int backend = 0;
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

  // Serialises state writes, and keeps what a step sends apart from a new declaration. An action
  // thread holds it for each step, not between them.
  std::mutex lock;

  // Guards the two flags below. Taken before `lock`, never while `lock` is held.
  std::mutex sequence_lock;
  MonotonicCondition sequence_cond;       // a running sequence is asked to end
  MonotonicCondition sequence_done_cond;  // a running sequence has ended
  bool cancel_sequence = false;
  bool sequence_running = false;

  std::atomic<int> refcount = 1;
};

// Ends a running sequence and returns holding the port's lock, so that no other can begin to drive
// the port until the lock is given up.
[[nodiscard]] std::unique_lock<std::mutex> io_port_stop_sequence_and_lock(IOPort *ioport);

// Whether the backend can be asked: not while it has given up its record.
inline bool io_port_backend_serves(const IOPort *ioport) {
  return ioport->functions && !ioport->backend_released;
}

// Frees the port, whoever may still hold references.
void io_port_destroy(IOPort *ioport);

// Sends those events of the port that apply to its role, while its events are enabled.
void io_port_fire_events(IOPort *ioport, std::int32_t state);
void io_port_undeclare_events(IOPort *ioport);
// Declares the events that apply to the port's role and withdraws the others.
void io_port_declare_events_for_role(IOPort *ioport);
