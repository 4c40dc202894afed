// What a backend offers to the port layer: one constant table per backend kind, and one private
// record per port.
#pragma once

#include <glib.h>

#include <cstdint>

#include "port/supervised-range.h"

struct IOPort;

// The base of every backend's private record. A port owns its record through this.
struct PortBackendData {
  PortBackendData() = default;
  PortBackendData(const PortBackendData &) = delete;
  PortBackendData &operator=(const PortBackendData &) = delete;
  virtual ~PortBackendData() = default;
};

// A slot that a backend does not serve is null. `port` is never null. Unless said otherwise an
// operation runs on the main thread.
struct PortFunctions {
  // Brings the hardware up; an output starts at the raw level `initial_level`. False: it could not,
  // and the reason is in the log. Brought up already: begins anew; whether the port is still
  // watched then is left open until its watch is armed again.
  bool (*setup)(IOPort *port, bool initial_level) = nullptr;
  // Also from action threads.
  bool (*is_supervisable)(IOPort *port) = nullptr;
  bool (*set_supervised)(IOPort *port, bool supervised) = nullptr;
  // Also from action threads.
  SupervisedRanges (*get_supervised_ranges)(IOPort *port) = nullptr;
  // Takes the list over, or refuses it and sets `error`.
  bool (*set_supervised_ranges)(IOPort *port, SupervisedRanges ranges, GError **error) = nullptr;
  // The state of the line and the level in raw converter codes, or false and `error`. Also from
  // action threads: a step that is only reported sends the state of the line with its event.
  bool (*get_supervised_readout)(IOPort *port, SupervisedRangeState *state, std::uint32_t *level,
                                 GError **error) = nullptr;
  // The raw level, 0 or 1; 2 and more mean unknown. Also from action threads.
  std::uint32_t (*get_state)(IOPort *port) = nullptr;
  // Writes a raw level. Also from action threads, under the port's lock.
  void (*set_state)(IOPort *port, std::int32_t level) = nullptr;
  // Reports changes of the input from now on. Armed already: arms anew, never twice.
  void (*start_watch)(IOPort *port) = nullptr;
  void (*set_direction)(IOPort *port, bool input) = nullptr;
  // One attribute of the backend's part of the hardware description. Called before setup.
  void (*set_property)(IOPort *port, const char *section, const char *key,
                       const char *value) = nullptr;
  // Releases everything, the private record included.
  void (*free)(IOPort *port) = nullptr;
  // Releases what the backend holds while its port is out of service. Null: `free` serves.
  void (*drop)(IOPort *port) = nullptr;
};
