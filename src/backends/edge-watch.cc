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
    note(libugpio_get_gpio_pin(pin));
    told_ = seen_;
  }
  arm();
}

void EdgeWatch::stop() {
  const std::lock_guard guard(handles_);
  watch_.reset();
  recheck_.reset();
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
}

void EdgeWatch::note(int level) {
  seen_ = level < 0 ? kUnreadable : (level != 0 ? 1 : 0);
  if (!watch_ || settling_ || seen_ == told_) {
    return;
  }
  if (seen_ == kUnreadable) {
    if (!recheck_) {
      recheck_later();
    }
  } else if (!was_hidden_) {
    was_hidden_ = true;
    recheck_soon();
  }
}

void EdgeWatch::recheck_soon() {
  recheck_ = Source(g_idle_add_full(G_PRIORITY_DEFAULT, on_recheck, this, nullptr));
}

void EdgeWatch::recheck_later() {
  recheck_ = Source(g_timeout_add(kRetryInterval, on_recheck, this));
}

gboolean EdgeWatch::on_recheck(gpointer self) {
  auto *watch = static_cast<EdgeWatch *>(self);
  if (watch->wants_report()) {
    watch->settle();
  }
  return G_SOURCE_REMOVE;
}

// After a read that failed the line may be as it was reported: that is no news.
bool EdgeWatch::wants_report() {
  const std::lock_guard guard(handles_);
  recheck_.reset();  // the one that runs, or what another reader has put in its place meanwhile
  const int level = libugpio_get_gpio_pin(pin_);
  if (level < 0) {
    seen_ = kUnreadable;
    recheck_later();
    return false;
  }
  const bool was_followed = static_cast<bool>(watch_);
  if (!was_followed) {
    arm();
  }
  seen_ = level != 0 ? 1 : 0;
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
    was_hidden_ = true;
    recheck_soon();
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
