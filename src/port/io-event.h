// The event descriptions of a port, as the hardware description gives them. Declaring and sending
// them is not the port's affair: see port-listener.h.
#pragma once

#include <atomic>
#include <cstdint>
#include <list>
#include <optional>
#include <string>

struct IoEventKey {
  std::optional<std::string> name;
  std::optional<std::string> value;  // a literal, or a word that stands for a state of the port
  std::optional<std::string> key_nice_name;
  std::optional<std::string> value_nice_name;
  std::optional<std::string> type;  // "int", "bool", "string" or "double"
  bool property = false;            // the key holds the state of a property event
};

// A value that threads share and that can still be copied along with the description around it.
template <typename T>
struct SharedValue : std::atomic<T> {
  using std::atomic<T>::atomic;
  using std::atomic<T>::operator=;
  SharedValue(const SharedValue &other) : std::atomic<T>(other.load()) {}
};

struct IoEvent {
  std::optional<std::string> name;
  bool output = true;             // applies while the port is an output
  bool input = true;              // applies while the port is an input
  bool supervised_input = false;  // applies while the port is a supervised input
  bool declare_only = false;      // declared, never sent
  std::list<IoEventKey> keys;     // newest first

  // What changes while the daemon runs. An action thread sends while the main thread declares.
  SharedValue<std::uint32_t> id = 0;         // of the declaration; 0 while not declared
  SharedValue<bool> filter_reset = false;    // the next send passes the repeat filter
  SharedValue<std::int32_t> last_value = 0;  // of the last send
};

// Newest first. A list, since declarations refer to events while new ones are put in front.
using IoEvents = std::list<IoEvent>;
