// A GObject signal handler that disconnects itself. It keeps the object alive that it is connected
// to. Main thread only.
#pragma once

#include <utility>

#include "base/glib-ptr.h"

class SignalHandler {
 public:
  SignalHandler() = default;
  // `signal` may carry a detail, as in "notify::g-name-owner".
  SignalHandler(gpointer instance, const char *signal, GCallback callback, gpointer user_data)
      : instance_(static_cast<GObject *>(g_object_ref(instance))),
        id_(g_signal_connect(instance, signal, callback, user_data)) {}
  SignalHandler(SignalHandler &&other) noexcept
      : instance_(std::move(other.instance_)), id_(std::exchange(other.id_, 0)) {}
  SignalHandler &operator=(SignalHandler &&other) noexcept {
    reset();
    instance_ = std::move(other.instance_);
    id_ = std::exchange(other.id_, 0);
    return *this;
  }
  SignalHandler(const SignalHandler &) = delete;
  SignalHandler &operator=(const SignalHandler &) = delete;
  ~SignalHandler() { reset(); }

  explicit operator bool() const { return id_ != 0; }
  void reset() {
    if (id_ != 0) {
      g_signal_handler_disconnect(instance_.get(), std::exchange(id_, 0));
    }
    instance_.reset();
  }

 private:
  GObjectPtr<GObject> instance_;
  gulong id_ = 0;
};
