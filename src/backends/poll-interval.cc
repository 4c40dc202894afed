#include "backends/poll-interval.h"

#include "base/log.h"
#include "port/ioport.h"

namespace {
constexpr std::uint32_t kDefaultInterval = 10;  // milliseconds
}

std::uint32_t poll_interval(const IOPort *port, std::uint32_t described_ms) {
  if (described_ms != 0) {
    return described_ms;
  }
  log_warning("Port %s: no valid polling interval is given: polling every %u ms",
              io_port_describe(port), kDefaultInterval);
  return kDefaultInterval;
}
