// Any bytes as the export of an older parameter store. What was taken from it must come back from
// the settings file that it is saved to.
#include <cstdlib>
#include <optional>
#include <string>
#include <vector>

#include "base/glib-ptr.h"
#include "fuzz-support.h"
#include "port/ioport.h"
#include "port/port-registry.h"
#include "settings/param-legacy.h"
#include "settings/param.h"

namespace {

struct OutputSettings {
  int button;
  int mode;
  std::uint32_t pulse_time;
  std::int32_t delay_time;

  bool operator==(const OutputSettings &other) const = default;
};

struct Settings {
  bool input;
  bool activelow_input;
  bool activelow_output;
  std::optional<std::string> input_name;
  std::optional<std::string> output_name;
  std::optional<OutputSettings> output;  // none: the port has no such side, so nothing is saved

  bool operator==(const Settings &other) const = default;
};

Settings settings_of(const IOPort *port) {
  Settings settings{.input = io_port_direction_input(port),
                    .activelow_input = io_port_get_activelow(port, true),
                    .activelow_output = io_port_get_activelow(port, false),
                    .input_name = {},
                    .output_name = {},
                    .output = {}};
  io_port_get_names(port, &settings.input_name, &settings.output_name);
  if (io_port_get_type(port) != PORT_INPUT) {
    settings.output = {.button = io_port_get_button(port),
                       .mode = io_port_get_mode(port),
                       .pulse_time = io_port_get_pulse_time(port),
                       .delay_time = io_port_get_delay_time(port)};
  }
  return settings;
}

std::vector<Settings> all_settings() {
  std::vector<Settings> all;
  port_registry_for_each([&](IOPort *port) { all.push_back(settings_of(port)); });
  return all;
}

}  // namespace

// NOLINTNEXTLINE(readability-identifier-naming)
extern "C" int LLVMFuzzerInitialize(int * /*argc*/, char *** /*argv*/) {
  fuzz_initialise();
  return 0;
}

// NOLINTNEXTLINE(readability-identifier-naming)
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  static InputFile file;
  file.write(data, size);
  fuzz_add_port_of_each_type();
  Error ignored;
  param_import_parhand(file.path().c_str(), ignored.out());
  port_registry_assign_default_names();
  const auto imported = all_settings();
  file.write(data, 0);
  param_save_all(file.path());
  port_registry_drop_all();

  fuzz_add_port_of_each_type();
  if (!fuzz_apply_settings(file.path()) || all_settings() != imported) {
    std::abort();
  }
  port_registry_drop_all();
  return 0;
}
