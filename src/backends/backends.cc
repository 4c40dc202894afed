#include "backends/backends.h"

#include <algorithm>
#include <iterator>

#include "backends/tables.h"
#include "port/ioport.h"

namespace {

struct Backend {
  std::string_view word;
  int kind;
  MakePortFunctions make;
};

constexpr Backend kBackends[] = {
    {"virtual", 0, virtual_backend_functions},
    {"gpio", 1, gpio_backend_functions},
    {"spiadc", 2, spiadc_backend_functions},
    {"spi", 3, nullptr},
    {"iio", 4, nullptr},
    {"iio-interrupt", 5, nullptr},
    {"sysfs", 6, sysfs_backend_functions},
    {"iobox", 7, iobox_backend_functions},
    {"null", 8, null_backend_functions},
    {"check", 9, check_backend_functions},
};

}  // namespace

void backends_register() {
  for (const auto &backend : kBackends) {
    io_port_register_backend(backend.kind, backend.make);
  }
}

std::optional<int> backend_kind_from_word(std::string_view word) {
  const auto *const found =
      std::find_if(std::begin(kBackends), std::end(kBackends),
                   [&](const Backend &backend) { return backend.word == word; });
  return found == std::end(kBackends) ? std::nullopt : std::optional<int>(found->kind);
}
