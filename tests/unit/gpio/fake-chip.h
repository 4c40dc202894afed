// A GPIO chip that is played by a file: its label, then the names of its lines, a word each. One
// that says "denied" can't be opened.
#pragma once

#include <string>
#include <vector>

struct FakeChip {
  std::string name;
  std::string label;
  std::vector<std::string> lines;
};

inline int fake_chips_open = 0;

// Null, with errno, when there is no such chip or it can't be opened.
FakeChip *fake_chip_open(const char *path);
void fake_chip_close(FakeChip *chip);
// Where the chip has its first line of that name; -1, with errno, when it has none.
int fake_chip_find(const FakeChip &chip, const char *line);
