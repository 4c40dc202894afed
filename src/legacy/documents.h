// The two documents that lead the legacy configuration service to the ports: which objects there
// are, and which parameter is which property. Fixed: every
// blank in them.
#pragma once

#include <string>
#include <vector>

#include "port/ioport.h"

struct LegacyPort {
  int number;
  PortType type;
};

// The objects and interfaces of the service. Without any port: those of port 0, which is always
// there.
std::string legacy_registry_document(const std::vector<LegacyPort> &ports);

// Each legacy parameter with its property, its type and who may access it. `ports` by rising
// number.
std::string legacy_mapping_document(const std::vector<LegacyPort> &ports);
