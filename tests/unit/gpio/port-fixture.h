// A port on a real backend, and what it reports.
#pragma once

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "backends/backends.h"
#include "log-capture.h"
#include "port/ioport.h"
#include "port/port-listener.h"

// The logical states that ports reported since the last reset.
inline std::vector<bool> reported;

class PortTest : public testing::Test {
 protected:
  PortTest() {
    backends_register();
    reported.clear();
    port_listener().port_changed = [](const PortChange &change) {
      reported.push_back(change.state);
    };
  }
  ~PortTest() override {
    port_.reset();
    port_listener() = {};
  }

  struct Property {
    const char *section;
    const char *key;
    const char *value;
  };

  // What the loader does for a port element, short of setting it up.
  IOPort *make_port(const char *backend, PortType type, const std::vector<Property> &properties) {
    port_.reset(io_port_new());
    io_port_set_id(port_.get(), "terminal");
    io_port_set_type(port_.get(), type);
    io_port_restore_direction(port_.get(), type != PORT_OUTPUT);
    io_port_set_backend(port_.get(), io_port_backend_kind(backend).value());
    for (const auto &property : properties) {
      io_port_set_backend_property(port_.get(), property.section, property.key, property.value);
    }
    return port_.get();
  }
  IOPort *port() const { return port_.get(); }

  // Serves what is due now, and no more than that; gives the number of turns it took.
  static int serve(int limit = 100) {
    int turns = 0;
    while (turns < limit && g_main_context_iteration(nullptr, FALSE)) {
      ++turns;
    }
    return turns;
  }

  LogCapture log;

 private:
  IOPortRef port_;
};
