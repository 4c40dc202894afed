// The words that the hardware description has for the backends.
#include <gtest/gtest.h>

#include "daemon/backends.h"
#include "port/ioport.h"

namespace {

TEST(BackendWord, StandsForItsKind) {
  backends_register();
  const std::pair<const char *, int> words[] = {
      {"virtual", 0},       {"gpio", 1},  {"spiadc", 2}, {"spi", 3},  {"iio", 4},
      {"iio-interrupt", 5}, {"sysfs", 6}, {"iobox", 7},  {"null", 8}, {"check", 9}};
  for (const auto &[word, kind] : words) {
    EXPECT_EQ(io_port_backend_kind(word), kind) << word;
  }
}

TEST(BackendWord, IsMatchedExactly) {
  backends_register();
  for (const char *word : {"", "GPIO", "gpio ", " gpio", "iio-", "interrupt", "sys", "checks"}) {
    EXPECT_EQ(io_port_backend_kind(word), std::nullopt) << word;
  }
}

}  // namespace
