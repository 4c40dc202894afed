// What the tests that run on a bus share.
#pragma once

#include <string>

// Where the bus is, and who the process's shared connection is on it.
const std::string &bus_address();
const std::string &shared_name();
