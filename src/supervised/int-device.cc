#include "supervised/int-device.h"

#include <fcntl.h>
#include <glib-unix.h>
#include <linux/iio/events.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <utility>
#include <vector>

#include "base/glib-ptr.h"
#include "base/log.h"

namespace {

constexpr guint kCheckInterval = 1;  // seconds

struct Watched {
  IntListener listener;
  const IntDevice *device;
};

std::vector<std::weak_ptr<IntDevice>> devices;
std::vector<Watched> watched_ports;

IntDevicePtr find_device(const std::string &path) {
  std::erase_if(devices, [](const auto &device) { return device.expired(); });
  for (const auto &entry : devices) {
    IntDevicePtr device = entry.lock();
    if (device && device->path == path && !device->gone) {
      return device;
    }
  }
  return nullptr;
}

// The descriptor is read when there is an event, yet a read must never block the daemon.
UniqueFd get_event_descriptor(const UniqueFd &node) {
  int fd = -1;
  if (ioctl(node.get(), IIO_GET_EVENT_FD_IOCTL, &fd) < 0 || fd < 0) {
    const int reason = errno;
    log_critical("Failed to open device: %s", g_strerror(reason));
    errno = reason;
    return {};
  }
  UniqueFd events(fd);
  Error error;
  if (!g_unix_set_fd_nonblocking(fd, TRUE, error.out()) || fcntl(fd, F_SETFD, FD_CLOEXEC) < 0) {
    log_warning("Could not prepare the event descriptor: %s", g_strerror(errno));
  }
  return events;
}

UniqueFd open_events(const std::string &path) {
  const UniqueFd node(open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
  if (!node) {
    const int reason = errno;
    log_critical("Failed to open device %s: %s", path.c_str(), g_strerror(reason));
    errno = reason;
    return {};
  }
  return get_event_descriptor(node);
}

auto find_watched(const IOPort *port) {
  return std::find_if(watched_ports.begin(), watched_ports.end(),
                      [&](const Watched &watched) { return watched.listener.port == port; });
}

// Ends the watch. The descriptor stays: its ports watch it again, or open the device anew when it
// is gone.
std::vector<IntListener> end_watch(IntDevice *device) {
  std::vector<IntListener> listeners;
  std::erase_if(watched_ports, [&](const Watched &watched) {
    if (watched.device == device) {
      listeners.push_back(watched.listener);
    }
    return watched.device == device;
  });
  device->users = 0;
  device->watch.reset();
  device->check.reset();
  return listeners;
}

enum class Read { kEvent, kNothing, kFailed };

Read read_event(const IntDevice *device, iio_event_data *event) {
  const ssize_t length = read(device->events.get(), event, sizeof *event);
  if (length == static_cast<ssize_t>(sizeof *event)) {
    return Read::kEvent;
  }
  if (length < 0 && (errno == EAGAIN || errno == EINTR)) {
    return Read::kNothing;
  }
  if (length >= 0) {
    errno = length == 0 ? ENODEV : EIO;
  }
  return Read::kFailed;
}

// The ports of that channel, on whatever device, their events disabled.
std::vector<IntListener> disable_channel(int channel) {
  std::vector<IntListener> listeners;
  for (const auto &watched : watched_ports) {
    if (std::cmp_equal(watched.listener.channel, channel)) {
      watched.listener.disable(watched.listener.port);
      listeners.push_back(watched.listener);
    }
  }
  return listeners;
}

// What to call for a wake-up, and whom. The watch ends with a device that can't be read, for it
// would wake the main loop without end.
using Call = void (*IntListener::*)(IOPort *port);

Call handle_event(IntDevice *device, GIOCondition condition, std::vector<IntListener> *listeners) {
  iio_event_data event{};
  Read result = Read::kFailed;
  if ((condition & G_IO_IN) != 0) {
    result = read_event(device, &event);
  } else {
    errno = ENODEV;
  }
  if (result == Read::kFailed) {
    device->gone = errno == ENODEV;
    log_critical("read Error: %s", g_strerror(errno));
    *listeners = end_watch(device);
    return &IntListener::lost;
  }
  if (result == Read::kEvent) {
    *listeners = disable_channel(IIO_EVENT_CODE_EXTRACT_CHAN(event.id));
  }
  return &IntListener::handle;
}

gboolean on_event(gint /*fd*/, GIOCondition condition, gpointer user_data) {
  std::vector<IntListener> listeners;
  const Call call = handle_event(static_cast<IntDevice *>(user_data), condition, &listeners);
  for (const auto &listener : listeners) {
    (listener.*call)(listener.port);
  }
  return G_SOURCE_CONTINUE;
}

// The kernel does not wake a poll when the device goes away, so it is checked for.
gboolean check_device(gpointer user_data) {
  return on_event(-1, G_IO_IN, user_data);
}

}  // namespace

IntDevicePtr int_device_get(const std::string &path) {
  IntDevicePtr device = find_device(path);
  if (device) {
    return device;
  }
  UniqueFd events = open_events(path);
  if (!events) {
    return nullptr;
  }
  device = std::make_shared<IntDevice>();
  device->path = path;
  device->events = std::move(events);
  devices.push_back(device);
  return device;
}

void int_device_watch(const IntDevicePtr &device, const IntListener &listener) {
  if (find_watched(listener.port) == watched_ports.end()) {
    watched_ports.push_back({listener, device.get()});
    ++device->users;
  }
  if (!device->watch) {
    device->watch = Source(g_unix_fd_add(device->events.get(), G_IO_IN, on_event, device.get()));
    device->check = Source(g_timeout_add_seconds(kCheckInterval, check_device, device.get()));
  }
}

void int_device_unwatch(const IntDevicePtr &device, const IOPort *port) {
  const auto watched = find_watched(port);
  if (watched == watched_ports.end()) {
    return;
  }
  watched_ports.erase(watched);
  if (device->users > 0) {
    --device->users;
  }
  if (device->users == 0) {
    device->watch.reset();
    device->check.reset();
  }
}
