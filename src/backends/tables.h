// The table-making function of each backend: it gives the port its private record if it has none
// and returns the backend's one operations table.
#pragma once

#include "port/ioport.h"

const PortFunctions *check_backend_functions(IOPort *ioport);
const PortFunctions *gpio_backend_functions(IOPort *ioport);
const PortFunctions *iobox_backend_functions(IOPort *ioport);
const PortFunctions *null_backend_functions(IOPort *ioport);
const PortFunctions *spiadc_backend_functions(IOPort *ioport);
const PortFunctions *sysfs_backend_functions(IOPort *ioport);
const PortFunctions *virtual_backend_functions(IOPort *ioport);
