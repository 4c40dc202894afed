// The search for a line by its name over all GPIO chips. Compiled with each interface of libgpiod.
#include <gtest/gtest.h>

#include <cerrno>
#include <optional>
#include <string>

#include "fake-chip.h"
#include "platform/host/ugpio-host.h"
#include "support/temp-dir.h"

namespace {

class GpiodTest : public testing::Test {
 protected:
  GpiodTest() { ugpio_host_set_device_directory(devices_.path()); }
  ~GpiodTest() override { EXPECT_EQ(fake_chips_open, 0) << "not closed"; }

  void make_chip(const char *device, const char *label_and_lines) const {
    devices_.write(device, label_and_lines);
  }

  // The chip's device and the line's offset, or why there is none.
  static std::string find(const char *name) {
    errno = 0;
    const std::optional<UgpioHostLine> line = ugpio_host_find_line(name);
    return line ? line->chip + " " + std::to_string(line->offset) : std::to_string(-errno);
  }

 private:
  TempDir devices_;
};

TEST_F(GpiodTest, ALineIsFoundWithWhatTellsItsChip) {
  make_chip("gpiochip0", "soc led siren");
  const std::optional<UgpioHostLine> line = ugpio_host_find_line("siren");
  ASSERT_TRUE(line);
  EXPECT_EQ(line->chip, "gpiochip0");
  EXPECT_EQ(line->label, "soc");
  EXPECT_EQ(line->lines, 2U);
  EXPECT_EQ(line->offset, 1U);
}

TEST_F(GpiodTest, TheChipOfTheLowestNumberWinsWhereNamesRepeat) {
  make_chip("gpiochip10", "late siren");
  make_chip("gpiochip9", "soon led siren");
  make_chip("gpiochip11", "last siren");
  EXPECT_EQ(find("siren"), "gpiochip9 1");
}

TEST_F(GpiodTest, AChipThatCannotBeOpenedDoesNotEndTheSearch) {
  make_chip("gpiochip0", "denied");
  make_chip("gpiochip1", "soc siren");
  EXPECT_EQ(find("siren"), "gpiochip1 0");
}

TEST_F(GpiodTest, AnUnknownNameIsNoEntry) {
  make_chip("gpiochip0", "soc led");
  EXPECT_EQ(find("siren"), std::to_string(-ENOENT));
}

TEST_F(GpiodTest, AnUnknownNameIsTheErrorOfTheChipThatMightHaveIt) {
  make_chip("gpiochip0", "denied");
  make_chip("gpiochip1", "soc led");
  EXPECT_EQ(find("siren"), std::to_string(-EACCES));
}

TEST_F(GpiodTest, OtherDevicesAreNoChips) {
  make_chip("gpiochip", "nameless siren");
  make_chip("gpiochip0x", "odd siren");
  make_chip("gpiomem", "memory siren");
  EXPECT_EQ(find("siren"), std::to_string(-ENOENT));
}

TEST_F(GpiodTest, NoDevicesAtAllIsNoEntry) {
  ugpio_host_set_device_directory("/nonexistent");
  EXPECT_EQ(find("siren"), std::to_string(-ENOENT));
}

}  // namespace
