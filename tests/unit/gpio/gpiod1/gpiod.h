// What is used of libgpiod 1, so that its caller compiles where another one is installed.
#pragma once

struct gpiod_chip;
struct gpiod_line;

extern "C" {
gpiod_chip *gpiod_chip_open(const char *path);
void gpiod_chip_close(gpiod_chip *chip);
const char *gpiod_chip_name(gpiod_chip *chip);
const char *gpiod_chip_label(gpiod_chip *chip);
unsigned int gpiod_chip_num_lines(gpiod_chip *chip);
gpiod_line *gpiod_chip_find_line(gpiod_chip *chip, const char *name);
unsigned int gpiod_line_offset(gpiod_line *line);
}
