// What the host implementation of the GPIO library is made of. For its own files and its tests: the
// daemon knows ugpio/ugpio.h only.
#pragma once

#include <optional>
#include <string>

// Where sysfs is found instead of /sys. Before the first request; the daemon never calls it.
void ugpio_host_set_root(std::string root);
const std::string &ugpio_host_root();

// Where the GPIO character devices are found instead of in /dev. The daemon never calls it.
void ugpio_host_set_device_directory(std::string directory);

// The contents of a small attribute file without the line's end, or nothing.
std::optional<std::string> ugpio_host_read_file(const std::string &path);

// A line as its GPIO character device knows it.
struct UgpioHostLine {
  std::string chip;    // the device's name
  std::string label;   // of the chip
  unsigned int lines;  // of the chip
  unsigned int offset;
};

// The line of that name among the GPIO character devices. Where names repeat, it is the first one
// of the chip with the lowest number. Nothing, with errno, when there is none: ENOENT, or why a
// chip that might have it could not be asked.
std::optional<UgpioHostLine> ugpio_host_find_line(const char *name);

// The same on one chip, given by the path of its device. Each interface of libgpiod that there is,
// 1 and 2, has a file with its own.
std::optional<UgpioHostLine> ugpio_host_find_on_chip(const std::string &device, const char *name);

// The number by which sysfs knows the line. Nothing, with errno, when sysfs has no chip for it, or
// several that can't be told apart.
std::optional<unsigned int> ugpio_host_line_number(const UgpioHostLine &line);
