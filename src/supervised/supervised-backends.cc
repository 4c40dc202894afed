#include "supervised/supervised-backends.h"

namespace {

struct Backend {
  const char *word;
  int kind;
  MakePortFunctions make;
};

constexpr Backend kBackends[] = {
    {"spi", 3, supervised_spi_backend_functions},
    {"iio", 4, supervised_iio_backend_functions},
    {"iio-interrupt", 5, supervised_iio_interrupt_backend_functions},
};

}  // namespace

void supervised_backends_register() {
  for (const auto &backend : kBackends) {
    io_port_register_backend(backend.kind, backend.make, backend.word);
  }
}
