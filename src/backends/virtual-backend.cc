// Ports that exist in memory only; clients set their state.
#include <atomic>

#include "backends/tables.h"

namespace {

struct VirtualBackendData : PortBackendData {
  std::atomic<std::int32_t> state = 0;  // the last value set; action threads set it too
};

VirtualBackendData *data_of(IOPort *ioport) {
  return static_cast<VirtualBackendData *>(io_port_backend_data(ioport));
}

bool setup(IOPort * /*ioport*/, bool /*initial_level*/) {
  return true;
}

std::uint32_t get_state(IOPort *ioport) {
  return data_of(ioport)->state > 0 ? 1 : 0;
}

void set_state(IOPort *ioport, std::int32_t level) {
  data_of(ioport)->state = level;
}

void start_watch(IOPort * /*ioport*/) {}

void set_direction(IOPort * /*ioport*/, bool /*input*/) {}

void set_property(IOPort * /*ioport*/, const char * /*section*/, const char * /*key*/,
                  const char * /*value*/) {}

void free_data(IOPort *ioport) {
  io_port_set_backend_data(ioport, nullptr);
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

const PortFunctions *virtual_backend_functions(IOPort *ioport) {
  io_port_make_backend_data<VirtualBackendData>(ioport);
  return &kFunctions;
}
