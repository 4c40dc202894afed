// The supervised backends by kind, and the words that the hardware description has for them.
#pragma once

#include "port/ioport.h"

// Makes every supervised backend known to the port layer. Once, before the hardware description is
// loaded.
void supervised_backends_register();

// The table-making function of each backend: it gives the port its private record if it has none
// and returns the backend's one operations table.
const PortFunctions *supervised_iio_backend_functions(IOPort *port);
const PortFunctions *supervised_iio_interrupt_backend_functions(IOPort *port);
const PortFunctions *supervised_spi_backend_functions(IOPort *port);
