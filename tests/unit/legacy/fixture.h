// What the tests of the legacy bridge share: ports in the registry, files, and the log.
#pragma once

#include <gtest/gtest.h>

#include <string>

#include "backends/check-backend.h"
#include "port/ioport.h"
#include "support/log-capture.h"
#include "support/temp-dir.h"

// Ports on the check backend, in an otherwise empty registry.
class LegacyTest : public testing::Test {
 public:
  LegacyTest(const LegacyTest &) = delete;
  LegacyTest &operator=(const LegacyTest &) = delete;

 protected:
  LegacyTest();
  ~LegacyTest() override;

  // The registry keeps the port for as long as the test runs.
  static IOPort *add_port(int number, PortType type);
  // Writes a file that goes with the test, and gives its path.
  std::string write_file(const char *name, const std::string &contents) const {
    return directory_.write(name, contents);
  }
  std::string path_of(const char *name) const { return directory_.path(name); }
  LogCapture &log() { return log_; }

 private:
  LogCapture log_;
  TempDir directory_;
};

std::string read_file(const std::string &path);
std::string input_name(const IOPort *port);
std::string output_name(const IOPort *port);
