#include "support/fake-supervised.h"

#include <gio/gio.h>

#include <utility>

namespace {

FakeSupervisedData &data_of(IOPort *port) {
  return *static_cast<FakeSupervisedData *>(io_port_backend_data(port));
}

bool setup(IOPort *port, bool initial_level) {
  data_of(port).calls.push_back(initial_level ? "setup high" : "setup low");
  return true;
}

bool is_supervisable(IOPort *port) {
  return data_of(port).supervisable;
}

bool set_supervised(IOPort *port, bool supervised) {
  data_of(port).calls.push_back(supervised ? "set_supervised on" : "set_supervised off");
  return true;
}

SupervisedRanges get_ranges(IOPort *port) {
  return data_of(port).ranges;
}

bool set_ranges(IOPort *port, SupervisedRanges ranges, GError **error) {
  FakeSupervisedData &data = data_of(port);
  data.calls.push_back("set_ranges");
  if (data.refuses_ranges) {
    g_set_error_literal(error, G_IO_ERROR, G_IO_ERROR_FAILED, "The fake refuses.");
    return false;
  }
  data.ranges = std::move(ranges);
  return true;
}

bool get_readout(IOPort *port, SupervisedRangeState *state, std::uint32_t *level, GError **error) {
  const FakeSupervisedData &data = data_of(port);
  if (data.readout_fails) {
    g_set_error_literal(error, G_IO_ERROR, G_IO_ERROR_FAILED, "The fake reads nothing");
    return false;
  }
  *state = data.line;
  *level = data.line_level;
  return true;
}

std::uint32_t get_state(IOPort *port) {
  return data_of(port).raw;
}

void set_state(IOPort *port, std::int32_t level) {
  data_of(port).raw = static_cast<std::uint32_t>(level);
}

void start_watch(IOPort *port) {
  data_of(port).calls.push_back("start_watch");
}

void set_direction(IOPort *port, bool input) {
  data_of(port).calls.push_back(input ? "set_direction input" : "set_direction output");
}

constexpr PortFunctions kOnlyIsSupervisable = {
    .make_record = make_backend_record<FakeSupervisedData>,
    .setup = setup,
    .is_supervisable = is_supervisable,
    .get_state = get_state,
    .set_state = set_state,
    .start_watch = start_watch,
    .set_direction = set_direction,
};

constexpr PortFunctions with_all() {
  PortFunctions functions = kOnlyIsSupervisable;
  functions.set_supervised = set_supervised;
  functions.get_supervised_ranges = get_ranges;
  functions.set_supervised_ranges = set_ranges;
  functions.get_supervised_readout = get_readout;
  return functions;
}

constexpr PortFunctions without_ranges() {
  PortFunctions functions = with_all();
  functions.get_supervised_ranges = nullptr;
  functions.set_supervised_ranges = nullptr;
  return functions;
}

constexpr PortFunctions kAll = with_all();
constexpr PortFunctions kNoRanges = without_ranges();

const PortFunctions *functions_for(FakeSlots slots) {
  switch (slots) {
    case FakeSlots::kAll:
      return &kAll;
    case FakeSlots::kNoRanges:
      return &kNoRanges;
    case FakeSlots::kOnlyIsSupervisable:
      return &kOnlyIsSupervisable;
  }
  return nullptr;
}

}  // namespace

void register_fake_supervised(FakeSlots slots) {
  io_port_register_backend({"spi", kFakeSupervisedKind, functions_for(slots)});
}

FakeSupervisedData &fake_record(const IOPortRef &port) {
  return *static_cast<FakeSupervisedData *>(io_port_backend_data(port.get()));
}
