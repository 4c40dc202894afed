#include <gpiod.h>

#include "fake-chip.h"

struct gpiod_line {
  unsigned int offset;
};

struct gpiod_chip {
  FakeChip *fake;
  gpiod_line found;
};

gpiod_chip *gpiod_chip_open(const char *path) {
  FakeChip *fake = fake_chip_open(path);
  return fake ? new gpiod_chip{.fake = fake, .found = {}} : nullptr;
}

void gpiod_chip_close(gpiod_chip *chip) {
  fake_chip_close(chip->fake);
  delete chip;
}

const char *gpiod_chip_name(gpiod_chip *chip) {
  return chip->fake->name.c_str();
}
const char *gpiod_chip_label(gpiod_chip *chip) {
  return chip->fake->label.c_str();
}
unsigned int gpiod_chip_num_lines(gpiod_chip *chip) {
  return chip->fake->lines.size();
}

gpiod_line *gpiod_chip_find_line(gpiod_chip *chip, const char *name) {
  const int offset = fake_chip_find(*chip->fake, name);
  chip->found.offset = static_cast<unsigned int>(offset);
  return offset < 0 ? nullptr : &chip->found;
}

unsigned int gpiod_line_offset(gpiod_line *line) {
  return line->offset;
}
