// What every test of the device tier begins and ends with.
#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <string>

#include "support/client.h"
#include "support/daemon.h"
#include "support/files.h"
#include "support/gpio-sim.h"
#include "support/line-history.h"
#include "support/wait.h"

class DeviceTest : public testing::Test {
 protected:
  // A daemon that still runs must end cleanly. A failed test shows what the daemon said.
  void TearDown() override;

  // Starts the daemon with these ports.
  void start(const std::string &ports);
  // Stops it and starts it again, with the settings that it saved.
  void restart();
  void expect_clean_stop();

  // The port's next report has this state. Reports before it are fine.
  ::testing::AssertionResult reports(int port, bool state);

  Daemon daemon_;
  Client client_;
};

// A port with its number and the "ioport" property, for documents.
std::string port_element(const std::string &name, int number, const std::string &type,
                         const std::string &backend, const std::string &sections,
                         bool optional = false);
