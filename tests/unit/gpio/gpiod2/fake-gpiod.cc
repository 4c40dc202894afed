#include <gpiod.h>

#include "fake-chip.h"

struct gpiod_chip {
  FakeChip *fake;
};

// Outlives its chip, as the real one does.
struct gpiod_chip_info {
  FakeChip copy;
};

gpiod_chip *gpiod_chip_open(const char *path) {
  FakeChip *fake = fake_chip_open(path);
  return fake ? new gpiod_chip{.fake = fake} : nullptr;
}

void gpiod_chip_close(gpiod_chip *chip) {
  fake_chip_close(chip->fake);
  delete chip;
}

gpiod_chip_info *gpiod_chip_get_info(gpiod_chip *chip) {
  fake_chips_open++;
  return new gpiod_chip_info{.copy = *chip->fake};
}

void gpiod_chip_info_free(gpiod_chip_info *info) {
  fake_chips_open--;
  delete info;
}

int gpiod_chip_get_line_offset_from_name(gpiod_chip *chip, const char *name) {
  return fake_chip_find(*chip->fake, name);
}

const char *gpiod_chip_info_get_name(gpiod_chip_info *info) {
  return info->copy.name.c_str();
}
const char *gpiod_chip_info_get_label(gpiod_chip_info *info) {
  return info->copy.label.c_str();
}
std::size_t gpiod_chip_info_get_num_lines(gpiod_chip_info *info) {
  return info->copy.lines.size();
}
