#include "support/line-history.h"

#include <array>
#include <cstdio>
#include <optional>
#include <sstream>
#include <string_view>
#include <utility>

#include "support/files.h"

namespace {

constexpr const char *kTracing = "/sys/kernel/tracing/";
constexpr std::size_t kWord = 8;

std::string tracing(const char *file) {
  return std::string(kTracing) + file;
}

struct Entry {
  int gpio = -1;
  std::string what;
};

// Reading a level is recorded as well, and no change.
std::optional<Entry> entry_in(const std::string &line) {
  int gpio = -1;
  int value = -1;
  std::array<char, kWord> word{};
  const auto direction = line.find("gpio_direction: ");
  if (direction != std::string::npos &&
      std::sscanf(line.c_str() + direction, "gpio_direction: %d %7s", &gpio, word.data()) == 2) {
    return Entry{.gpio = gpio, .what = word.data()};
  }
  const auto level = line.find("gpio_value: ");
  if (level != std::string::npos &&
      std::sscanf(line.c_str() + level, "gpio_value: %d %7s %d", &gpio, word.data(), &value) == 3 &&
      std::string_view(word.data()) == "set") {
    return Entry{.gpio = gpio, .what = "set " + std::to_string(value)};
  }
  return std::nullopt;
}

std::vector<Entry> all_entries() {
  std::istringstream trace(read_text(tracing("trace")).value_or(""));
  std::vector<Entry> entries;
  for (std::string line; std::getline(trace, line);) {
    if (auto entry = entry_in(line)) {
      entries.push_back(std::move(*entry));
    }
  }
  return entries;
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
  std::vector<std::string> entries;
  for (auto &entry : all_entries()) {
    if (entry.gpio == number) {
      entries.push_back(std::move(entry.what));
    }
  }
  return entries;
}

std::vector<std::string> LineHistory::together(const std::map<int, std::string> &names) {
  std::vector<std::string> entries;
  for (const auto &entry : all_entries()) {
    if (const auto name = names.find(entry.gpio); name != names.end()) {
      entries.push_back(name->second + " " + entry.what);
    }
  }
  return entries;
}
