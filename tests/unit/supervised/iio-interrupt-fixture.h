// A port on the converter that watches thresholds by itself, whose files are the test's.
#pragma once

#include <linux/iio/events.h>
#include <unistd.h>

#include <filesystem>
#include <string>
#include <vector>

#include "base/unique-fd.h"
#include "support/fake-ioctl.h"
#include "support/iio-bench.h"

// A converter with channels 0 and 1. Its level is closed from 100 to 200, open from 201 to 300.
class Interrupt : public IioBench {
 protected:
  Interrupt() {
    fake_spidev() = {};
    make_converter(6, "comparator");
  }

  void make_converter(int device, const char *name) {
    make_threshold_converter(device, name);
    writer.reset(open_events(device));
  }

  std::string node(int device) const { return path("dev/iio:device" + std::to_string(device)); }

  static IOPortRef make(const std::vector<Property> &more = {}, PortType type = PORT_INPUT) {
    std::vector<Property> all = {{"input", "pin", "1"},
                                 {"io_ctrl", "pin", "2"},
                                 {"sio_ctrl", "pin", "3"},
                                 {"device", "driver", "comparator"}};
    if (type == PORT_CONFIGURABLE) {
      all.push_back({"output", "pin", "4"});
    }
    all.insert(all.end(), more.begin(), more.end());
    for (const Property &property : std::vector<Property>{{"range", "state", "closed"},
                                                          {"range", "lower", "100"},
                                                          {"range", "upper", "200"},
                                                          {"range", "state", "open"},
                                                          {"range", "lower", "201"},
                                                          {"range", "upper", "300"}}) {
      all.push_back(property);
    }
    return make_port(BACKEND_IIO_INTERRUPT, type, all);
  }

  static IOPortRef watched(const std::vector<Property> &more = {}) {
    IOPortRef port = make(more);
    io_port_restore_supervised(port.get(), true);
    EXPECT_TRUE(io_port_setup(port.get()));
    io_port_set_watch(port.get());
    return port;
  }

  void set_raw(int value, int channel = 0) const {
    write(attribute(6, "in_voltage" + std::to_string(channel) + "_raw"),
          std::to_string(value) + "\n");
  }

  std::string event_file(const char *name, int channel = 0) const {
    return read(attribute(6, "events/in_voltage" + std::to_string(channel) + "_thresh_" + name));
  }

  // "RISING/FALLING, enabled RISING/FALLING"
  std::string armed(int channel = 0) const {
    return event_file("rising_value", channel) + "/" + event_file("falling_value", channel) +
           ", enabled " + event_file("rising_en", channel) + "/" +
           event_file("falling_en", channel);
  }

  void send_events(int channel, int count = 1) {
    for (int i = 0; i < count; ++i) {
      const iio_event_data event = {.id = static_cast<__u16>(channel), .timestamp = 0};
      EXPECT_EQ(::write(writer.get(), &event, sizeof event), 16);
    }
    iterate();
  }

  UniqueFd writer;
};
