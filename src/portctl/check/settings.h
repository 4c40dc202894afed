// A settings file held against the vocabulary and the ports that it is for.
#pragma once

#include <string>
#include <vector>

#include "portctl/check/description.h"

void check_settings(const std::string &file, const std::string &text,
                    const std::vector<DescribedPort> &ports, Findings &findings);
