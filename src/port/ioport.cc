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

void make_record(IOPort *ioport) {
  if (ioport->functions && ioport->functions->make_record && !ioport->backend_data) {
    ioport->backend_data = ioport->functions->make_record();
  }
}

void destroy_record(IOPort *ioport) {
  if (io_port_backend_serves(ioport) && ioport->functions->drop) {
    ioport->functions->drop(ioport);
  }
  ioport->backend_data.reset();
}

void apply_backend_property(IOPort *ioport, const BackendProperty &property) {
  if (ioport->functions->set_property) {
    ioport->functions->set_property(ioport, property.section.c_str(), property.key.c_str(),
                                    property.value.c_str());
  }
}

// Some backends give up their private record when they are dropped, and with it what the hardware
// description told them.
void rebuild_released_backend(IOPort *ioport) {
  if (!ioport->backend_released) {
    return;
  }
  ioport->backend_released = false;
  make_record(ioport);
  // The description's ranges are only the first ones; the user may have set others since.
  SupervisedRanges ranges = io_port_range_list(ioport);
  for (const auto &property : ioport->backend_properties) {
    apply_backend_property(ioport, property);
  }
  io_port_store_range_list(ioport, std::move(ranges));
}

}  // namespace

PortListener &port_listener() {
  static PortListener listener{};
  return listener;
}

IOPort *io_port_new() {
  return new IOPort;
}

void io_port_ref(IOPort *ioport) {
  if (ioport) {
    ioport->refcount.fetch_add(1, std::memory_order_relaxed);
  }
}

void io_port_unref(IOPort *ioport) {
  if (ioport && ioport->refcount.fetch_sub(1, std::memory_order_acq_rel) == 1) {
    io_port_destroy(ioport);
  }
}

void io_port_destroy(IOPort *ioport) {
  io_port_stop_sequence_and_lock(ioport).unlock();
  io_port_undeclare_events(ioport);
  destroy_record(ioport);
  delete ioport;
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

void io_port_set_backend(IOPort *ioport, BackendKind kind) {
  if (ioport->backend != kind) {
    destroy_record(ioport);  // the next backend must not find the record of another
    ioport->backend_properties.clear();
  }
  ioport->backend = kind;
  ioport->functions = functions_of(kind);
  ioport->backend_released = false;
  make_record(ioport);
}

BackendKind io_port_get_backend(const IOPort *ioport) {
  return ioport->backend;
}

bool io_port_has_backend(const IOPort *ioport) {
  return ioport->functions != nullptr;
}

void io_port_set_backend_property(IOPort *ioport, const char *section, const char *key,
                                  const char *value) {
  if (!ioport->functions) {
    log_warning("Port %s has no backend to set %s %s of", io_port_describe(ioport), section, key);
    return;
  }
  ioport->backend_properties.push_back({section, key, value});
  if (io_port_backend_serves(ioport)) {
    apply_backend_property(ioport, ioport->backend_properties.back());
  }
}

PortBackendData *io_port_backend_data(const IOPort *ioport) {
  return ioport->backend_data.get();
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
  bool settled = false;
  io_port_when_settled(port, [&] { settled = true; });
  if (settled) {
    return false;  // nothing is under way
  }
  serve_main_loop_until([&] { return settled; });
  return port->set_up;
}

bool io_port_is_set_up(const IOPort *ioport) {
  return ioport->set_up;
}

void io_port_finish_setup(IOPort *ioport) {
  ioport->set_up = true;
  ioport->idle_logged = false;
}

void io_port_note_fault(IOPort *ioport, const char *format, ...) {
  if (ioport->set_up) {
    return;
  }
  va_list arguments;
  va_start(arguments, format);
  const GCharPtr text(g_strdup_vprintf(format, arguments));
  va_end(arguments);
  if (!ioport->fault.empty()) {
    ioport->fault += "; ";
  }
  ioport->fault += text.get();
}

std::string io_port_fault(const IOPort *ioport) {
  return ioport->fault.empty() && !ioport->set_up ? "its set-up failed" : ioport->fault;
}

bool io_port_in_service(const IOPort *ioport) {
  return ioport->set_up && ioport->fault.empty();
}

void io_port_drop(IOPort *ioport) {
  if (!ioport->functions) {
    return;
  }
  const auto lock = io_port_stop_sequence_and_lock(ioport);
  ioport->set_up = false;
  // What they last said would stay listed: a siren that is gone would be on for ever.
  io_port_undeclare_events(ioport);
  if (ioport->functions->drop) {
    ioport->functions->drop(ioport);
  } else {
    destroy_record(ioport);
    ioport->backend_released = true;
  }
}

PortType io_port_get_type(const IOPort *ioport) {
  return ioport->type;
}

void io_port_set_type(IOPort *ioport, PortType type) {
  ioport->type = type;
}

const std::optional<std::string> &io_port_get_id(const IOPort *ioport) {
  return ioport->id;
}

void io_port_set_id(IOPort *ioport, std::string id) {
  ioport->id = std::move(id);
}

const char *io_port_describe(const IOPort *ioport) {
  return ioport->id ? ioport->id->c_str() : "(without name)";
}

int io_port_get_number(const IOPort *ioport) {
  return ioport->number;
}

void io_port_set_number(IOPort *ioport, int number) {
  ioport->number = number;
}

bool io_port_is_optional(const IOPort *ioport) {
  return ioport->optional;
}

void io_port_set_optional(IOPort *ioport, bool optional) {
  ioport->optional = optional;
}

void io_port_set_flag(IOPort *ioport, const std::string &name, const char *text) {
  ioport->properties[name] = g_ascii_strcasecmp(text, "true") == 0;
}

bool io_port_get_flag(const IOPort *ioport, const char *name) {
  return ioport->functions && io_port_lookup_flag(ioport, name).value_or(false);
}

std::optional<bool> io_port_lookup_flag(const IOPort *ioport, const char *name) {
  const auto entry = ioport->properties.find(name);
  if (entry == ioport->properties.end()) {
    return std::nullopt;
  }
  return entry->second;
}

std::vector<std::pair<std::string, bool>> io_port_get_flags(const IOPort *ioport) {
  return {ioport->properties.begin(), ioport->properties.end()};
}

bool io_port_is_ioport(const IOPort *ioport) {
  return ioport && io_port_get_flag(ioport, "ioport");
}

bool io_port_set_mode(IOPort *ioport, int mode) {
  if (mode != PORT_MODE_MONOSTABLE && mode != PORT_MODE_BISTABLE) {
    return false;
  }
  ioport->mode = mode;
  return true;
}

int io_port_get_mode(const IOPort *ioport) {
  return ioport ? ioport->mode : 0;
}

void io_port_set_delay_time(IOPort *ioport, std::int32_t delay_time) {
  ioport->delay_time = delay_time;
}

std::int32_t io_port_get_delay_time(const IOPort *ioport) {
  return ioport ? ioport->delay_time : -1;
}

void io_port_set_pulse_time(IOPort *ioport, std::uint32_t pulse_time) {
  ioport->pulse_time = pulse_time;
}

std::uint32_t io_port_get_pulse_time(const IOPort *ioport) {
  return ioport->pulse_time;
}

void io_port_set_button(IOPort *ioport, int button) {
  ioport->button = button;
}

int io_port_get_button(const IOPort *ioport) {
  return ioport->button;
}

void io_port_set_spare_setting(IOPort *ioport, std::uint32_t value) {
  if (value != 0) {
    ioport->spare_setting = value;
  }
}

std::uint32_t io_port_get_spare_setting(const IOPort *ioport) {
  return ioport ? ioport->spare_setting : 0;
}
