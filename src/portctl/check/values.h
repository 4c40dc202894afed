// One attribute's value against its type.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "portctl/check/document.h"
#include "vocabulary/vocabulary.h"

// What is wrong with the value, and what to write instead; nothing when it is well.
std::optional<std::string> value_mistake(const vocabulary::Attribute &attribute,
                                         const std::string &value);

// The attributes of an element against those that it may have. `owner` names who reads them, such
// as
// "<port_no>" or "the backend gpio in <input>".
void check_attributes(const DocumentElement &element,
                      std::span<const vocabulary::Attribute> attributes, const std::string &owner,
                      Findings &findings);

// A number of one of the number types; nothing when the text is none.
std::optional<std::int64_t> parse_number_as(vocabulary::Type type, const std::string &text);
