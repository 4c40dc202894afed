// Ports that exist but never change: they read inactive and ignore every request.
#include "port/port-functions.h"

extern constexpr PortFunctions kNullBackend = {};
