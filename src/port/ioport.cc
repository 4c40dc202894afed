// Lifetime, backend binding and identity of a port.
#include "port/ioport.h"

#include <algorithm>
#include <array>

#include "base/log.h"
#include "port/ioport-private.h"
#include "port/port-listener.h"

namespace {

constexpr int kBackendKinds = 10;

struct Backend {
  MakePortFunctions make = nullptr;
  const char *word = nullptr;
};

std::array<Backend, kBackendKinds> &backends() {
  static std::array<Backend, kBackendKinds> table{};
  return table;
}

bool kind_in_range(int kind) {
  return kind >= 0 && kind < kBackendKinds;
}

void install_backend(IOPort *ioport) {
  const MakePortFunctions make = backends().at(static_cast<size_t>(ioport->backend)).make;
  if (make) {
    ioport->functions = make(ioport);
  }
}

void release_backend(IOPort *ioport) {
  if (io_port_backend_serves(ioport) && ioport->functions->free) {
    ioport->functions->free(ioport);
    ioport->backend_released = true;
  }
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
  install_backend(ioport);
  // The description's ranges are only the first ones; the user may have set others since.
  const SupervisedRanges ranges = ioport->supervised_ranges;
  for (const auto &property : ioport->backend_properties) {
    apply_backend_property(ioport, property);
  }
  ioport->supervised_ranges = ranges;
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
  release_backend(ioport);
  delete ioport;
}

void io_port_register_backend(int kind, MakePortFunctions make, const char *word) {
  if (!kind_in_range(kind)) {
    return;
  }
  Backend &backend = backends().at(static_cast<size_t>(kind));
  backend.make = make;
  if (word) {
    backend.word = word;
  }
}

std::optional<int> io_port_backend_kind(std::string_view word) {
  const auto &table = backends();
  const auto *const found = std::find_if(table.begin(), table.end(), [&](const Backend &backend) {
    return backend.word && backend.word == word;
  });
  return found == table.end() ? std::nullopt
                              : std::optional<int>(static_cast<int>(found - table.begin()));
}

void io_port_set_backend(IOPort *ioport, int kind) {
  if (ioport->functions && ioport->backend != kind) {
    release_backend(ioport);  // the next backend must not find the record of another
    ioport->functions = nullptr;
    ioport->backend_properties.clear();
  }
  ioport->backend = kind;
  ioport->backend_released = false;
  if (kind_in_range(kind)) {
    install_backend(ioport);
  }
}

int io_port_get_backend(const IOPort *ioport) {
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

void io_port_set_backend_data(IOPort *ioport, std::unique_ptr<PortBackendData> data) {
  ioport->backend_data = std::move(data);
}

bool io_port_setup(IOPort *port) {
  g_assert(port != NULL);
  g_assert(port->functions != NULL);
  rebuild_released_backend(port);
  const bool ok = port->functions->setup(port, port->activelow_output);
  if (ok) {
    port->set_up = true;
  }
  return ok;
}

bool io_port_is_set_up(const IOPort *ioport) {
  return ioport->set_up;
}

void io_port_drop(IOPort *ioport) {
  if (!ioport->functions) {
    return;
  }
  const auto lock = io_port_stop_sequence_and_lock(ioport);
  ioport->set_up = false;
  if (ioport->functions->drop) {
    ioport->functions->drop(ioport);
  } else {
    release_backend(ioport);
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
