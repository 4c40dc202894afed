#include "settings/setting-words.h"

#include <array>

#include "port/ioport.h"

namespace {

struct Word {
  const char *text;
  int value;
};

constexpr std::array<Word, 2> kActivelowWords = {{{"open", true}, {"closed", false}}};
constexpr std::array<Word, 2> kDirectionWords = {{{"input", true}, {"output", false}}};
constexpr std::array<Word, 3> kButtonWords = {
    {{"none", BUTTON_NONE}, {"pulse", BUTTON_PULSE}, {"actinact", BUTTON_ACTINACT}}};
constexpr std::array<Word, 2> kModeWords = {
    {{"monostable", PORT_MODE_MONOSTABLE}, {"bistable", PORT_MODE_BISTABLE}}};

template <typename Words>
const char *word_of(const Words &words, int value) {
  for (const auto &word : words) {
    if (word.value == value) {
      return word.text;
    }
  }
  return "";
}

template <typename Value, typename Words>
std::optional<Value> parse(const Words &words, std::string_view text) {
  for (const auto &word : words) {
    if (word.text == text) {
      return static_cast<Value>(word.value);
    }
  }
  return std::nullopt;
}

}  // namespace

const char *activelow_word(bool activelow) {
  return word_of(kActivelowWords, activelow);
}

std::optional<bool> parse_activelow(std::string_view word) {
  return parse<bool>(kActivelowWords, word);
}

const char *direction_word(bool input) {
  return word_of(kDirectionWords, input);
}

std::optional<bool> parse_direction(std::string_view word) {
  return parse<bool>(kDirectionWords, word);
}

const char *button_word(int button) {
  return word_of(kButtonWords, button);
}

std::optional<int> parse_button(std::string_view word) {
  return parse<int>(kButtonWords, word);
}

const char *mode_word(int mode) {
  return word_of(kModeWords, mode);
}

std::optional<int> parse_mode(std::string_view word) {
  return parse<int>(kModeWords, word);
}
