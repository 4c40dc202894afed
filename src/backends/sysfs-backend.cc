// Inputs made of a kernel attribute file that holds "0" or "1". The file is polled; a latched flag
// can be cleared after a 1 was read.
#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <cstdlib>
#include <limits>
#include <string>
#include <string_view>

#include "backends/poll-interval.h"
#include "base/log.h"
#include "base/source.h"
#include "base/unique-fd.h"
#include "port/ioport.h"

namespace {

// Longer than any attribute that holds a flag; one byte is for the terminating zero.
constexpr std::size_t kReadBuffer = 64;

struct SysfsBackendData : PortBackendData {
  std::string path;
  UniqueFd fd;
  std::uint32_t timeout = 0;             // milliseconds between two polls
  std::atomic<std::uint32_t> state = 0;  // the last raw reading, after inversion
  Source source;
  bool clear_flag = false;
  bool inverted = false;
};

SysfsBackendData *data_of(IOPort *port) {
  return static_cast<SysfsBackendData *>(io_port_backend_data(port));
}

bool setup(IOPort *port, bool /*initial_level*/) {
  SysfsBackendData *data = data_of(port);
  g_assert(data != NULL);
  if (io_port_get_type(port) != PORT_INPUT) {
    io_port_note_fault(port, "a sysfs port can only be an input");
    log_warning("Port %s: a sysfs port can only be an input", io_port_describe(port));
    return false;
  }
  // A path that names a pipe, by mistake, must not hold the start until somebody writes to it.
  const int mode = data->clear_flag ? O_RDWR : O_RDONLY;
  data->fd.reset(open(data->path.c_str(), mode | O_NONBLOCK | O_CLOEXEC));
  if (data->fd) {
    return true;
  }
  const char *reason = g_strerror(errno);
  io_port_note_fault(port, "%s: %s", data->path.c_str(), reason);
  if (!io_port_is_optional(port)) {
    log_warning("Failed to open %s: %s", data->path.c_str(), reason);
  }
  return false;
}

std::uint32_t get_state(IOPort *port) {
  return data_of(port)->state != 0 ? 1 : 0;
}

void seek_to_start(const SysfsBackendData *data) {
  (void)lseek(data->fd.get(), 0, SEEK_SET);
}

// The attribute's number, limited to 32 bits on every host as it is on the device.
int parse_number(const SysfsBackendData *data, const char *text) {
  using Limits = std::numeric_limits<std::int32_t>;
  errno = 0;
  long number = std::strtol(text, nullptr, 10);
  if (number > Limits::max() || number < Limits::min()) {
    number = number > 0 ? Limits::max() : Limits::min();
    errno = ERANGE;
  }
  if (errno != 0) {
    log_warning("Unexpected format when parsing input when reading: %s! : %s", data->path.c_str(),
                g_strerror(errno));
  }
  return static_cast<int>(number);
}

void clear_latched_flag(const SysfsBackendData *data) {
  if (write(data->fd.get(), "0", 1) != 1) {
    log_warning("Sysfs write failed: %s", g_strerror(errno));
  }
  seek_to_start(data);
}

// The flag that the file holds, before inversion. Whatever is neither 0 nor 1 counts as 0.
bool interpret(const SysfsBackendData *data, int number) {
  if (number == 1) {
    if (data->clear_flag) {
      clear_latched_flag(data);
    }
    return true;
  }
  if (number != 0) {
    log_warning("Unexpected value: %d when reading: %s", number, data->path.c_str());
  }
  return false;
}

bool read_level(const SysfsBackendData *data) {
  if (!data->fd) {
    return data->inverted;
  }
  std::array<char, kReadBuffer> text{};
  if (read(data->fd.get(), text.data(), text.size() - 1) < 0) {
    log_warning("Error failed to read %s! : %s", data->path.c_str(), g_strerror(errno));
    return false;
  }
  seek_to_start(data);
  return interpret(data, parse_number(data, text.data())) != data->inverted;
}

gboolean poll_file(gpointer user_data) {
  auto *port = static_cast<IOPort *>(user_data);
  SysfsBackendData *data = data_of(port);
  const std::uint32_t old = data->state;
  data->state = read_level(data) ? 1 : 0;
  const bool logical = io_port_get_state(port);
  if (data->state != old) {
    io_port_report_state(port, logical);
  }
  return G_SOURCE_CONTINUE;
}

void start_watch(IOPort *port) {
  SysfsBackendData *data = data_of(port);
  // A timer that runs goes on: arming it anew would put its next look off.
  if (!data->source) {
    data->source = Source(g_timeout_add(poll_interval(port, data->timeout), poll_file, port));
  }
}

void set_property(IOPort *port, const char *section, const char *key, const char *value) {
  SysfsBackendData *data = data_of(port);
  const std::string_view name = key;
  if (std::string_view(section) != "device") {
    log_warning("Could not parse backend data!\n");
  } else if (name == "path") {
    data->path = value;
  } else if (name == "timeout") {
    data->timeout = static_cast<std::uint32_t>(g_ascii_strtoll(value, nullptr, 0));
  } else if (name == "clear_flag") {
    data->clear_flag = std::string_view(value) == "true";
  } else if (name == "inverted") {
    data->inverted = std::string_view(value) == "true";
  }
}

}  // namespace

extern constexpr PortFunctions kSysfsBackend = {
    .make_record = make_backend_record<SysfsBackendData>,
    .setup = setup,
    .get_state = get_state,
    .start_watch = start_watch,
    .set_property = set_property,
};
