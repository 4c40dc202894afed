#include "fake-spidev.h"

#include <algorithm>
#include <bit>
#include <cerrno>

// The linker's option --wrap gives the call this name.
int fake_ioctl(int fd, unsigned long request, spi_ioc_transfer *transfers) asm("__wrap_ioctl");

namespace {

std::uint8_t *bytes_of(std::uint64_t address) {
  return std::bit_cast<std::uint8_t *>(static_cast<std::uintptr_t>(address));
}

}  // namespace

FakeSpidev &fake_spidev() {
  static FakeSpidev fake;
  return fake;
}

int fake_ioctl(int fd, unsigned long request, spi_ioc_transfer *transfers) {
  FakeSpidev &fake = fake_spidev();
  SpiMessage message{.fd = fd,
                     .request = request,
                     .transfers = {transfers[0], transfers[1]},
                     .sent = {},
                     .receive_buffer = {}};
  std::copy_n(bytes_of(transfers[0].tx_buf), message.sent.size(), message.sent.begin());
  std::uint8_t *received = bytes_of(transfers[1].rx_buf);
  std::copy_n(received, message.receive_buffer.size(), message.receive_buffer.begin());
  fake.messages.push_back(message);
  if (fake.error == 0 || fake.scribbles) {
    std::copy(fake.answer.begin(), fake.answer.end(), received);
  }
  errno = fake.error;
  return fake.error == 0 ? 4 : -1;
}
