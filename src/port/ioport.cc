// Lifetime, backend binding and identity of a port.
#include "port/ioport.h"

#include <algorithm>
#include <cstdarg>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "base/main-queue.h"
#include "port/ioport-private.h"
#include "port/port-listener.h"

namespace {

std::vector<Backend> &backends() {
  static std::vector<Backend> table;
  return table;
}

const PortFunctions *functions_of(BackendKind kind) {
  const auto &table = backends();
  const auto found = std::find_if(table.begin(), table.end(),
                                  [&](const Backend &backend) { return backend.kind == kind; });
  return found == table.end() ? nullptr : found->functions;
}

void make_record(IOPort *port) {
  if (port->functions && port->functions->make_record && !port->backend_data) {
    port->backend_data = port->functions->make_record();
  }
}

void destroy_record(IOPort *port) {
  if (io_port_backend_serves(port) && port->functions->drop) {
    port->functions->drop(port);
  }
  port->backend_data.reset();
}

void apply_backend_property(IOPort *port, const BackendProperty &property) {
  if (port->functions->set_property) {
    port->functions->set_property(port, property.section.c_str(), property.key.c_str(),
                                  property.value.c_str());
  }
}

// Some backends give up their private record when they are dropped, and with it what the hardware
// description told them.
void rebuild_released_backend(IOPort *port) {
  if (!port->backend_released) {
    return;
  }
  port->backend_released = false;
  make_record(port);
  // The description's ranges are only the first ones; the user may have set others since.
  SupervisedRanges ranges = io_port_range_list(port);
  for (const auto &property : port->backend_properties) {
    apply_backend_property(port, property);
  }
  io_port_store_range_list(port, std::move(ranges));
}

}  // namespace

PortListener &port_listener() {
  static PortListener listener{};
  return listener;
}

IOPort *io_port_new() {
  return new IOPort;
}

void io_port_ref(IOPort *port) {
  if (port) {
    port->refcount.fetch_add(1, std::memory_order_relaxed);
  }
}

void io_port_unref(IOPort *port) {
  if (port && port->refcount.fetch_sub(1, std::memory_order_acq_rel) == 1) {
    io_port_destroy(port);
  }
}

void io_port_destroy(IOPort *port) {
  io_port_stop_sequence_and_lock(port).unlock();
  io_port_undeclare_events(port);
  destroy_record(port);
  delete port;
}

void io_port_register_backend(const Backend &backend) {
  auto &table = backends();
  std::erase_if(table, [&](const Backend &known) { return known.kind == backend.kind; });
  table.push_back(backend);
}

std::optional<BackendKind> io_port_backend_kind(std::string_view word) {
  const auto &table = backends();
  const auto found = std::find_if(table.begin(), table.end(),
                                  [&](const Backend &backend) { return backend.word == word; });
  return found == table.end() ? std::nullopt : std::optional(found->kind);
}

void io_port_set_backend(IOPort *port, BackendKind kind) {
  if (port->backend != kind) {
    destroy_record(port);  // the next backend must not find the record of another
    port->backend_properties.clear();
  }
  port->backend = kind;
  port->functions = functions_of(kind);
  port->backend_released = false;
  make_record(port);
}

bool io_port_has_backend(const IOPort *port) {
  return port->functions != nullptr;
}

void io_port_set_backend_property(IOPort *port, const char *section, const char *key,
                                  const char *value) {
  if (!port->functions) {
    log_warning("Port %s has no backend: %s %s is ignored", io_port_describe(port), section, key);
    return;
  }
  port->backend_properties.push_back({section, key, value});
  if (io_port_backend_serves(port)) {
    apply_backend_property(port, port->backend_properties.back());
  }
}

PortBackendData *io_port_backend_data(const IOPort *port) {
  return port->backend_data.get();
}

bool io_port_begin_setup(IOPort *port) {
  g_assert(port != NULL);
  g_assert(port->functions != NULL);
  rebuild_released_backend(port);
  port->fault.clear();
  const bool ok = !port->functions->setup || port->functions->setup(port, port->activelow_output);
  if (ok) {
    io_port_finish_setup(port);
  }
  return ok;
}

bool io_port_setup(IOPort *port) {
  if (io_port_begin_setup(port)) {
    return true;
  }
  bool idle = false;
  io_port_when_idle(port, [&] { idle = true; });
  if (idle) {
    return false;  // nothing is under way
  }
  serve_main_loop_until([&] { return idle; });
  return port->set_up;
}

bool io_port_is_set_up(const IOPort *port) {
  return port->set_up;
}

void io_port_finish_setup(IOPort *port) {
  port->set_up = true;
  port->idle_logged = false;
}

void io_port_note_fault(IOPort *port, const char *format, ...) {
  if (port->set_up) {
    return;
  }
  va_list arguments;
  va_start(arguments, format);
  const GCharPtr text(g_strdup_vprintf(format, arguments));
  va_end(arguments);
  if (!port->fault.empty()) {
    port->fault += "; ";
  }
  port->fault += text.get();
}

std::string io_port_fault(const IOPort *port) {
  return port->fault.empty() && !port->set_up ? "its set-up failed" : port->fault;
}

bool io_port_in_service(const IOPort *port) {
  return port->set_up && port->fault.empty();
}

void io_port_drop(IOPort *port) {
  if (!port->functions) {
    return;
  }
  const auto lock = io_port_stop_sequence_and_lock(port);
  port->set_up = false;
  // What they last said would stay listed: a siren that is gone would be on for ever.
  io_port_undeclare_events(port);
  if (port->functions->drop) {
    port->functions->drop(port);
  } else {
    destroy_record(port);
    port->backend_released = true;
  }
}

PortType io_port_get_type(const IOPort *port) {
  return port->type;
}

void io_port_set_type(IOPort *port, PortType type) {
  port->type = type;
}

const std::optional<std::string> &io_port_get_id(const IOPort *port) {
  return port->id;
}

void io_port_set_id(IOPort *port, std::string id) {
  port->id = std::move(id);
}

const char *io_port_describe(const IOPort *port) {
  return port->id ? port->id->c_str() : "(without name)";
}

int io_port_get_number(const IOPort *port) {
  return port->number;
}

void io_port_set_number(IOPort *port, int number) {
  port->number = number;
}

bool io_port_is_optional(const IOPort *port) {
  return port->optional;
}

void io_port_set_optional(IOPort *port, bool optional) {
  port->optional = optional;
}

void io_port_set_flag(IOPort *port, const std::string &name, const char *text) {
  port->properties[name] = g_ascii_strcasecmp(text, "true") == 0;
}

bool io_port_get_flag(const IOPort *port, const char *name) {
  return port->functions && io_port_lookup_flag(port, name).value_or(false);
}

std::optional<bool> io_port_lookup_flag(const IOPort *port, const char *name) {
  const auto entry = port->properties.find(name);
  if (entry == port->properties.end()) {
    return std::nullopt;
  }
  return entry->second;
}

std::vector<std::pair<std::string, bool>> io_port_get_flags(const IOPort *port) {
  return {port->properties.begin(), port->properties.end()};
}

bool io_port_is_ioport(const IOPort *port) {
  return port && io_port_get_flag(port, "ioport");
}

bool io_port_set_mode(IOPort *port, int mode) {
  if (mode != PORT_MODE_MONOSTABLE && mode != PORT_MODE_BISTABLE) {
    return false;
  }
  port->mode = mode;
  return true;
}

int io_port_get_mode(const IOPort *port) {
  return port ? port->mode : 0;
}

void io_port_set_delay_time(IOPort *port, std::int32_t delay_time) {
  port->delay_time = delay_time;
}

std::int32_t io_port_get_delay_time(const IOPort *port) {
  return port ? port->delay_time : -1;
}

void io_port_set_pulse_time(IOPort *port, std::uint32_t pulse_time) {
  port->pulse_time = pulse_time;
}

std::uint32_t io_port_get_pulse_time(const IOPort *port) {
  return port->pulse_time;
}

void io_port_set_button(IOPort *port, int button) {
  port->button = button;
}

int io_port_get_button(const IOPort *port) {
  return port->button;
}

void io_port_set_spare_setting(IOPort *port, std::uint32_t value) {
  if (value != 0) {
    port->spare_setting = value;
  }
}

std::uint32_t io_port_get_spare_setting(const IOPort *port) {
  return port ? port->spare_setting : 0;
}
