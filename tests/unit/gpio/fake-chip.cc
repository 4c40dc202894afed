#include "fake-chip.h"

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>

FakeChip *fake_chip_open(const char *path) {
  std::ifstream file(path);
  auto chip = std::make_unique<FakeChip>();
  if (!(file >> chip->label)) {
    errno = ENOENT;
    return nullptr;
  }
  if (chip->label == "denied") {
    errno = EACCES;
    return nullptr;
  }
  chip->name = std::filesystem::path(path).filename();
  chip->lines.assign(std::istream_iterator<std::string>(file), {});
  fake_chips_open++;
  return chip.release();
}

void fake_chip_close(FakeChip *chip) {
  fake_chips_open--;
  const std::unique_ptr<FakeChip> closed(chip);
}

int fake_chip_find(const FakeChip &chip, const char *line) {
  const auto found = std::find(chip.lines.begin(), chip.lines.end(), line);
  if (found == chip.lines.end()) {
    errno = ENOENT;
    return -1;
  }
  return static_cast<int>(found - chip.lines.begin());
}
