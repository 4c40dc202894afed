// A port on a real backend, and what it reports.
#pragma once

#include <algorithm>
#include <iterator>
#include <vector>

#include "support/port-fixture.h"

using States = std::vector<bool>;

class BackendTest : public PortFixture {
 protected:
  struct Property {
    const char *section;
    const char *key;
    const char *value;
  };

  // What the loader does for a port element, short of setting it up.
  IOPort *make_port(const char *backend, PortType type, const std::vector<Property> &properties) {
    PortBuilder builder;
    builder.id("terminal").type(type).backend(io_port_backend_kind(backend).value());
    for (const auto &property : properties) {
      builder.property(property.section, property.key, property.value);
    }
    port_ = builder.build();
    return port();
  }
  IOPort *port() const { return port_.get(); }

  // The logical states that ports reported since take_reported().
  States reported() {
    const auto changes = listener.changes();
    States states;
    std::transform(changes.begin() + taken_, changes.end(), std::back_inserter(states),
                   [](const PortChange &change) { return change.state; });
    return states;
  }
  States take_reported() {
    States states = reported();
    taken_ += static_cast<std::ptrdiff_t>(states.size());
    return states;
  }

  // Serves what is due now, and no more than that; gives the number of turns it took.
  static int serve(int limit = 100) {
    int turns = 0;
    while (turns < limit && g_main_context_iteration(nullptr, FALSE)) {
      ++turns;
    }
    return turns;
  }

 private:
  IOPortRef port_;
  std::ptrdiff_t taken_ = 0;
};
