// Converters as the tests want them: every ioctl of the process comes here. A message to a spidev
// is answered whatever file it is, and recorded. A character device of an industrial I/O converter
// gives out the FIFO beside it, "<path>.events", as its event descriptor.
#pragma once

#include <linux/spi/spidev.h>

#include <array>
#include <cstdint>
#include <string>
#include <vector>

struct SpiMessage {
  int fd;
  unsigned long request;
  std::array<spi_ioc_transfer, 2> transfers;
  std::array<std::uint8_t, 2> sent;
  std::array<std::uint8_t, 2> receive_buffer;  // as it was before the transfer
};

struct FakeSpidev {
  std::array<std::uint8_t, 2> answer{};  // the received bytes
  int error = 0;                         // an errno: every message fails
  bool scribbles = false;                // a failing message leaves its bytes in the buffer
  int bits_error = 0;                    // an errno for each setting
  int speed_error = 0;
  std::vector<std::string> settings;  // "bits 8", "speed 1000000"
  std::vector<SpiMessage> messages;

  void answer_sample(int sample) {
    answer = {static_cast<std::uint8_t>(sample >> 4), static_cast<std::uint8_t>(sample << 4)};
  }
  // The settings, then the messages: "send 1f 0, receive 2".
  std::vector<std::string> calls() const;
};

// The one of the process.
FakeSpidev &fake_spidev();
