// A settings file in a temporary directory, and ports that are read from it and written to it.
#pragma once

#include <unistd.h>

#include <string>
#include <string_view>

#include "settings/param.h"
#include "support/output-capture.h"
#include "support/port-fixture.h"
#include "support/temp-dir.h"

class Settings : public PortFixture {
 protected:
  ~Settings() override { param_free_configuration(); }

  TempDir dir;
  const std::string file = dir.path("portd.conf");

  // Brings a file of those contents into memory.
  bool hold(std::string_view contents) {
    return param_read_configuration(dir.write("portd.conf", contents));
  }
  // Applies a file of those contents to the port. What is printed ends up in `errors` and `output`.
  bool apply(const IOPortRef &port, std::string_view contents) {
    EXPECT_TRUE(hold(contents));
    OutputCapture standard_error(STDERR_FILENO);
    OutputCapture standard_output(STDOUT_FILENO);
    const bool ok = param_get_conf_vals(port.get());
    output = standard_output.text();
    errors = standard_error.text();
    return ok;
  }
  // Saves the port and gives the file's contents.
  std::string saved(const IOPortRef &port) {
    OutputCapture standard_error(STDERR_FILENO);
    param_save_for_port(port.get(), file);
    errors = standard_error.text();
    return contents();
  }
  std::string contents() const { return dir.read("portd.conf"); }

  std::string output;
  std::string errors;
};
