// Preloaded into the daemon: character devices of converters that are FIFOs and plain files.
//
// /dev/iio:deviceN is found as /run/converters/iio:deviceN. Asked for its event descriptor, it gives
// out the FIFO beside it whose name ends in ".events". A spidev answers a message of two transfers
// with what "<node>.answer" says, "error ERRNO" or two bytes in hexadecimal, and keeps a record of
// what it is told in "<node>.calls".
#define _GNU_SOURCE
#include <dlfcn.h>
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <linux/iio/events.h>
#include <linux/spi/spidev.h>
#include <stdarg.h>
#include <stdint.h>
#include <stdio.h>
#include <string.h>
#include <sys/ioctl.h>
#include <sys/syscall.h>
#include <unistd.h>

static const char node_prefix[] = "/dev/iio:device";

static int open_mapped(const char *path, int flags, mode_t mode) {
  char mapped[PATH_MAX];
  if (strncmp(path, node_prefix, sizeof node_prefix - 1) == 0) {
    snprintf(mapped, sizeof mapped, "/run/converters/%s", path + strlen("/dev/"));
    path = mapped;
  }
  return (int)syscall(SYS_openat, AT_FDCWD, path, flags, mode);
}

static mode_t mode_argument(int flags, va_list arguments) {
  return (flags & (O_CREAT | __O_TMPFILE)) != 0 ? va_arg(arguments, mode_t) : 0;
}

int open(const char *path, int flags, ...) {
  va_list arguments;
  va_start(arguments, flags);
  const mode_t mode = mode_argument(flags, arguments);
  va_end(arguments);
  return open_mapped(path, flags, mode);
}

int open64(const char *path, int flags, ...) {
  va_list arguments;
  va_start(arguments, flags);
  const mode_t mode = mode_argument(flags, arguments);
  va_end(arguments);
  return open_mapped(path, flags, mode);
}

int __open_2(const char *path, int flags) { return open_mapped(path, flags, 0); }
int __open64_2(const char *path, int flags) { return open_mapped(path, flags, 0); }

// The path of a file beside the one that the descriptor leads to.
static void neighbour(int fd, const char *suffix, char *path, size_t size) {
  char link[64];
  char target[PATH_MAX - 64];
  snprintf(link, sizeof link, "/proc/self/fd/%d", fd);
  const ssize_t length = readlink(link, target, sizeof target - 1);
  target[length > 0 ? length : 0] = '\0';
  snprintf(path, size, "%s%s", target, suffix);
}

static void record(int fd, const char *call) {
  char path[PATH_MAX];
  neighbour(fd, ".calls", path, sizeof path);
  const int calls = open(path, O_WRONLY | O_APPEND | O_CLOEXEC);
  if (calls >= 0) {
    dprintf(calls, "%s\n", call);
    close(calls);
  }
}

static int transfer(int fd, const struct spi_ioc_transfer *transfers) {
  char path[PATH_MAX];
  char text[64] = "";
  const uint8_t *sent = (const uint8_t *)(uintptr_t)transfers[0].tx_buf;
  uint8_t *received = (uint8_t *)(uintptr_t)transfers[1].rx_buf;
  snprintf(text, sizeof text, "message %02x %02x, %u", sent[0], sent[1], transfers[1].len);
  record(fd, text);
  neighbour(fd, ".answer", path, sizeof path);
  const int answer = open(path, O_RDONLY | O_CLOEXEC);
  const ssize_t length = read(answer, text, sizeof text - 1);
  close(answer);
  text[length > 0 ? length : 0] = '\0';
  unsigned int first = 0;
  unsigned int second = 0;
  if (sscanf(text, "error %u", &first) == 1) {
    errno = (int)first;
    return -1;
  }
  sscanf(text, "%2x%2x", &first, &second);
  received[0] = (uint8_t)first;
  received[1] = (uint8_t)second;
  return 4;
}

int ioctl(int fd, unsigned long request, ...) {
  char text[PATH_MAX];
  va_list arguments;
  va_start(arguments, request);
  void *argument = va_arg(arguments, void *);
  va_end(arguments);
  if (request == IIO_GET_EVENT_FD_IOCTL && fd >= 0) {
    neighbour(fd, ".events", text, sizeof text);
    *(int *)argument = open(text, O_RDONLY | O_NONBLOCK);
    return *(int *)argument < 0 ? -1 : 0;
  }
  if (request == SPI_IOC_WR_BITS_PER_WORD && fd >= 0) {
    snprintf(text, sizeof text, "bits %u", *(uint8_t *)argument);
    record(fd, text);
    return 0;
  }
  if (request == SPI_IOC_WR_MAX_SPEED_HZ && fd >= 0) {
    snprintf(text, sizeof text, "speed %u", *(uint32_t *)argument);
    record(fd, text);
    return 0;
  }
  if (request == SPI_IOC_MESSAGE(2) && fd >= 0) {
    return transfer(fd, argument);
  }
  return (int)syscall(SYS_ioctl, fd, request, argument);
}
