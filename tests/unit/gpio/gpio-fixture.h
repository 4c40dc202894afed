// A port on the GPIO backend, whose lines are the tests'.
#pragma once

#include <vector>

#include "backend-fixture.h"
#include "fake-ugpio.h"
#include "seams.h"

class GpioBackendTest : public BackendTest {
 protected:
  GpioBackendTest() {
    fake_ugpio().reset();
    seams() = {};
  }

  IOPort *make(PortType type, const std::vector<Property> &properties) {
    return make_port("gpio", type, properties);
  }
  IOPort *make_input() { return make(PORT_INPUT, {{"input", "pin", "1"}}); }
  IOPort *make_output() { return make(PORT_OUTPUT, {{"output", "pin", "2"}}); }
  IOPort *make_configurable() {
    return make(PORT_CONFIGURABLE,
                {{"input", "pin", "1"}, {"output", "pin", "2"}, {"io_ctrl", "pin", "3"}});
  }
  // Set up and with its watch armed.
  IOPort *make_watched_input() {
    IOPort *input = make_input();
    EXPECT_TRUE(io_port_setup(input));
    io_port_set_watch(input);
    return input;
  }
  static FakeLine &line(const char *name) { return fake_ugpio().line(name); }
};
