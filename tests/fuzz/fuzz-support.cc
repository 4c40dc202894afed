#include "fuzz-support.h"

#include <fcntl.h>
#include <unistd.h>

#include <cstdlib>

#include "base/glib-ptr.h"
#include "base/unique-fd.h"
#include "daemon/backends.h"
#include "port/ioport-private.h"
#include "port/port-registry.h"
#include "settings/param.h"

namespace {

GLogWriterOutput drop_message(GLogLevelFlags /*level*/, const GLogField * /*fields*/,
                              gsize /*count*/, gpointer /*user_data*/) {
  return G_LOG_WRITER_HANDLED;
}

bool owns_no_hardware(const IOPort *port) {
  const BackendKind kind = port->backend;
  return kind == BACKEND_VIRTUAL || kind == BACKEND_NULL || kind == BACKEND_CHECK;
}

}  // namespace

InputFile::InputFile() {
  // Saving syncs, which would take most of the time on a disk.
  const std::string parent = access("/dev/shm", W_OK) == 0 ? "/dev/shm" : "/tmp";
  std::string folder = parent + "/portd-fuzz-XXXXXX";
  folder_ = g_mkdtemp(folder.data());
  path_ = folder_ + "/input";
}

InputFile::~InputFile() {
  unlink(path_.c_str());
  rmdir(folder_.c_str());
}

void InputFile::write(const std::uint8_t *data, std::size_t size) {
  const UniqueFd fd(open(path_.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600));
  if (::write(fd.get(), data, size) != static_cast<ssize_t>(size)) {
    std::abort();
  }
}

void fuzz_initialise() {
  g_setenv("DBUS_SYSTEM_BUS_ADDRESS", "unix:path=/nonexistent/bus", TRUE);
  g_log_set_writer_func(drop_message, nullptr, nullptr);
  // The settings code prints what it finds wrong; a fuzzer makes it find a lot.
  if (!std::freopen("/dev/null", "w", stdout)) {
    std::abort();
  }
  backends_register();
}

void fuzz_add_port(int number, const char *id, PortType type, BackendKind backend) {
  const IOPortRef port(io_port_new());
  io_port_set_id(port.get(), id);
  io_port_set_type(port.get(), type);
  io_port_set_number(port.get(), number);
  io_port_set_backend(port.get(), backend);
  io_port_set_flag(port.get(), "ioport", "true");
  port_registry_add(port.get());
}

void fuzz_add_port_of_each_type() {
  fuzz_add_port(0, "in", PORT_INPUT, BACKEND_CHECK);
  fuzz_add_port(1, "out", PORT_OUTPUT, BACKEND_CHECK);
  fuzz_add_port(2, "both", PORT_CONFIGURABLE, BACKEND_CHECK);
}

bool fuzz_apply_settings(const std::string &path) {
  if (!param_read_configuration(path)) {
    return false;
  }
  port_registry_for_each([](IOPort *port) { param_get_conf_vals(port); });
  param_free_configuration();
  return true;
}

void fuzz_exercise_ports() {
  for (std::size_t i = 0; i < port_registry_count(); ++i) {
    const IOPortRef ref = port_registry_nth(i);
    IOPort *port = ref.get();
    if (!io_port_has_backend(port) || !owns_no_hardware(port)) {
      continue;
    }
    io_port_setup(port);
    io_port_set_watch(port);
    io_port_set_state(port, true);
    io_port_set_virtual(port, true);
    io_port_set_activelow(port, true, true);
    io_port_set_activelow(port, true, false);
    io_port_set_direction(port, !io_port_direction_input(port));
    io_port_get_state(port);
    io_port_drop(port);
    io_port_setup(port);
  }
  port_registry_count_inputs();
  port_registry_supervisable_numbers();
}
