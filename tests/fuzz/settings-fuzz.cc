// Any bytes as a settings file, read into one port of each type and saved back.
#include "fuzz-support.h"
#include "port/ioport.h"
#include "port/port-registry.h"
#include "settings/param.h"

namespace {

void add_port(const char *id, PortType type) {
  constexpr int check_backend = 9;
  static int number = 0;
  const IOPortRef ioport(io_port_new());
  io_port_set_id(ioport.get(), id);
  io_port_set_type(ioport.get(), type);
  io_port_set_number(ioport.get(), number++ % 3);
  io_port_set_backend(ioport.get(), check_backend);
  io_port_set_flag(ioport.get(), "ioport", "true");
  port_registry_add(ioport.get());
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int * /*argc*/, char *** /*argv*/) {
  fuzz_initialise();
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  static InputFile file;
  file.write(data, size);
  add_port("in", PORT_INPUT);
  add_port("out", PORT_OUTPUT);
  add_port("both", PORT_CONFIGURABLE);
  if (param_read_configuration(file.path())) {
    port_registry_for_each([](IOPort *ioport) { param_get_conf_vals(ioport); });
    param_free_configuration();
  }
  port_registry_assign_default_names();
  param_save_all(file.path());
  port_registry_drop_all();
  return 0;
}
