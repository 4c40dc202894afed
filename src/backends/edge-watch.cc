#include "backends/edge-watch.h"

#include <glib-unix.h>
#include <poll.h>

#include "base/log.h"
#include "port/ioport.h"

namespace {

constexpr gulong kDebounceTime = 500;  // microseconds between an edge and the first read
// Limits how long a line that keeps changing holds the main loop. Far above what a bouncing contact
// needs.
constexpr int kMaxReports = 64;
constexpr guint kRetryInterval = 1000;  // milliseconds between two reads of an unreadable line

// A source that does nothing until it is made ready, and then runs once.
gboolean run_once(GSource *source, GSourceFunc callback, gpointer user_data) {
  g_source_set_ready_time(source, -1);
  return callback(user_data);
}

GSource *new_wake_source(GSourceFunc callback, gpointer user_data) {
  static GSourceFuncs functions = {.prepare = nullptr,
                                   .check = nullptr,
                                   .dispatch = run_once,
                                   .finalize = nullptr,
                                   .closure_callback = nullptr,
                                   .closure_marshal = nullptr};
  GSource *source = g_source_new(&functions, sizeof(GSource));
  g_source_set_callback(source, callback, user_data, nullptr);
  g_source_attach(source, nullptr);
  return source;
}

}  // namespace

void EdgeWatch::start(IOPort *port, const GpioPin *pin) {
  if (pin != pin_) {
    stop();
  }
  const std::lock_guard guard(handles_);
  port_ = port;
  pin_ = pin;
  if (reported_level_ == kNone) {
    // No earlier level was reported: changes count from here.
    set_level(libugpio_get_gpio_pin(pin));
    reported_level_ = level_;
  }
  arm();
}

void EdgeWatch::stop() {
  const std::lock_guard guard(handles_);
  watch_.reset();
  recheck_.reset();
  wake_.reset();
  pin_ = nullptr;
  level_ = reported_level_ = kNone;
  unreported_edge_ = false;
}

bool EdgeWatch::is_on() const {
  const std::lock_guard guard(handles_);
  return watch_ || recheck_;
}

int EdgeWatch::read(const GpioPin *pin) {
  const std::lock_guard guard(handles_);
  const int level = libugpio_get_gpio_pin(pin);
  if (pin == pin_) {
    note_read(level);
  }
  return level;
}

void EdgeWatch::arm() {
  const int fd = libugpio_gpio_pin_fd(pin_);
  watch_ = fd >= 0 ? Source(g_unix_fd_add(fd, condition_, on_signal, this)) : Source();
  // Attached after the watch: an edge that is signalled too is handled first, for both.
  wake_.reset(new_wake_source(on_wake, this));
  if (unreported_edge_ || level_ != reported_level_) {
    request_check();
  }
}

void EdgeWatch::set_level(int level) {
  level_ = level < 0 ? kUnreadable : (level != 0 ? 1 : 0);
}

void EdgeWatch::note_read(int level) {
  set_level(level);
  if (!watch_ || debouncing_ || level_ == reported_level_) {
    return;
  }
  if (level_ == kUnreadable) {
    if (!recheck_) {
      request_check();
    }
  } else if (!unreported_edge_) {
    request_report();
  }
}

void EdgeWatch::request_check() {
  if (wake_) {
    g_source_set_ready_time(wake_.get(), 0);
  }
}

void EdgeWatch::request_report() {
  unreported_edge_ = true;
  request_check();
}

void EdgeWatch::schedule_recheck() {
  recheck_ = Source(g_timeout_add(kRetryInterval, on_recheck, this));
}

gboolean EdgeWatch::on_wake(gpointer self) {
  static_cast<EdgeWatch *>(self)->check();
  return G_SOURCE_CONTINUE;
}

gboolean EdgeWatch::on_recheck(gpointer self) {
  auto *watch = static_cast<EdgeWatch *>(self);
  watch->check();
  return G_SOURCE_REMOVE;
}

void EdgeWatch::check() {
  if (needs_report()) {
    debounce();
  }
}

// After a failed read the line may still be as it was reported.
bool EdgeWatch::needs_report() {
  const std::lock_guard guard(handles_);
  recheck_.reset();  // also the one that runs
  set_level(libugpio_get_gpio_pin(pin_));
  if (level_ == kUnreadable) {
    schedule_recheck();
    return false;
  }
  const bool was_followed = static_cast<bool>(watch_);
  if (!was_followed) {
    arm();
  }
  return !was_followed || unreported_edge_ || level_ != reported_level_;
}

void EdgeWatch::debounce() {
  begin_debounce();
  g_usleep(kDebounceTime);
  report_until_stable();
  end_debounce();
}

void EdgeWatch::begin_debounce() {
  const std::lock_guard guard(handles_);
  debouncing_ = true;
  unreported_edge_ = false;
  recheck_.reset();
  if (wake_) {
    g_source_set_ready_time(wake_.get(), -1);
  }
}

// Stops after some reports when the line keeps changing; it is checked again soon.
void EdgeWatch::report_until_stable() {
  for (int round = 0; round < kMaxReports; ++round) {
    const bool state = io_port_get_state(port_);
    {
      const std::lock_guard guard(handles_);
      reported_level_ = level_;
    }
    io_port_report_state(port_, state);
    if (io_port_get_state(port_) == state) {
      return;
    }
  }
}

void EdgeWatch::end_debounce() {
  const std::lock_guard guard(handles_);
  debouncing_ = false;
  if (level_ == kUnreadable) {
    schedule_recheck();
  } else if (level_ != reported_level_) {
    request_report();
  }
}

bool EdgeWatch::is_stuck(int fd) {
  const std::lock_guard guard(handles_);
  pollfd line{.fd = fd, .events = POLLPRI, .revents = 0};
  return level_ == kUnreadable && poll(&line, 1, 0) > 0;
}

// Whatever goes on signalling and can't be acknowledged would keep the main loop from sleeping.
gboolean EdgeWatch::on_signal(gint fd, GIOCondition condition, gpointer self) {
  auto *watch = static_cast<EdgeWatch *>(self);
  if ((condition & (G_IO_PRI | G_IO_ERR)) != 0) {
    watch->debounce();
  }
  if ((condition & (G_IO_HUP | G_IO_NVAL)) != 0) {
    log_warning("Port %s: the line is gone and no longer watched", io_port_describe(watch->port_));
    watch->stop();
  } else if (watch->is_stuck(fd)) {
    log_warning("Port %s: the line can't be read", io_port_describe(watch->port_));
    const std::lock_guard guard(watch->handles_);
    watch->watch_.reset();  // until it can be read again
  }
  return G_SOURCE_CONTINUE;
}
