// The event descriptors of converters that raise threshold events. The kernel gives out one for
// each device, so the ports on a device share it. Main thread.
#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "base/source.h"
#include "base/unique-fd.h"
#include "port/ioport.h"

struct IntDevice {
  std::string path;  // of the character device
  UniqueFd events;
  bool gone = false;  // what `events` belongs to is no longer there
  Source watch;       // of the events, while a port is watched
  Source check;       // whether the device is still there, at the same time
  unsigned int users = 0;
};
// Held by every port that is set up on the device; the last one to go closes the descriptor.
using IntDevicePtr = std::shared_ptr<IntDevice>;

// The device that the ports on that path share, opened for the first of them; one that is gone is
// opened anew. None, with a message and errno, when it can't be had.
IntDevicePtr int_device_get(const std::string &path);

// The callbacks of a port on a device.
struct IntListener {
  IOPort *port;
  std::uint32_t channel;
  // Its channel has an event: disable further events.
  void (*disable)(IOPort *port);
  // After that, once for each event.
  void (*handle)(IOPort *port);
  // The device can't be read or is gone, and the port is no longer watched.
  void (*lost)(IOPort *port);
};

// Watches the device for the port. Again: nothing, but for a device whose watch has ended.
void int_device_watch(const IntDevicePtr &device, const IntListener &listener);
void int_device_unwatch(const IntDevicePtr &device, const IOPort *port);
