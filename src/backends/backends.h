// The backends by kind, and the words that the hardware description has for them.
#pragma once

#include <optional>
#include <string_view>

// Makes every backend known to the port layer. Once, before the hardware description is loaded.
void backends_register();

// The kind for a word of the hardware description, compared exactly.
std::optional<int> backend_kind_from_word(std::string_view word);
