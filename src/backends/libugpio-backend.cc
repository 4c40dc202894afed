// Plain digital inputs and outputs on GPIO lines, and configurable ports, which have one line of
// each kind and a third that switches the terminal between the two.
#include <glib-unix.h>
#include <poll.h>

#include <mutex>
#include <string_view>
#include <utility>

#include "backends/libugpio-utils.h"
#include "backends/tables.h"
#include "base/log.h"
#include "base/source.h"

namespace {

constexpr gulong kSettleTime = 500;  // microseconds between an edge and the first look at the line
// A line that never comes to rest must leave the main loop some room. Far above what a contact that
// bounces takes.
constexpr int kRoundsPerTurn = 64;
constexpr guint kRetryInterval = 1000;  // milliseconds between two looks at an unreadable line

constexpr int kNotSeen = -1;

struct GpioBackendData : PortBackendData {
  GpioPinPtr input;
  GpioPinPtr output;
  GpioPinPtr io_ctrl;

  // For what follows and for every use of the pins' handles, since the library wants one thread at
  // a time at a line. Nothing else is locked while this is held.
  std::mutex lock;
  int seen = kNotSeen;      // what the input last read while it could be read
  bool unreadable = false;  // the input's last read failed
  bool settling = false;    // the port is at reading and reporting until the line rests
  Source watch;             // of the line's descriptor
  Source recheck;           // the line must be looked at without an edge
};

GpioBackendData *data_of(IOPort *port) {
  return static_cast<GpioBackendData *>(io_port_backend_data(port));
}

// --- Levels ---

gboolean recheck_line(gpointer user_data);

// Reading acknowledges the edge, also when it is a client's question that happens to come before
// the watch. The change must be reported all the same.
void note_level(IOPort *port, GpioBackendData *data, int level) {
  const bool watch_missed_it = data->watch && !data->settling;
  data->unreadable = level < 0;
  if (data->unreadable) {
    if (watch_missed_it && !data->recheck) {
      data->recheck = Source(g_timeout_add(kRetryInterval, recheck_line, port));
    }
    return;
  }
  const int old = std::exchange(data->seen, level != 0 ? 1 : 0);
  if (watch_missed_it && old != kNotSeen && old != data->seen) {
    data->recheck = Source(g_idle_add_full(G_PRIORITY_DEFAULT, recheck_line, port, nullptr));
  }
}

int read_input(IOPort *port) {
  GpioBackendData *data = data_of(port);
  const std::lock_guard guard(data->lock);
  const int level = libugpio_get_gpio_pin(data->input.get());
  note_level(port, data, level);
  return level;
}

int read_output(IOPort *port) {
  GpioBackendData *data = data_of(port);
  const std::lock_guard guard(data->lock);
  return libugpio_get_gpio_pin(data->output.get());
}

// A line that can't be read counts as active.
std::uint32_t get_state(IOPort *port) {
  const int level = io_port_input(port) ? read_input(port) : read_output(port);
  return level != 0 ? 1 : 0;
}

int write_line(GpioBackendData *data, const GpioPinPtr &pin, int level) {
  const std::lock_guard guard(data->lock);
  return libugpio_write_gpio_pin(pin.get(), level);
}

void set_state(IOPort *port, std::int32_t level) {
  GpioBackendData *data = data_of(port);
  if (write_line(data, data->output, level) == -1) {
    log_warning("Failed to set state on port!\n");
  }
}

void switch_io_ctrl(GpioBackendData *data, int value) {
  if (write_line(data, data->io_ctrl, value) == -1) {
    log_warning("Couldn't change direction on port!\n");
  }
}

// --- Watch ---

void stop_watch(GpioBackendData *data) {
  const std::lock_guard guard(data->lock);
  data->watch.reset();
  data->recheck.reset();
  data->seen = kNotSeen;
}

bool still_signals_unreadable(GpioBackendData *data, int fd) {
  const std::lock_guard guard(data->lock);
  pollfd line{.fd = fd, .events = POLLPRI, .revents = 0};
  return data->unreadable && poll(&line, 1, 0) > 0;
}

void begin_settling(GpioBackendData *data) {
  const std::lock_guard guard(data->lock);
  data->settling = true;
  data->recheck.reset();
}

// Goes on later when the line can't be read, or was read with another level than the one reported.
void end_settling(IOPort *port, bool reported) {
  GpioBackendData *data = data_of(port);
  const int level = reported != io_port_get_activelow(port, true) ? 1 : 0;
  const std::lock_guard guard(data->lock);
  data->settling = false;
  if (data->unreadable) {
    data->recheck = Source(g_timeout_add(kRetryInterval, recheck_line, port));
  } else if (io_port_is_set_up(port) && data->seen != kNotSeen && data->seen != level) {
    data->recheck = Source(g_idle_add_full(G_PRIORITY_DEFAULT, recheck_line, port, nullptr));
  }
}

// Reports the state until the line has the state that was reported last, which is returned. A line
// that does not come to rest is left after some rounds, to be looked at again soon.
bool report_until_rest(IOPort *port) {
  for (int round = 1;; ++round) {
    const bool state = io_port_get_state(port);
    io_port_report_state(port, state);
    if (io_port_get_state(port) == state || round == kRoundsPerTurn) {
      return state;
    }
  }
}

void settle(IOPort *port) {
  begin_settling(data_of(port));
  g_usleep(kSettleTime);
  if (!io_port_is_set_up(port)) {
    (void)read_input(port);  // the port layer does not ask, yet the edge wants acknowledging
  }
  end_settling(port, report_until_rest(port));
}

// Whatever goes on signalling and can't be acknowledged would keep the main loop from sleeping.
gboolean line_signals(gint fd, GIOCondition condition, gpointer user_data) {
  auto *port = static_cast<IOPort *>(user_data);
  GpioBackendData *data = data_of(port);
  if ((condition & G_IO_ERR) != 0) {
    settle(port);
  }
  if ((condition & (G_IO_HUP | G_IO_NVAL)) != 0) {
    log_warning("Port %s: the line is gone and no longer watched", io_port_describe(port));
    stop_watch(data);
  } else if (still_signals_unreadable(data, fd)) {
    log_warning("Port %s: the line can't be read", io_port_describe(port));
    const std::lock_guard guard(data->lock);
    data->watch.reset();  // until a recheck succeeds
  }
  return G_SOURCE_CONTINUE;
}

void start_watch(IOPort *port) {
  GpioBackendData *data = data_of(port);
  if (!data) {
    return;  // dropped, and not yet set up anew
  }
  const GpioPin *pin = (io_port_input(port) ? data->input : data->output).get();
  const std::lock_guard guard(data->lock);
  const int fd = libugpio_gpio_pin_fd(pin);
  data->watch = fd >= 0 ? Source(g_unix_fd_add(fd, G_IO_ERR, line_signals, port)) : Source();
}

gboolean recheck_line(gpointer user_data) {
  auto *port = static_cast<IOPort *>(user_data);
  GpioBackendData *data = data_of(port);
  if (read_input(port) < 0) {
    const std::lock_guard guard(data->lock);
    data->recheck = Source(g_timeout_add(kRetryInterval, recheck_line, port));
    return G_SOURCE_REMOVE;
  }
  if (!data->watch) {
    start_watch(port);
  }
  settle(port);
  return G_SOURCE_REMOVE;
}

// --- Life ---

void request_pin(IOPort *port, const GpioPinPtr &pin, const char *role, bool is_input, bool value) {
  if (!pin) {
    log_warning("Port %s has no %s line", io_port_describe(port), role);
    return;
  }
  // A port whose line can't be had lives on without it; why is in the log.
  (void)libugpio_request_gpio_pin(pin.get(), is_input, value);
}

void setup_configurable(IOPort *port, const GpioBackendData *data, bool initial_level) {
  const bool input = io_port_direction_input(port);
  request_pin(port, data->input, "input", true, false);
  request_pin(port, data->output, "output", false, !input && initial_level);
  request_pin(port, data->io_ctrl, "io_ctrl", false, !input);
}

bool setup(IOPort *port, bool initial_level) {
  GpioBackendData *data = data_of(port);
  g_assert(data != NULL);
  stop_watch(data);
  switch (io_port_get_type(port)) {
    case PORT_INPUT:
      request_pin(port, data->input, "input", true, false);
      break;
    case PORT_OUTPUT:
      request_pin(port, data->output, "output", false, initial_level);
      break;
    case PORT_CONFIGURABLE:
      setup_configurable(port, data, initial_level);
      break;
  }
  return true;
}

// The output and its driver are never on at the wrong time: off before the terminal becomes an
// input, and inactive as soon as it is an output.
void set_direction(IOPort *port, bool input) {
  GpioBackendData *data = data_of(port);
  stop_watch(data);
  if (input) {
    set_state(port, 0);
    switch_io_ctrl(data, 0);
  } else {
    switch_io_ctrl(data, 1);
    set_state(port, io_port_get_activelow(port, false) ? 1 : 0);
  }
}

GpioPinPtr *pin_of_section(GpioBackendData *data, std::string_view section) {
  if (section == "input") {
    return &data->input;
  }
  if (section == "output") {
    return &data->output;
  }
  return section == "io_ctrl" ? &data->io_ctrl : nullptr;
}

void set_property(IOPort *port, const char *section, const char *key, const char *value) {
  auto *data = io_port_make_backend_data<GpioBackendData>(port);
  GpioPinPtr *pin = pin_of_section(data, section);
  if (!pin) {
    log_warning("Could not parse backend data!\n");
    return;
  }
  libugpio_set_gpio_pin_property(libugpio_make_gpio_pin(*pin), key, value);
}

void free_data(IOPort *port) {
  io_port_set_backend_data(port, nullptr);
}

constexpr PortFunctions kFunctions = {
    .setup = setup,
    .get_state = get_state,
    .set_state = set_state,
    .start_watch = start_watch,
    .set_direction = set_direction,
    .set_property = set_property,
    .free = free_data,
};

}  // namespace

const PortFunctions *gpio_backend_functions(IOPort *port) {
  io_port_make_backend_data<GpioBackendData>(port);
  return &kFunctions;
}
