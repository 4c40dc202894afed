// A GPIO chip that the kernel simulates: lines that are pulled and watched from outside.
#pragma once

#include <string>
#include <vector>

class GpioSim {
 public:
  // The names of the lines, "" for a line without one.
  GpioSim(const std::string &name, const std::vector<std::string> &lines);
  GpioSim(const GpioSim &) = delete;
  GpioSim &operator=(const GpioSim &) = delete;
  ~GpioSim();

  // What the outside world does to an input.
  void pull(int line, bool high) const;
  // The level on the line, whoever drives it.
  bool level(int line) const;
  // The number of the line in sysfs, for documents and for the kernel's trace.
  int number(int line) const;
  std::string number_text(int line) const { return std::to_string(number(line)); }
  // The name of its character device.
  std::string chip() const;
  // Exports the line as the boot loader of the device leaves its control lines: a low output.
  void export_low(int line) const;
  // Takes the chip away, and puts a like one in its place, whose numbers may differ.
  void unplug();
  void plug();

 private:
  std::string line_path(int line, const char *attribute) const;

  std::string folder_;  // in configfs
  int lines_;
  std::string device_;  // in sysfs
  int base_ = -1;
};
