// The words that stand for port settings in files and on D-Bus. They are compared exactly, letter
// case included. Any thread.
#pragma once

#include <optional>
#include <string_view>

// An active-low flag: "open" (set) or "closed".
const char *activelow_word(bool activelow);
std::optional<bool> parse_activelow(std::string_view word);

// A direction: "input" (true) or "output".
const char *direction_word(bool input);
std::optional<bool> parse_direction(std::string_view word);

// A ButtonType: "none", "pulse" or "actinact". A value that is none has the empty word.
const char *button_word(int button);
std::optional<int> parse_button(std::string_view word);

// A PortMode: "monostable" or "bistable". A value that is none has the empty word.
const char *mode_word(int mode);
std::optional<int> parse_mode(std::string_view word);
