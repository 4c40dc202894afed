// Ports that record what they are told. The hardware description can make their set-up fail, with
// the property "setup" and the value "fail" in any section.
#include "backends/check-backend.h"

#include <algorithm>

namespace {

CheckBackendData *data_of(IOPort *port) {
  return static_cast<CheckBackendData *>(io_port_backend_data(port));
}

bool setup(IOPort *port, bool /*initial_level*/) {
  CheckBackendData *data = data_of(port);
  data->setup_ok = std::none_of(
      data->properties.begin(), data->properties.end(),
      [](const auto &property) { return property.key == "setup" && property.value == "fail"; });
  if (!data->setup_ok) {
    io_port_note_fault(port, "its description says so");
  }
  return data->setup_ok;
}

std::uint32_t get_state(IOPort *port) {
  return static_cast<std::uint32_t>(data_of(port)->state);
}

void set_state(IOPort *port, std::int32_t level) {
  data_of(port)->state = level;
}

void start_watch(IOPort *port) {
  data_of(port)->watching = true;
}

void set_direction(IOPort *port, bool input) {
  data_of(port)->direction = input ? 1 : 0;
}

void set_property(IOPort *port, const char *section, const char *key, const char *value) {
  data_of(port)->properties.push_front({section, key, value});
}

}  // namespace

extern constexpr PortFunctions kCheckBackend = {
    .make_record = make_backend_record<CheckBackendData>,
    .setup = setup,
    .get_state = get_state,
    .set_state = set_state,
    .start_watch = start_watch,
    .set_direction = set_direction,
    .set_property = set_property,
};
