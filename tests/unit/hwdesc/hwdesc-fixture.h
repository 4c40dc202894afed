// Documents in a temporary directory and the ports that come of them.
#pragma once

#include <string>
#include <string_view>

#include "hwdesc/hwdesc.h"
#include "support/port-fixture.h"
#include "support/temp-dir.h"

class HardwareDescription : public PortFixture {
 protected:
  TempDir dir;

  bool load(std::string_view document) { return hwdesc_load_file(dir.write("conf.xml", document)); }
  // A document of one port called "p", which the elements given are about.
  bool load_port(std::string_view elements) {
    return load("<ports><port name='p'>" + std::string(elements) + "</port></ports>");
  }
  static IOPortRef port(const char *id = "p") { return port_registry_get_by_id(id); }
  static bool is_configurable_input(const IOPortRef &p) {
    return io_port_get_type(p.get()) == PORT_CONFIGURABLE && io_port_direction_input(p.get());
  }
  static Lines ids() {
    Lines ids;
    const auto lock = port_registry_lock();
    for (const IOPort *p : port_registry_active_locked()) {
      ids.emplace_back(io_port_describe(p));
    }
    return ids;
  }
  // What is said of a document that can't be parsed: that, and then where and why.
  bool took_parse_failure(const std::string &path) {
    return log.took_critical("Couldn't parse markup file (" + path + ")\n") &&
           log.took_containing(G_LOG_LEVEL_WARNING, path + ":");
  }
  bool took_parse_failure() { return took_parse_failure(dir.path("conf.xml")); }
};
