// The daemon's ports. The active list holds the ports in service, the parked list the optional ones
// whose set-up failed or that were dropped. Both run from the newest port to the oldest, and hold
// one reference for each port.
//
// Every operation takes the registry lock by itself unless it says that the caller holds it.
// Lookups give references, so a port stays alive however long a caller keeps it. Any thread, but
// for the passes that call into backends: those belong to the main thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <mutex>
#include <string>
#include <vector>

#include "port/ioport.h"

// Takes a reference of its own.
void port_registry_add(IOPort *port);
// The n-th port from the newest, or none.
IOPortRef port_registry_nth(std::size_t n);
// The port that clients mean by a number: flagged "ioport" or "virtual", the first declared where
// several qualify.
IOPortRef port_registry_find(std::uint32_t number);
IOPortRef port_registry_find_parked(std::uint32_t number);
IOPortRef port_registry_get_by_id(const std::string &id);
// The first port of that identifier, without a reference. The caller holds the lock.
IOPort *port_registry_find_by_id_locked(const std::string &id);
void port_registry_remove_by_id(const std::string &id);

std::size_t port_registry_count();
// Ports flagged "ioport", by the role that they have now.
std::uint32_t port_registry_count_outputs();
std::uint32_t port_registry_count_inputs();
// In registry order.
std::vector<std::uint32_t> port_registry_supervisable_numbers();
// Whether a port with the shared any-port event is active. Event callbacks come here: whoever calls
// into the event library must not hold the lock.
bool port_registry_any_port_active();

// Calls `visit` for every active port that has a backend, under the lock.
void port_registry_for_each(const std::function<void(IOPort *)> &visit);
// Names the ports that have none yet: "Input 1", "Output 1" and so on, by rising port number.
void port_registry_assign_default_names();
// Sets up every port. An optional port that fails is parked. Neither pass holds the lock while it
// calls a backend. This one serves the main loop's sources while ports wait for a service, so it is
// for start-up; the other one does not wait.
void port_registry_setup_all();
// Tries the parked ports again and calls `done` with the number that came back, when the last of
// them has settled. What is asked for during a pass begins with the next one.
void port_registry_retry_parked(std::function<void(std::size_t)> done);
// Parks an optional port; others stay where they are.
void port_registry_park(IOPort *port);
void port_registry_arm_watches();
// Says in the log how many ports are in service, and why each of the others is not.
void port_registry_log_service();
// Without the lock, since the event library may ask for the state of ports while it declares.
void port_registry_declare_events();
// Frees every port, whoever still holds references. Last thing at shutdown; waits for running
// action sequences, which it ends.
void port_registry_drop_all();

// For callers that walk the list themselves.
[[nodiscard]] std::unique_lock<std::mutex> port_registry_lock();
// Newest first. The caller holds the lock.
const std::vector<IOPort *> &port_registry_active_locked();
