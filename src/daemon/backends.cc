#include "daemon/backends.h"

#include "port/ioport.h"

// Each is at the end of its backend's file.
extern const PortFunctions kCheckBackend;
extern const PortFunctions kGpioBackend;
extern const PortFunctions kIioBackend;
extern const PortFunctions kIioInterruptBackend;
extern const PortFunctions kIoBoxBackend;
extern const PortFunctions kNullBackend;
extern const PortFunctions kSpiAdcBackend;
extern const PortFunctions kSpiBackend;
extern const PortFunctions kSysfsBackend;
extern const PortFunctions kVirtualBackend;

namespace {

constexpr Backend kBackends[] = {
    {"virtual", BACKEND_VIRTUAL, &kVirtualBackend},
    {"gpio", BACKEND_GPIO, &kGpioBackend},
    {"spiadc", BACKEND_SPIADC, &kSpiAdcBackend},
    {"spi", BACKEND_SPI, &kSpiBackend},
    {"iio", BACKEND_IIO, &kIioBackend},
    {"iio-interrupt", BACKEND_IIO_INTERRUPT, &kIioInterruptBackend},
    {"sysfs", BACKEND_SYSFS, &kSysfsBackend},
    {"iobox", BACKEND_IOBOX, &kIoBoxBackend},
    {"null", BACKEND_NULL, &kNullBackend},
    {"check", BACKEND_CHECK, &kCheckBackend},
};

}  // namespace

void backends_register() {
  for (const auto &backend : kBackends) {
    io_port_register_backend(backend);
  }
}
