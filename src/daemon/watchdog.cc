#include "daemon/watchdog.h"

#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <optional>
#include <string_view>

#include "base/log.h"

namespace {

constexpr std::string_view kAlive = "WATCHDOG=1";
constexpr unsigned kDecimal = 10;
constexpr std::uint64_t kMicrosecondsPerMillisecond = 1000;

std::optional<std::uint64_t> number_in(const char *variable) {
  const char *text = std::getenv(variable);
  guint64 number = 0;
  if (!text ||
      !g_ascii_string_to_unsigned(text, kDecimal, 1, std::numeric_limits<std::uint64_t>::max(),
                                  &number, nullptr)) {
    return std::nullopt;
  }
  return number;
}

// Unset when the watchdog is off, or meant for another process.
std::optional<std::uint64_t> interval_us() {
  const bool for_another = std::getenv("WATCHDOG_PID") &&
                           number_in("WATCHDOG_PID") != static_cast<std::uint64_t>(getpid());
  return for_another ? std::nullopt : number_in("WATCHDOG_USEC");
}

// A name that begins with "@" is one without a file: its first byte is nul on the wire. Gives the
// size of the address, 0 for a name that is none.
socklen_t parse_address(std::string_view name, sockaddr_un &address) {
  const bool usable = (name.starts_with('/') || name.starts_with('@')) && name.size() > 1 &&
                      name.size() < sizeof address.sun_path;
  if (!usable) {
    return 0;
  }
  address.sun_family = AF_UNIX;
  std::memcpy(address.sun_path, name.data(), name.size());
  if (name.starts_with('@')) {
    address.sun_path[0] = '\0';
  }
  return static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + name.size());
}

}  // namespace

Watchdog::Watchdog() {
  const char *name = std::getenv("NOTIFY_SOCKET");
  const auto interval = interval_us();
  if (!name || !interval) {
    return;
  }
  manager_size_ = parse_address(name, manager_);
  socket_.reset(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (manager_size_ == 0 || !socket_) {
    log_warning("Could not reach the watchdog at %s", name);
    return;
  }
  const std::uint64_t half_ms = *interval / 2 / kMicrosecondsPerMillisecond;
  const auto period = std::clamp<std::uint64_t>(half_ms, 1, std::numeric_limits<guint>::max());
  tick_ = Source(g_timeout_add(static_cast<guint>(period), on_tick, this));
  on_tick(this);
}

gboolean Watchdog::on_tick(gpointer self) {
  const auto *watchdog = static_cast<const Watchdog *>(self);
  (void)sendto(watchdog->socket_.get(), kAlive.data(), kAlive.size(), MSG_NOSIGNAL,
               reinterpret_cast<const sockaddr *>(&watchdog->manager_), watchdog->manager_size_);
  return G_SOURCE_CONTINUE;
}
