#include "supervised/supervised-edge-watch.h"

#include "supervised/supervised-data.h"

namespace {

constexpr std::uint32_t kUnknownLevel = 2;

int read_pin(IOPort *port) {
  SupervisedData *data = supervised_data(port);
  if (io_port_input(port)) {
    return data->edges.read(data->input.get());
  }
  const std::lock_guard guard(data->pins_lock);
  return libugpio_get_gpio_pin(data->output.get());
}

}  // namespace

std::uint32_t supervised_pin_level(IOPort *port) {
  const int level = read_pin(port);
  return level < 0 ? kUnknownLevel : static_cast<std::uint32_t>(level != 0);
}

void supervised_set_edge_watch(IOPort *port, bool on) {
  SupervisedData *data = supervised_data(port);
  if (!on) {
    data->edges.stop();
  } else if (!data->edges.is_on()) {
    data->edges.start(port, (io_port_input(port) ? data->input : data->output).get());
  }
}
