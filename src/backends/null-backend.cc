// Ports that exist but never change: they read inactive and ignore every request.
#include "backends/tables.h"

namespace {

bool setup(IOPort * /*ioport*/, bool /*initial_level*/) {
  return true;
}

std::uint32_t get_state(IOPort * /*ioport*/) {
  return 0;
}

void set_state(IOPort * /*ioport*/, std::int32_t /*level*/) {}

void start_watch(IOPort * /*ioport*/) {}

void set_direction(IOPort * /*ioport*/, bool /*input*/) {}

void set_property(IOPort * /*ioport*/, const char * /*section*/, const char * /*key*/,
                  const char * /*value*/) {}

void free_data(IOPort * /*ioport*/) {}

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

const PortFunctions *null_backend_functions(IOPort * /*ioport*/) {
  return &kFunctions;
}
