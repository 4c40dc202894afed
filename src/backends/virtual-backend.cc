// Ports that exist in memory only; clients set their state.
#include <atomic>

#include "port/ioport.h"

namespace {

struct VirtualBackendData : PortBackendData {
  std::atomic<std::int32_t> state = 0;  // the last value set; action threads set it too
};

VirtualBackendData *data_of(IOPort *ioport) {
  return static_cast<VirtualBackendData *>(io_port_backend_data(ioport));
}

std::uint32_t get_state(IOPort *ioport) {
  return data_of(ioport)->state > 0 ? 1 : 0;
}

void set_state(IOPort *ioport, std::int32_t level) {
  data_of(ioport)->state = level;
}

}  // namespace

extern constexpr PortFunctions kVirtualBackend = {
    .make_record = make_backend_record<VirtualBackendData>,
    .get_state = get_state,
    .set_state = set_state,
};
