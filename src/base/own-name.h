// What every interface of the daemon needs of the system bus: a well-known name, an exported
// object, and that its last words are heard.
#pragma once

#include <gio/gio.h>

#include <utility>

// Owns a name of the system bus, or queues for it, until reset. Main thread.
class BusName {
 public:
  BusName() = default;
  // `on_bus_acquired`, which may be null, is called when the bus is there, before the name is asked
  // for: whoever sees the name finds the objects that it exports.
  BusName(const char *name, GBusAcquiredCallback on_bus_acquired);
  BusName(BusName &&other) noexcept : id_(std::exchange(other.id_, 0)) {}
  BusName &operator=(BusName &&other) noexcept {
    reset();
    id_ = std::exchange(other.id_, 0);
    return *this;
  }
  BusName(const BusName &) = delete;
  BusName &operator=(const BusName &) = delete;
  ~BusName() { reset(); }

  void reset();

 private:
  guint id_ = 0;
};

// Exports an interface; a failure is logged and leaves the daemon without that interface.
void export_object(GDBusInterfaceSkeleton *skeleton, GDBusConnection *connection, const char *path);

// Waits until everything that was sent is on its way, for a second at the most: a bus that takes
// nothing any more must not keep the daemon from ending. Main thread, at shutdown.
void flush_bus(GDBusConnection *connection);
