// Any bytes as a hardware description.
#include "fuzz-support.h"
#include "hwdesc/hwdesc.h"
#include "port/port-registry.h"

// NOLINTNEXTLINE(readability-identifier-naming)
extern "C" int LLVMFuzzerInitialize(int * /*argc*/, char *** /*argv*/) {
  fuzz_initialise();
  return 0;
}

// NOLINTNEXTLINE(readability-identifier-naming)
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  static InputFile file;
  file.write(data, size);
  hwdesc_load_file(file.path());
  port_registry_assign_default_names();
  fuzz_exercise_ports();
  port_registry_drop_all();
  return 0;
}
