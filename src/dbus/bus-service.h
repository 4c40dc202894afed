// What every interface of the daemon has on the system bus: a well-known name, and the object that
// is served under it.
#pragma once

#include <gio/gio.h>

#include <initializer_list>
#include <mutex>

#include "base/glib-ptr.h"

// Started and stopped on the main thread. A service lives as long as the process.
class BusService {
 public:
  BusService(const char *name, const char *path) : name_(name), path_(path) {}
  BusService(const BusService &) = delete;
  BusService &operator=(const BusService &) = delete;

  // Takes the object over. As soon as there is a bus it is exported and then the name is asked for,
  // so that the object is there when the name is. A failure is logged.
  void start(GDBusInterfaceSkeleton *object);
  // Withdraws the object and gives the name up, without waiting for the bus.
  void stop();

  // Calls `use` with the object, unless the service is stopped. Action threads emit signals while
  // the main thread starts or stops the service, and an object that is being withdrawn must not be
  // emitted on: both happen under a lock. Any thread.
  template <typename Use>
  void with_object(Use use) {
    const std::lock_guard lock(lock_);
    if (object_) {
      use(object_.get());
    }
  }

 private:
  void open(GDBusConnection *connection);
  void request_name();
  static void on_name_reply(GObject *source, GAsyncResult *result, gpointer user_data);

  const char *name_;
  const char *path_;
  std::mutex lock_;
  GObjectPtr<GDBusInterfaceSkeleton> object_;
  GObjectPtr<GDBusConnection> connection_;  // once the object is exported
};

// A method of a generated skeleton, as its signal, and what serves it.
struct MethodHandler {
  const char *signal;
  GCallback callback;
};

void connect_handlers(gpointer object, std::initializer_list<MethodHandler> handlers);
