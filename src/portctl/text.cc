#include "portctl/text.h"

#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>

namespace {

constexpr const char *kReset = "\033[0m";

// Marks that turn the writing direction can make a line read as another one.
bool changes_direction(gunichar character) {
  return character == 0x061C || (character >= 0x200E && character <= 0x200F) ||
         (character >= 0x2028 && character <= 0x202E) ||
         (character >= 0x2066 && character <= 0x2069) || character == 0xFEFF;
}

std::string escaped(const char *format, unsigned value) {
  char text[16];
  std::snprintf(text, sizeof text, format, value);
  return text;
}

const char *sgr(Style style) {
  switch (style) {
    case Style::kBold:
      return "\033[1m";
    case Style::kDim:
      return "\033[2m";
    case Style::kGood:
      return "\033[32m";
    case Style::kBad:
      return "\033[31m";
    case Style::kWarn:
      return "\033[33m";
    case Style::kPlain:
      break;
  }
  return "";
}

int cell_width(gunichar character) {
  if (g_unichar_iszerowidth(character)) {
    return 0;
  }
  return g_unichar_iswide(character) ? 2 : 1;
}

}  // namespace

bool is_unsafe(gunichar character) {
  return g_unichar_iscntrl(character) || changes_direction(character);
}

std::string visible(std::string_view text) {
  std::string shown;
  const char *const end = text.data() + text.size();
  for (const char *at = text.data(); at < end;) {
    const gunichar character = g_utf8_get_char_validated(at, end - at);
    if (character == static_cast<gunichar>(-1) || character == static_cast<gunichar>(-2)) {
      shown += escaped("\\x%02x", static_cast<unsigned char>(*at++));
      continue;
    }
    const char *const next = g_utf8_next_char(at);
    if (g_unichar_iscntrl(character)) {
      shown += escaped("\\x%02x", character);
    } else if (changes_direction(character)) {
      shown += escaped("\\u{%04x}", character);
    } else {
      shown.append(at, next);
    }
    at = next;
  }
  return shown;
}

int display_width(std::string_view text) {
  int width = 0;
  const char *const end = text.data() + text.size();
  for (const char *at = text.data(); at < end; at = g_utf8_next_char(at)) {
    width += cell_width(g_utf8_get_char(at));
  }
  return width;
}

std::string fitted(std::string_view text, int width) {
  const int taken = display_width(text);
  if (taken <= width) {
    return std::string(text) + std::string(static_cast<std::size_t>(width - taken), ' ');
  }
  std::string cut;
  int used = 0;
  const char *const end = text.data() + text.size();
  for (const char *at = text.data(); at < end;) {
    const char *const next = g_utf8_next_char(at);
    const int columns = cell_width(g_utf8_get_char(at));
    if (used + columns > width - 1) {
      break;
    }
    cut.append(at, next);
    used += columns;
    at = next;
  }
  return width > 0 ? cut + "~" + std::string(static_cast<std::size_t>(width - used - 1), ' ') : "";
}

bool colours_on(int file) {
  const char *unwanted = std::getenv("NO_COLOR");
  const char *terminal = std::getenv("TERM");
  return isatty(file) && !(unwanted && *unwanted) && terminal &&
         std::string_view(terminal) != "dumb";
}

std::string styled(std::string_view text, Style style, bool colours) {
  if (!colours || style == Style::kPlain) {
    return std::string(text);
  }
  return sgr(style) + std::string(text) + kReset;
}

std::string Table::text(bool colours) const {
  std::vector<int> widths;
  for (const auto &row : rows_) {
    widths.resize(std::max(widths.size(), row.size()));
    for (std::size_t i = 0; i < row.size(); ++i) {
      widths[i] = std::max(widths[i], display_width(visible(row[i].text)));
    }
  }
  std::string shown;
  for (const auto &row : rows_) {
    std::string line;
    for (std::size_t i = 0; i < row.size(); ++i) {
      const std::string cell = visible(row[i].text);
      const bool last = i + 1 == row.size();
      line += styled(last ? cell : fitted(cell, widths[i]), row[i].style, colours);
      line += last ? "" : "  ";
    }
    line.erase(line.find_last_not_of(' ') + 1);
    shown += line + "\n";
  }
  return shown;
}
