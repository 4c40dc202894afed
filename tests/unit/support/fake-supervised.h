// A backend whose ports can be supervised, driven by the test. It takes the place of a backend kind
// that the tests of the port layer have no other use for.
#pragma once

#include <string>

#include "port/ioport.h"
#include "support/recording-listener.h"

inline constexpr BackendKind kFakeSupervisedKind = BACKEND_SPI;

struct FakeSupervisedData : PortBackendData {
  bool supervisable = true;
  bool refuses_ranges = false;
  SupervisedRanges ranges;
  bool readout_fails = false;
  SupervisedRangeState line = SUPERVISED_STATE_OPEN;
  std::uint32_t line_level = 0;
  std::uint32_t raw = 0;
  Lines calls;  // "set_supervised on", "set_direction input", "start_watch", "set_ranges", "setup"
};

// Which operations of supervision the backend serves.
enum class FakeSlots { kAll, kNoRanges, kOnlyIsSupervisable };

// After backends_register(). Ports made before keep the table that they have.
void register_fake_supervised(FakeSlots slots = FakeSlots::kAll);
FakeSupervisedData &fake_record(const IOPortRef &port);
