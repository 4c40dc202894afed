// What a backend offers to the port layer: one constant table of operations per backend kind, and
// one private record per port.
#pragma once

#include <glib.h>

#include <cstdint>
#include <memory>

#include "port/backend-kind.h"
#include "port/supervised-range.h"

struct IOPort;

// The base of every backend's private record. The port layer makes the record when the backend is
// chosen, and destroys it when the port goes or is dropped: what a record holds is released by its
// destructor.
struct PortBackendData {
  PortBackendData() = default;
  PortBackendData(const PortBackendData &) = delete;
  PortBackendData &operator=(const PortBackendData &) = delete;
  virtual ~PortBackendData() = default;
};

// The make_record of a backend whose private record is a Record.
template <typename Record>
std::unique_ptr<PortBackendData> make_backend_record() {
  return std::make_unique<Record>();
}

// A slot that a backend does not serve is null, and then does nothing; what a caller gets instead
// stands with the slot. `port` is never null. Unless said otherwise an operation runs on the main
// thread.
struct PortFunctions {
  // Makes the private record of a port. Null: its ports have none.
  std::unique_ptr<PortBackendData> (*make_record)() = nullptr;
  // Brings the hardware up; an output starts at the raw level `initial_level`. False: it could not;
  // the reason is in the log, and noted with the port. Brought up already: begins anew; whether the
  // port is still watched then is left open until its watch is armed again. A backend that has to
  // wait for a service does that in the background (port-work.h): false for the moment, and
  // io_port_finish_setup() before the work ends where it came up. Null: always succeeds.
  bool (*setup)(IOPort *port, bool initial_level) = nullptr;
  // Also from action threads. Null: no port of the backend is.
  bool (*is_supervisable)(IOPort *port) = nullptr;
  bool (*set_supervised)(IOPort *port, bool supervised) = nullptr;
  // Also from action threads. Null: there are none.
  SupervisedRanges (*get_supervised_ranges)(IOPort *port) = nullptr;
  // Takes the list over, or refuses it and sets `error`. Null: refuses it, without an error.
  bool (*set_supervised_ranges)(IOPort *port, SupervisedRanges ranges, GError **error) = nullptr;
  // The state of the line and the level in raw converter codes, or false and `error`. Also from
  // action threads: a step that is only reported sends the state of the line with its event. Null:
  // the error says that it is not applicable.
  bool (*get_supervised_readout)(IOPort *port, SupervisedRangeState *state, std::uint32_t *level,
                                 GError **error) = nullptr;
  // The raw level, 0 or 1; 2 and more mean unknown. Also from action threads. Null: 0.
  std::uint32_t (*get_state)(IOPort *port) = nullptr;
  // Writes a raw level. Also from action threads, under the port's lock.
  void (*set_state)(IOPort *port, std::int32_t level) = nullptr;
  // Reports changes of the input from now on. Armed already: arms anew, never twice.
  void (*start_watch)(IOPort *port) = nullptr;
  void (*set_direction)(IOPort *port, bool input) = nullptr;
  // One attribute of the backend's part of the hardware description. Called before setup.
  void (*set_property)(IOPort *port, const char *section, const char *key,
                       const char *value) = nullptr;
  // Releases what the record holds while its port is out of service, and once more before the
  // record is destroyed. Null: the record is destroyed when the port is dropped; the next set-up
  // gets a new one, with the attributes set again.
  void (*drop)(IOPort *port) = nullptr;
};

// A row of the table of backends.
struct Backend {
  const char *word;  // what the hardware description calls it
  BackendKind kind;
  const PortFunctions *functions;
};
