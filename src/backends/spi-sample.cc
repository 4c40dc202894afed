#include "backends/spi-sample.h"

#include <linux/spi/spidev.h>
#include <sys/ioctl.h>

#include <array>

namespace {

using Bytes = std::array<std::uint8_t, 2>;

std::uint64_t address_of(const Bytes &bytes) {
  return reinterpret_cast<std::uintptr_t>(bytes.data());
}

// The high eight bits come first, the low four in the upper half of the second byte.
std::int32_t sample_of(const Bytes &received) {
  return received[0] << 4 | received[1] >> 4;
}

}  // namespace

std::optional<std::int32_t> spi_read_sample(int fd, std::uint8_t address) {
  const Bytes sent{address, 0};
  Bytes received{};
  std::array<spi_ioc_transfer, 2> transfers{};
  transfers[0].tx_buf = address_of(sent);
  transfers[0].len = sent.size();
  transfers[1].rx_buf = address_of(received);
  transfers[1].len = received.size();
  if (ioctl(fd, SPI_IOC_MESSAGE(2), transfers.data()) < 0) {
    return std::nullopt;
  }
  return sample_of(received);
}
