#include "support/gpio-sim.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <system_error>

#include "support/files.h"
#include "support/wait.h"

namespace {

constexpr const char *kSims = "/sys/kernel/config/gpio-sim/";
constexpr const char *kClass = "/sys/class/gpio/";

int base_of(const std::string &device) {
  for (const auto &chip : std::filesystem::directory_iterator(kClass)) {
    std::error_code error;
    if (canonical(chip.path() / "device", error) == device &&
        chip.path().filename().string().starts_with("gpiochip")) {
      return static_cast<int>(read_number(chip.path() / "base"));
    }
  }
  ADD_FAILURE() << device << " has no chip in " << kClass;
  return -1;
}

}  // namespace

GpioSim::GpioSim(const std::string &name, const std::vector<std::string> &lines)
    : folder_(kSims + name), lines_(static_cast<int>(lines.size())) {
  make_folder(folder_ + "/bank0");
  write_text(folder_ + "/bank0/num_lines", std::to_string(lines_));
  for (int line = 0; line < lines_; ++line) {
    const std::string entry = folder_ + "/bank0/line" + std::to_string(line);
    if (!lines[line].empty()) {
      make_folder(entry);
      write_text(entry + "/name", lines[line]);
    }
  }
  plug();
}

GpioSim::~GpioSim() {
  if (base_ >= 0) {
    unplug();
  }
  for (int line = 0; line < lines_; ++line) {
    rmdir((folder_ + "/bank0/line" + std::to_string(line)).c_str());
  }
  rmdir((folder_ + "/bank0").c_str());
  EXPECT_EQ(rmdir(folder_.c_str()), 0);
}

void GpioSim::plug() {
  write_text(folder_ + "/live", "1");
  device_ = "/sys/devices/platform/" + read_text(folder_ + "/dev_name").value_or("?");
  base_ = base_of(device_);
}

void GpioSim::unplug() {
  write_text(folder_ + "/live", "0");
  base_ = -1;
}

std::string GpioSim::line_path(int line, const char *attribute) const {
  return device_ + "/" + chip() + "/sim_gpio" + std::to_string(line) + "/" + attribute;
}

std::string GpioSim::chip() const {
  return read_text(folder_ + "/bank0/chip_name").value_or("?");
}

void GpioSim::pull(int line, bool high) const {
  write_text(line_path(line, "pull"), high ? "pull-up" : "pull-down");
}

bool GpioSim::level(int line) const {
  return read_number(line_path(line, "value")) == 1;
}

int GpioSim::number(int line) const {
  return base_ + line;
}

void GpioSim::export_low(int line) const {
  write_text(std::string(kClass) + "export", number_text(line));
  write_text(std::string(kClass) + "gpio" + number_text(line) + "/direction", "low");
}
