#include "platform/host/log-stream.h"

#include <glib.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstddef>

namespace {

// Long enough for a reader that is busy, short enough for callers on the bus.
constexpr int kWriteTimeoutMs = 100;
constexpr std::int64_t kMicrosecondsPerMs = 1000;

// Waits until the reader takes something.
bool wait_writable(int fd, std::int64_t deadline_us) {
  pollfd entry = {.fd = fd, .events = POLLOUT, .revents = 0};
  while (true) {
    const std::int64_t left_us = std::max<std::int64_t>(deadline_us - g_get_monotonic_time(), 0);
    const int ready = poll(&entry, 1, static_cast<int>(left_us / kMicrosecondsPerMs));
    if (ready >= 0 || errno != EINTR) {
      return ready > 0;
    }
  }
}

// A pipe that can be written to takes this much without waiting. The descriptor is shared with
// others, so it is not made non-blocking.
ssize_t write_some(int fd, std::string_view text) {
  const std::size_t size = std::min<std::size_t>(text.size(), PIPE_BUF);
  const ssize_t sent = send(fd, text.data(), size, MSG_DONTWAIT | MSG_NOSIGNAL);
  return sent < 0 && errno == ENOTSOCK ? write(fd, text.data(), size) : sent;
}

}  // namespace

bool LogStream::write_before(std::string_view text, int timeout_ms) {
  const std::int64_t deadline_us = g_get_monotonic_time() + timeout_ms * kMicrosecondsPerMs;
  const std::size_t whole = text.size();
  while (!text.empty() && wait_writable(fd_, deadline_us)) {
    const ssize_t written = write_some(fd_, text);
    if (written > 0) {
      text.remove_prefix(static_cast<std::size_t>(written));
    } else if (errno != EINTR && errno != EAGAIN) {
      break;
    }
  }
  truncated_ = truncated_ || (!text.empty() && text.size() < whole);
  return text.empty();
}

void LogStream::write_line(const std::string &line) {
  const std::lock_guard lock(lock_);
  const int timeout_ms = lost_ == 0 ? kWriteTimeoutMs : 0;
  if (truncated_ && write_before("\n", timeout_ms)) {
    truncated_ = false;
  }
  if (lost_ > 0 && !truncated_ && write_before(describe_loss_(lost_), timeout_ms)) {
    lost_ = 0;
  }
  if (lost_ > 0 || truncated_ || !write_before(line, timeout_ms)) {
    ++lost_;
  }
}
