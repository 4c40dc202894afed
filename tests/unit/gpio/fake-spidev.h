// spidev as the code under test sees it: the linker redirects its ioctl calls here.
#pragma once

#include <linux/spi/spidev.h>

#include <array>
#include <cstdint>
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
  std::vector<SpiMessage> messages;

  void answer_sample(int sample) {
    answer = {static_cast<std::uint8_t>(sample >> 4), static_cast<std::uint8_t>(sample << 4)};
  }
};

FakeSpidev &fake_spidev();
