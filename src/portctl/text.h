// Text for people: what strangers named is made safe to print, columns line up, and colours appear
// on terminals only. Main thread only.
#pragma once

#include <glib.h>

#include <string>
#include <string_view>
#include <vector>

// Whether the character could move the cursor, start an escape sequence or turn the writing
// direction. None is beyond U+FFFF.
bool is_unsafe(gunichar character);

// The text with every character that could move the cursor, start an escape sequence, break the
// line or turn the writing direction written as \xNN or \u{NNNN}. Bytes that are no UTF-8 are
// written so too.
std::string visible(std::string_view text);

// Columns that the text takes on a terminal. `text` is what visible() gave.
int display_width(std::string_view text);

// `text`, cut or filled with blanks to exactly `width` columns. A cut text ends with "~".
std::string fitted(std::string_view text, int width);

enum class Style { kPlain, kBold, kDim, kGood, kBad, kWarn };

// Whether `file` is a terminal on which colours are welcome (NO_COLOR is not set, TERM is not
// "dumb").
bool colours_on(int file);

// `text` in a style, where `colours` says so.
std::string styled(std::string_view text, Style style, bool colours);

// Rows of cells, printed with the columns aligned. The first row is the heading.
class Table {
 public:
  struct Cell {
    std::string text;  // made visible when it is printed
    Style style = Style::kPlain;
  };
  using Row = std::vector<Cell>;

  void add(Row row) { rows_.push_back(std::move(row)); }
  std::string text(bool colours) const;

 private:
  std::vector<Row> rows_;
};
