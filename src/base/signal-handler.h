// A GObject signal handler that disconnects itself. Declare it after the owner of the object that
// it is connected to, so that it goes first. Main thread only.
#pragma once

#include <glib-object.h>

#include <utility>

class SignalHandler {
 public:
  SignalHandler() = default;
  // `signal` may carry a detail, as in "notify::g-name-owner".
  SignalHandler(gpointer instance, const char *signal, GCallback callback, gpointer user_data)
      : instance_(instance), id_(g_signal_connect(instance, signal, callback, user_data)) {}
  SignalHandler(SignalHandler &&other) noexcept
      : instance_(std::exchange(other.instance_, nullptr)), id_(std::exchange(other.id_, 0)) {}
  SignalHandler &operator=(SignalHandler &&other) noexcept {
    reset();
    instance_ = std::exchange(other.instance_, nullptr);
    id_ = std::exchange(other.id_, 0);
    return *this;
  }
  SignalHandler(const SignalHandler &) = delete;
  SignalHandler &operator=(const SignalHandler &) = delete;
  ~SignalHandler() { reset(); }

  explicit operator bool() const { return id_ != 0; }
  void reset() {
    if (id_ != 0) {
      g_signal_handler_disconnect(instance_, std::exchange(id_, 0));
    }
  }

 private:
  gpointer instance_ = nullptr;
  gulong id_ = 0;
};
