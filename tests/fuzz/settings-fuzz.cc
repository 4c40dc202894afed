// Any bytes as a settings file, read into one port of each type and saved back.
#include <cstdlib>

#include "fuzz-support.h"
#include "port/ioport.h"
#include "port/port-registry.h"
#include "settings/param.h"
#include "support/fake-supervised.h"

// NOLINTNEXTLINE(readability-identifier-naming)
extern "C" int LLVMFuzzerInitialize(int * /*argc*/, char *** /*argv*/) {
  fuzz_initialise();
  register_fake_supervised();
  return 0;
}

// NOLINTNEXTLINE(readability-identifier-naming)
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  static InputFile file;
  file.write(data, size);
  fuzz_add_port_of_each_type();
  fuzz_add_port(3, "line", PORT_INPUT, kFakeSupervisedKind);
  const bool readable = fuzz_apply_settings(file.path());
  port_registry_assign_default_names();
  param_save_all(file.path());
  if (readable && !fuzz_apply_settings(file.path())) {
    std::abort();
  }
  port_registry_drop_all();
  return 0;
}
