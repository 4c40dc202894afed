// What every test about ports starts from: the backends are known, no port is in the registry, the
// log and the listener are read by the test.
#pragma once

#include <gtest/gtest.h>

#include "daemon/backends.h"
#include "port/port-registry.h"
#include "support/log-capture.h"
#include "support/port-builder.h"
#include "support/recording-listener.h"

// Frees the ports of the registry at its end: references that a test holds must be gone by then.
class PortFixture : public testing::Test {
 protected:
  PortFixture() { backends_register(); }
  ~PortFixture() override { port_registry_drop_all(); }

  LogCapture log;
  RecordingListener listener;
};
