#include "supervised/supervised-edge-watch.h"

#include <glib-unix.h>

#include "base/log.h"
#include "supervised/supervised-data.h"

namespace {

constexpr std::uint32_t kUnknownLevel = 2;
constexpr gulong kSettleTime = 500;  // microseconds between an edge and the first look at the pin
// A pin that never comes to rest must leave the main loop some room. Far above what a contact that
// bounces takes.
constexpr int kRoundsPerTurn = 64;
constexpr guint kRetryInterval = 1000;  // milliseconds between two looks at an unreadable pin

gboolean recheck_pin(gpointer user_data);

void recheck_soon(IOPort *port, SupervisedData *data) {
  data->edge_recheck = Source(g_idle_add_full(G_PRIORITY_DEFAULT, recheck_pin, port, nullptr));
}

// Reading acknowledges the edge, also when it is a client's question that happens to come before
// the watch. The change must be reported all the same.
void note_level(IOPort *port, SupervisedData *data, int level) {
  const bool unreported = data->seen >= 0 && data->seen != level && !data->settling;
  data->seen = level;
  if (unreported && data->edge_watch) {
    recheck_soon(port, data);
  }
}

int read_pin(IOPort *port) {
  SupervisedData *data = supervised_data(port);
  const bool input = io_port_input(port);
  const std::lock_guard guard(data->pins_lock);
  const int level = libugpio_get_gpio_pin((input ? data->input : data->output).get());
  if (input && level >= 0) {
    note_level(port, data, level);
  }
  return level;
}

void set_settling(SupervisedData *data, bool settling) {
  const std::lock_guard guard(data->pins_lock);
  data->settling = settling;
}

// Reports the state until the pin has the state that was reported last.
bool report_until_rest(IOPort *port) {
  for (int round = 0; round < kRoundsPerTurn; ++round) {
    const bool state = io_port_get_state(port);
    io_port_report_state(port, state);
    if (io_port_get_state(port) == state) {
      return true;
    }
  }
  return false;
}

void settle(IOPort *port) {
  SupervisedData *data = supervised_data(port);
  data->edge_recheck.reset();
  set_settling(data, true);
  g_usleep(kSettleTime);
  const bool rests = report_until_rest(port);
  set_settling(data, false);
  if (!rests) {
    recheck_soon(port, data);
  }
}

// An edge that can't be acknowledged would be signalled for ever.
void retry_later(IOPort *port, SupervisedData *data) {
  data->edge_watch.reset();
  data->edge_recheck = Source(g_timeout_add(kRetryInterval, recheck_pin, port));
}

gboolean on_edge(gint /*fd*/, GIOCondition /*condition*/, gpointer user_data) {
  auto *port = static_cast<IOPort *>(user_data);
  SupervisedData *data = supervised_data(port);
  if (read_pin(port) < 0) {
    log_warning("Port %s: the input pin can't be read", io_port_describe(port));
    retry_later(port, data);
    return G_SOURCE_CONTINUE;
  }
  settle(port);
  return G_SOURCE_CONTINUE;
}

void watch_edges(IOPort *port, SupervisedData *data) {
  const GpioPin *pin = (io_port_input(port) ? data->input : data->output).get();
  const int fd = libugpio_gpio_pin_fd(pin);
  if (fd >= 0) {
    data->edge_watch = Source(g_unix_fd_add(fd, G_IO_PRI, on_edge, port));
  }
}

gboolean recheck_pin(gpointer user_data) {
  auto *port = static_cast<IOPort *>(user_data);
  SupervisedData *data = supervised_data(port);
  if (read_pin(port) < 0) {
    retry_later(port, data);
    return G_SOURCE_REMOVE;
  }
  if (!data->edge_watch) {
    watch_edges(port, data);
  }
  settle(port);
  return G_SOURCE_REMOVE;
}

void stop_watch(SupervisedData *data) {
  data->edge_watch.reset();
  data->edge_recheck.reset();
  const std::lock_guard guard(data->pins_lock);
  data->seen = -1;
}

}  // namespace

std::uint32_t supervised_pin_level(IOPort *port) {
  const int level = read_pin(port);
  return level < 0 ? kUnknownLevel : static_cast<std::uint32_t>(level != 0);
}

void supervised_set_edge_watch(IOPort *port, bool on) {
  SupervisedData *data = supervised_data(port);
  if (!on) {
    stop_watch(data);
  } else if (!data->edge_watch && !data->edge_recheck) {
    watch_edges(port, data);
  }
}
