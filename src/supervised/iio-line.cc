#include "supervised/iio-line.h"

#include <unistd.h>

#include <cerrno>
#include <utility>

#include "base/log.h"
#include "supervised/iio-sysfs.h"

namespace {

IioLine *line_of(IOPort *port) {
  return static_cast<IioLine *>(io_port_backend_data(port));
}

// The daemon was root when it first opened the device; it no longer is. A file that the kernel does
// not have is none that it refuses.
bool is_refused(const std::string &path, int mode) {
  return access(path.c_str(), mode) != 0 && errno != ENOENT;
}

// The first file that the daemon may not use, with errno; empty when it may use all of them.
std::string find_refused(const IioLine &line, int device) {
  std::string node = line.node_of(device);
  if (is_refused(node, R_OK)) {
    return node;
  }
  for (auto &path : line.attributes_of(device)) {
    if (is_refused(path, W_OK)) {
      return std::move(path);
    }
  }
  return {};
}

bool is_usable(IOPort *port, IioLine *line, int device) {
  const std::string refused = find_refused(*line, device);
  const int reason = errno;
  if (!refused.empty() && !std::exchange(line->refusal_logged, true)) {
    log_warning("Port %s: %s is back, but %s can't be opened: %s", io_port_describe(port),
                line->device_name().c_str(), refused.c_str(), g_strerror(reason));
  }
  return refused.empty();
}

bool reconnect(IOPort *port, IioLine *line) {
  const int device = iio_find_number(line->device_name(), IIO_KIND_DEVICE);
  if (device < 0 || !is_usable(port, line, device) || !line->connect(port)) {
    return false;
  }
  line->refusal_logged = false;
  log_warning("Port %s: %s is back", io_port_describe(port), line->device_name().c_str());
  return true;
}

bool attempt(gpointer user_data) {
  auto *port = static_cast<IOPort *>(user_data);
  IioLine *line = line_of(port);
  if (line->is_gone() && !reconnect(port, line)) {
    return false;
  }
  return line->resume(port);
}

}  // namespace

void iio_retry_later(IOPort *port) {
  line_of(port)->retry.start(attempt, port);
}

bool iio_retry_now(IOPort *port) {
  const bool works = attempt(port);
  if (!works) {
    iio_retry_later(port);
  }
  return works;
}
