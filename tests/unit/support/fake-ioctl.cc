#include "support/fake-ioctl.h"

#include <fcntl.h>
#include <linux/iio/events.h>
#include <sys/ioctl.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <bit>
#include <cerrno>
#include <climits>
#include <cstdarg>
#include <sstream>

namespace {

int finish(int error, int result) {
  errno = error;
  return error == 0 ? result : -1;
}

int set(int error, const std::string &setting) {
  fake_spidev().settings.push_back(setting);
  return finish(error, 0);
}

std::uint8_t *bytes_of(std::uint64_t address) {
  return std::bit_cast<std::uint8_t *>(static_cast<std::uintptr_t>(address));
}

int transfer(int fd, unsigned long request, const spi_ioc_transfer *transfers) {
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
  return finish(fake.error, 4);
}

int event_descriptor(int fd, int *events) {
  char path[PATH_MAX] = "";
  const std::string link = "/proc/self/fd/" + std::to_string(fd);
  const ssize_t length = readlink(link.c_str(), path, sizeof path - 1);
  const std::string fifo =
      std::string(path, length > 0 ? static_cast<size_t>(length) : 0) + ".events";
  *events = open(fifo.c_str(), O_RDONLY | O_NONBLOCK);
  return *events < 0 ? -1 : 0;
}

std::string describe(const SpiMessage &message) {
  std::ostringstream text;
  text << "send" << std::hex;
  for (const std::uint8_t byte : message.sent) {
    text << ' ' << static_cast<int>(byte);
  }
  text << ", receive " << message.transfers[1].len;
  if (message.transfers[0].rx_buf != 0 || message.transfers[1].tx_buf != 0) {
    text << ", both ways";
  }
  return text.str();
}

}  // namespace

std::vector<std::string> FakeSpidev::calls() const {
  std::vector<std::string> texts = settings;
  std::transform(messages.begin(), messages.end(), std::back_inserter(texts), describe);
  return texts;
}

FakeSpidev &fake_spidev() {
  static FakeSpidev device;
  return device;
}

extern "C" int ioctl(int fd, unsigned long request, ...) noexcept {
  va_list arguments;
  va_start(arguments, request);
  void *argument = va_arg(arguments, void *);
  va_end(arguments);
  if (fcntl(fd, F_GETFD) < 0) {
    return -1;
  }
  if (request == SPI_IOC_WR_BITS_PER_WORD) {
    return set(fake_spidev().bits_error,
               "bits " + std::to_string(*static_cast<std::uint8_t *>(argument)));
  }
  if (request == SPI_IOC_WR_MAX_SPEED_HZ) {
    return set(fake_spidev().speed_error,
               "speed " + std::to_string(*static_cast<std::uint32_t *>(argument)));
  }
  if (request == IIO_GET_EVENT_FD_IOCTL) {
    return event_descriptor(fd, static_cast<int *>(argument));
  }
  if (request == SPI_IOC_MESSAGE(2)) {
    return transfer(fd, request, static_cast<const spi_ioc_transfer *>(argument));
  }
  return static_cast<int>(syscall(SYS_ioctl, fd, request, argument));
}
