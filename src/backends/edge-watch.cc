#include "backends/edge-watch.h"

#include <glib-unix.h>
#include <poll.h>

#include "base/log.h"
#include "port/ioport.h"

namespace {

constexpr gulong kSettleTime = 500;  // microseconds between an edge and the first look at the line
// A line that never comes to rest must leave the main loop some room. Far above what a contact that
// bounces takes.
constexpr int kRoundsPerTurn = 64;
constexpr guint kRetryInterval = 1000;  // milliseconds between two looks at an unreadable line

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
  if (told_ == kNone) {
    // Nobody was told of earlier levels: changes count from here.
    see(libugpio_get_gpio_pin(pin));
    told_ = seen_;
  }
  arm();
}

void EdgeWatch::stop() {
  const std::lock_guard guard(handles_);
  watch_.reset();
  recheck_.reset();
  wake_.reset();
  pin_ = nullptr;
  seen_ = told_ = kNone;
  was_hidden_ = false;
}

bool EdgeWatch::is_on() const {
  const std::lock_guard guard(handles_);
  return watch_ || recheck_;
}

int EdgeWatch::read(const GpioPin *pin) {
  const std::lock_guard guard(handles_);
  const int level = libugpio_get_gpio_pin(pin);
  if (pin == pin_) {
    note(level);
  }
  return level;
}

void EdgeWatch::arm() {
  const int fd = libugpio_gpio_pin_fd(pin_);
  watch_ = fd >= 0 ? Source(g_unix_fd_add(fd, condition_, on_signal, this)) : Source();
  // Behind the watch: an edge that is signalled as well is served first, and serves for both.
  wake_.reset(new_wake_source(on_wake, this));
  if (was_hidden_ || seen_ != told_) {
    look_soon();
  }
}

void EdgeWatch::see(int level) {
  seen_ = level < 0 ? kUnreadable : (level != 0 ? 1 : 0);
}

void EdgeWatch::note(int level) {
  see(level);
  if (!watch_ || settling_ || seen_ == told_) {
    return;
  }
  if (seen_ == kUnreadable) {
    if (!recheck_) {
      look_soon();
    }
  } else if (!was_hidden_) {
    report_soon();
  }
}

void EdgeWatch::look_soon() {
  if (wake_) {
    g_source_set_ready_time(wake_.get(), 0);
  }
}

void EdgeWatch::report_soon() {
  was_hidden_ = true;
  look_soon();
}

void EdgeWatch::recheck_later() {
  recheck_ = Source(g_timeout_add(kRetryInterval, on_recheck, this));
}

gboolean EdgeWatch::on_wake(gpointer self) {
  static_cast<EdgeWatch *>(self)->look_again();
  return G_SOURCE_CONTINUE;
}

gboolean EdgeWatch::on_recheck(gpointer self) {
  auto *watch = static_cast<EdgeWatch *>(self);
  watch->look_again();
  return G_SOURCE_REMOVE;
}

void EdgeWatch::look_again() {
  if (wants_report()) {
    settle();
  }
}

// After a read that failed the line may be as it was reported: that is no news.
bool EdgeWatch::wants_report() {
  const std::lock_guard guard(handles_);
  recheck_.reset();  // also the one that runs
  see(libugpio_get_gpio_pin(pin_));
  if (seen_ == kUnreadable) {
    recheck_later();
    return false;
  }
  const bool was_followed = static_cast<bool>(watch_);
  if (!was_followed) {
    arm();
  }
  return !was_followed || was_hidden_ || seen_ != told_;
}

void EdgeWatch::settle() {
  begin_settling();
  g_usleep(kSettleTime);
  report_until_rest();
  end_settling();
}

void EdgeWatch::begin_settling() {
  const std::lock_guard guard(handles_);
  settling_ = true;
  was_hidden_ = false;
  recheck_.reset();
  if (wake_) {
    g_source_set_ready_time(wake_.get(), -1);
  }
}

// A line that does not come to rest is left after some rounds, to be looked at again soon.
void EdgeWatch::report_until_rest() {
  for (int round = 0; round < kRoundsPerTurn; ++round) {
    const bool state = io_port_get_state(port_);
    {
      const std::lock_guard guard(handles_);
      told_ = seen_;
    }
    io_port_report_state(port_, state);
    if (io_port_get_state(port_) == state) {
      return;
    }
  }
}

void EdgeWatch::end_settling() {
  const std::lock_guard guard(handles_);
  settling_ = false;
  if (seen_ == kUnreadable) {
    recheck_later();
  } else if (seen_ != told_) {
    report_soon();
  }
}

bool EdgeWatch::signals_in_vain(int fd) {
  const std::lock_guard guard(handles_);
  pollfd line{.fd = fd, .events = POLLPRI, .revents = 0};
  return seen_ == kUnreadable && poll(&line, 1, 0) > 0;
}

// Whatever goes on signalling and can't be acknowledged would keep the main loop from sleeping.
gboolean EdgeWatch::on_signal(gint fd, GIOCondition condition, gpointer self) {
  auto *watch = static_cast<EdgeWatch *>(self);
  if ((condition & (G_IO_PRI | G_IO_ERR)) != 0) {
    watch->settle();
  }
  if ((condition & (G_IO_HUP | G_IO_NVAL)) != 0) {
    log_warning("Port %s: the line is gone and no longer watched", io_port_describe(watch->port_));
    watch->stop();
  } else if (watch->signals_in_vain(fd)) {
    log_warning("Port %s: the line can't be read", io_port_describe(watch->port_));
    const std::lock_guard guard(watch->handles_);
    watch->watch_.reset();  // until it can be read again
  }
  return G_SOURCE_CONTINUE;
}
