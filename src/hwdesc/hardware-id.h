// The hardware variant of this device, as the system policy service knows it.
#pragma once

#include <optional>
#include <string>

// Asks the service for a parameter of the boot block. Waits for the answer, for as long as the bus
// lets a call wait (25 seconds) at the worst. None, with a message, when it can't be had. Main
// thread, at start-up.
std::optional<std::string> read_hardware_id(const char *parameter);
