// What is used of libgpiod 2, so that its caller compiles where another one is installed.
#pragma once

#include <cstddef>

struct gpiod_chip;
struct gpiod_chip_info;

extern "C" {
gpiod_chip *gpiod_chip_open(const char *path);
void gpiod_chip_close(gpiod_chip *chip);
gpiod_chip_info *gpiod_chip_get_info(gpiod_chip *chip);
int gpiod_chip_get_line_offset_from_name(gpiod_chip *chip, const char *name);
void gpiod_chip_info_free(gpiod_chip_info *info);
const char *gpiod_chip_info_get_name(gpiod_chip_info *info);
const char *gpiod_chip_info_get_label(gpiod_chip_info *info);
std::size_t gpiod_chip_info_get_num_lines(gpiod_chip_info *info);
}
