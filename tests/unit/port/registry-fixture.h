// Ports in the registry, told apart by their names.
#pragma once

#include <optional>
#include <string>
#include <utility>

#include "port/port-registry.h"
#include "support/port-fixture.h"

class Registry : public PortFixture {
 protected:
  // Puts the port in the registry; the references are the registry's alone.
  static void add(PortBuilder &builder) { (void)builder.registered(); }
  static void add(PortBuilder &&builder) { (void)builder.registered(); }

  static std::string id_of(const IOPortRef &port) {
    return port ? io_port_get_id(port.get()).value_or("(without name)") : "(none)";
  }
  static Lines ids_in_order() {
    Lines ids;
    const auto lock = port_registry_lock();
    for (const IOPort *port : port_registry_active_locked()) {
      ids.push_back(io_port_get_id(port).value_or("(without name)"));
    }
    return ids;
  }
  // How many parked ports came back, where none of them has to wait for a service.
  static std::optional<std::size_t> retry_parked() {
    std::optional<std::size_t> back;
    port_registry_retry_parked([&](std::size_t count) { back = count; });
    return back;
  }
  static std::optional<std::string> input_name(std::uint32_t number) { return names(number).first; }
  static std::optional<std::string> output_name(std::uint32_t number) {
    return names(number).second;
  }

 private:
  static std::pair<std::optional<std::string>, std::optional<std::string>> names(
      std::uint32_t number) {
    std::pair<std::optional<std::string>, std::optional<std::string>> both;
    io_port_get_names(port_registry_find(number).get(), &both.first, &both.second);
    return both;
  }
};

inline PortBuilder port(const char *id, int number) {
  PortBuilder builder;
  builder.id(id).number(number);
  return builder;
}

inline PortBuilder unflagged(const char *id, int number) {
  PortBuilder builder = port(id, number);
  builder.flag("ioport", "false");
  return builder;
}

inline PortBuilder failing(const char *id, int number) {
  PortBuilder builder = port(id, number);
  builder.property("any", "setup", "fail");
  return builder;
}

// Lets the next set-up of the port succeed.
inline void repair(const IOPortRef &broken) {
  check_record(broken).properties.clear();
}
