// A port, a state and a moment in the words and the JSON that all commands share.
#pragma once

#include <string>

#include "portctl/json.h"
#include "portctl/ports.h"
#include "portctl/text.h"

// Number, identifier, name, role, state and everything else that is known of the port.
std::string port_json(const Port &port);

Table::Cell state_cell(const Port &port);
// The state of a measured line with its level, "off" where supervision is off, "-" where there is
// none.
Table::Cell line_cell(const Port &port);

// Short and cut lines have been tampered with.
bool is_tampered(const std::string &line);

// Now, as 2026-11-21T22:30:01.123+00:00.
std::string time_stamp();
