// Ports that exist in memory only; clients set their state.
#include <atomic>

#include "port/ioport.h"

namespace {

struct VirtualBackendData : PortBackendData {
  std::atomic<std::int32_t> state = 0;  // the last value set; action threads set it too
};

VirtualBackendData *data_of(IOPort *port) {
  return static_cast<VirtualBackendData *>(io_port_backend_data(port));
}

std::uint32_t get_state(IOPort *port) {
  return data_of(port)->state > 0 ? 1 : 0;
}

void set_state(IOPort *port, std::int32_t level) {
  data_of(port)->state = level;
}

}  // namespace

extern constexpr PortFunctions kVirtualBackend = {
    .make_record = make_backend_record<VirtualBackendData>,
    .get_state = get_state,
    .set_state = set_state,
};
