// A spidev as the test wants it: every ioctl of the process comes here. A character device of an
// industrial I/O converter gives out the FIFO beside it, "<path>.events", as its event descriptor.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

struct FakeSpidev {
  std::uint8_t received[2] = {0, 0};
  int transfer_error = 0;  // an errno; 0: transfers work
  int bits_error = 0;
  int speed_error = 0;
  // "bits 8", "speed 1000000", "send 1f 00, receive 2"
  std::vector<std::string> calls;
};

// The one of the process.
FakeSpidev &fake_spidev();
