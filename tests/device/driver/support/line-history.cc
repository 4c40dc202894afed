#include "support/line-history.h"

#include <array>
#include <cstdio>
#include <sstream>

#include "support/files.h"

namespace {

constexpr const char *kTracing = "/sys/kernel/tracing/";
constexpr std::size_t kWord = 8;

std::string tracing(const char *file) {
  return std::string(kTracing) + file;
}

// Reading a level is recorded as well, and no change.
std::string entry_in(const std::string &line, int number) {
  int gpio = -1;
  int value = -1;
  std::array<char, kWord> word{};
  const auto direction = line.find("gpio_direction: ");
  if (direction != std::string::npos &&
      std::sscanf(line.c_str() + direction, "gpio_direction: %d %7s", &gpio, word.data()) == 2) {
    return gpio == number ? word.data() : "";
  }
  const auto level = line.find("gpio_value: ");
  if (level != std::string::npos &&
      std::sscanf(line.c_str() + level, "gpio_value: %d %7s %d", &gpio, word.data(), &value) == 3) {
    const std::string what = word.data();
    return gpio == number && what == "set" ? what + " " + std::to_string(value) : "";
  }
  return "";
}

}  // namespace

LineHistory::LineHistory() {
  forget();
  write_text(tracing("events/gpio/enable"), "1");
  write_text(tracing("tracing_on"), "1");
}

LineHistory::~LineHistory() {
  write_text(tracing("events/gpio/enable"), "0");
  forget();
}

void LineHistory::forget() {
  write_text(tracing("trace"), "");
}

std::vector<std::string> LineHistory::of(int number) {
  std::istringstream trace(read_text(tracing("trace")).value_or(""));
  std::vector<std::string> entries;
  for (std::string line; std::getline(trace, line);) {
    if (std::string entry = entry_in(line, number); !entry.empty()) {
      entries.push_back(std::move(entry));
    }
  }
  return entries;
}
