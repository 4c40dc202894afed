// A measured line on a converter of the kernel's industrial I/O, as far as it can fail: a converter
// that can't be read is tried again with everything left open; only one that is gone is looked for
// and connected anew. Main thread.
#pragma once

#include <string>
#include <vector>

#include "base/retry.h"
#include "supervised/supervised.h"

// What the private records of both backends begin with.
struct IioLine : SupervisedLine {
  // The name of the device that the line is read from.
  [[nodiscard]] virtual const std::string &device_name() const = 0;
  // Whether what is open belongs to a device that is gone.
  [[nodiscard]] virtual bool is_gone() const = 0;
  // The character device, and the attribute files that connecting to that device writes.
  [[nodiscard]] virtual std::string node_of(int device) const = 0;
  [[nodiscard]] virtual std::vector<std::string> attributes_of(int device) const = 0;
  // Opens the device. What was open before stays until all of it is there. False, with a message,
  // when it can't.
  virtual bool connect(IOPort *port) = 0;
  // Reads the line and watches it again. False: it can't be read yet.
  virtual bool resume(IOPort *port) = 0;

  Retry retry;
  bool refusal_logged = false;  // a device that is back could not be used, and the log says so
};

// The line can't be read or watched now: tries again after growing pauses.
void iio_retry_later(IOPort *port);
// The same, but first at once. False: it does not work yet.
bool iio_retry_now(IOPort *port);
