// The hardware variant of this device, as the system policy service knows it.
#pragma once

#include <optional>
#include <string>

// Asks the service for a parameter of the boot block, and waits for the answer while the main
// loop's sources are served. A service that does not answer holds the caller for 25 seconds, and at
// later look-ups for 0.1 seconds. None, with a message, when it is not known. Main thread, at
// start-up.
std::optional<std::string> read_hardware_id(const char *parameter);

// Forgets the service, which a look-up remembers for the next one: it may be another process by
// then. Main thread.
void release_hardware_id_service();
