// Inputs that follow the first character of a file: a "1" is active.
#include <fcntl.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <string>
#include <string_view>

#include "base/log.h"
#include "base/source.h"
#include "base/unique-fd.h"
#include "port/ioport.h"

namespace {

constexpr guint kInterval = 100;  // milliseconds between two looks

struct ToyRecord : PortBackendData {
  std::string path;
  UniqueFd fd;
  std::atomic<bool> active = false;  // action threads ask for it
  Source timer;
};

ToyRecord *record_of(IOPort *port) {
  return static_cast<ToyRecord *>(io_port_backend_data(port));
}

void set_property(IOPort *port, const char *section, const char *key, const char *value) {
  if (std::string_view(section) == "file" && std::string_view(key) == "path") {
    record_of(port)->path = value;
  }
}

bool setup(IOPort *port, bool /*initial_level*/) {
  if (io_port_get_type(port) != PORT_INPUT) {
    io_port_note_fault(port, "a toy port can only be an input");
    log_warning("Port %s: a toy port can only be an input", io_port_describe(port));
    return false;
  }
  ToyRecord *record = record_of(port);
  record->fd.reset(open(record->path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
  if (!record->fd) {
    const char *reason = g_strerror(errno);
    io_port_note_fault(port, "%s: %s", record->path.c_str(), reason);
    log_warning("Port %s: no %s: %s", io_port_describe(port), record->path.c_str(), reason);
  }
  return static_cast<bool>(record->fd);
}

std::uint32_t get_state(IOPort *port) {
  return record_of(port)->active ? 1 : 0;
}

gboolean look(gpointer user_data) {
  auto *port = static_cast<IOPort *>(user_data);
  char level = '0';
  (void)pread(record_of(port)->fd.get(), &level, 1, 0);
  const bool active = level == '1';
  if (record_of(port)->active.exchange(active) != active) {
    io_port_report_state(port, io_port_get_state(port));
  }
  return G_SOURCE_CONTINUE;
}

void start_watch(IOPort *port) {
  record_of(port)->timer = Source(g_timeout_add(kInterval, look, port));
}

}  // namespace

extern constexpr PortFunctions kToyBackend = {
    .make_record = make_backend_record<ToyRecord>,
    .setup = setup,
    .get_state = get_state,
    .start_watch = start_watch,
    .set_property = set_property,
};
