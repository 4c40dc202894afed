// What the tests of the legacy bridge share: ports in the registry, files, and the log.
#pragma once

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "backends/check-backend.h"
#include "port/ioport.h"
#include "support/log-capture.h"

// Ports on the check backend, in an otherwise empty registry.
class LegacyTest : public testing::Test {
 public:
  LegacyTest(const LegacyTest &) = delete;
  LegacyTest &operator=(const LegacyTest &) = delete;

 protected:
  LegacyTest();
  ~LegacyTest() override;

  // The registry keeps the port for as long as the test runs.
  static IOPort *add_port(int number, PortType type, const char *flag = "ioport");
  // Writes a file that goes with the test, and gives its path.
  std::string write_file(const char *name, const std::string &contents);
  std::string path_of(const char *name) const;
  LogCapture &log() { return log_; }

 private:
  LogCapture log_;
  std::string directory_;
  std::vector<std::string> files_;
};

std::string read_file(const std::string &path);
std::string input_name(const IOPort *ioport);
std::string output_name(const IOPort *ioport);
