#include "backends/backends.h"

#include "backends/tables.h"
#include "port/ioport.h"

namespace {

struct Backend {
  const char *word;
  int kind;
  MakePortFunctions make;
};

constexpr Backend kBackends[] = {
    {"virtual", 0, virtual_backend_functions}, {"gpio", 1, gpio_backend_functions},
    {"spiadc", 2, spiadc_backend_functions},   {"sysfs", 6, sysfs_backend_functions},
    {"iobox", 7, iobox_backend_functions},     {"null", 8, null_backend_functions},
    {"check", 9, check_backend_functions},
};

}  // namespace

void backends_register() {
  for (const auto &backend : kBackends) {
    io_port_register_backend(backend.kind, backend.make, backend.word);
  }
}
