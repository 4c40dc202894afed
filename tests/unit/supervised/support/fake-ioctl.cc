#include "support/fake-ioctl.h"

#include <fcntl.h>
#include <linux/iio/events.h>
#include <linux/spi/spidev.h>
#include <sys/ioctl.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdarg>
#include <cstring>
#include <sstream>

namespace {

int finish(int error, const std::string &call) {
  fake_spidev().calls.push_back(call);
  errno = error;
  return error == 0 ? 0 : -1;
}

template <typename T>
T *pointer(std::uint64_t address) {
  // NOLINTNEXTLINE(performance-no-int-to-ptr): the kernel takes pointers as numbers.
  return reinterpret_cast<T *>(static_cast<std::uintptr_t>(address));
}

int transfer(const spi_ioc_transfer *transfers) {
  auto &device = fake_spidev();
  std::ostringstream call;
  call << "send" << std::hex;
  for (unsigned int i = 0; i < transfers[0].len; ++i) {
    call << ' ' << static_cast<int>(pointer<std::uint8_t>(transfers[0].tx_buf)[i]);
  }
  call << ", receive " << transfers[1].len;
  if (transfers[0].rx_buf != 0 || transfers[1].tx_buf != 0) {
    call << ", both ways";
  }
  if (device.transfer_error == 0) {
    std::memcpy(pointer<std::uint8_t>(transfers[1].rx_buf), device.received, transfers[1].len);
  }
  return finish(device.transfer_error, call.str());
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

}  // namespace

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
    return finish(fake_spidev().bits_error,
                  "bits " + std::to_string(*static_cast<std::uint8_t *>(argument)));
  }
  if (request == SPI_IOC_WR_MAX_SPEED_HZ) {
    return finish(fake_spidev().speed_error,
                  "speed " + std::to_string(*static_cast<std::uint32_t *>(argument)));
  }
  if (request == IIO_GET_EVENT_FD_IOCTL) {
    return event_descriptor(fd, static_cast<int *>(argument));
  }
  if (request == SPI_IOC_MESSAGE(2)) {
    return transfer(static_cast<const spi_ioc_transfer *>(argument));
  }
  return static_cast<int>(syscall(SYS_ioctl, fd, request, argument));
}
