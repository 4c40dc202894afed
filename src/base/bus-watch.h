// Following a service on the system bus without waiting for it: the owner of its name, and its
// signals. Main thread only.
#pragma once

#include <gio/gio.h>

#include <functional>
#include <memory>
#include <string>

#include "base/glib-ptr.h"

// Follows the owner of a name, and has the service started if it can be, until it is destroyed.
class OwnerWatch {
 public:
  // `owner` is the unique name of the process, empty for none; then `connection` may be null, which
  // means that there is no bus.
  using Changed = std::function<void(GDBusConnection *connection, const std::string &owner)>;

  // `changed` is called from the main loop when the owner is known, and at each change. A name that
  // passes from one process to the next without a gap changes once.
  OwnerWatch(const char *name, Changed changed);
  OwnerWatch(const OwnerWatch &) = delete;
  OwnerWatch &operator=(const OwnerWatch &) = delete;
  ~OwnerWatch();

 private:
  struct State;

  std::shared_ptr<State> state_;
  guint id_;
};

// Receives a signal from any object until it is destroyed.
class SignalSubscription {
 public:
  using Handler = std::function<void(const char *object_path, GVariant *parameters)>;

  SignalSubscription() = default;
  SignalSubscription(GDBusConnection *connection, const std::string &sender, const char *interface,
                     const char *member, Handler handler);
  SignalSubscription(SignalSubscription &&other) noexcept;
  SignalSubscription &operator=(SignalSubscription &&other) noexcept;
  SignalSubscription(const SignalSubscription &) = delete;
  SignalSubscription &operator=(const SignalSubscription &) = delete;
  ~SignalSubscription() { reset(); }

  void reset();

 private:
  GObjectPtr<GDBusConnection> connection_;
  guint id_ = 0;
};
