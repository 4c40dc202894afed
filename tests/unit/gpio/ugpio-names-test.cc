#include "ugpio-fixture.h"

namespace {

class UgpioNamesTest : public UgpioHostTest {
 protected:
  void make_chip(const char *class_name, const char *device, const char *base, const char *label,
                 const char *lines) const {
    const std::string chip = std::string("class/gpio/") + class_name;
    tree.write_file(chip + "/base", std::string(base) + "\n");
    tree.write_file(chip + "/label", std::string(label) + "\n");
    tree.write_file(chip + "/ngpio", std::string(lines) + "\n");
    tree.make_link(chip + "/device", device);
  }
  void make_character_device(const char *name, const char *directory) const {
    tree.write_file(std::string(directory) + "/dev", "254:0\n");
    tree.make_link(std::string("bus/gpio/devices/") + name, directory);
  }
  // Two chips, whose character devices are numbered the other way round than in sysfs.
  void make_two_chips() const {
    make_character_device("gpiochip0", "devices/soc/gpiochip0");
    make_character_device("gpiochip1", "devices/expander/gpiochip1");
    make_chip("gpiochip512", "devices/soc", "512", "soc", "32");
    make_chip("gpiochip480", "devices/expander", "480", "expander", "16");
  }
};

TEST_F(UgpioNamesTest, ANamedLineIsTheNumberOfItsChipPlusItsOffset) {
  make_two_chips();
  named_line = {.chip = "gpiochip1", .label = "expander", .lines = 16, .offset = 3};
  const ContextPtr context(ugpio_request_one_named("siren", kOutputHigh));
  ASSERT_TRUE(context);
  EXPECT_EQ(tree.writes, (Writes{"export 483", "gpio483/direction high"}));
}

TEST_F(UgpioNamesTest, ANamedLineCanBeRequestedWithoutFlags) {
  make_two_chips();
  named_line = {.chip = "gpiochip0", .label = "soc", .lines = 32, .offset = 0};
  const ContextPtr context(ugpio_request_named("sioctrl"));
  ASSERT_TRUE(context);
  EXPECT_EQ(tree.writes, Writes{"export 512"});
}

TEST_F(UgpioNamesTest, AnUnknownNameGivesNoEntry) {
  EXPECT_FALSE(ContextPtr(ugpio_request_one_named("siren", kInput)));
  EXPECT_EQ(errno, ENOENT);
  EXPECT_FALSE(ContextPtr(ugpio_request_named("siren")));
  EXPECT_EQ(errno, ENOENT);
  EXPECT_EQ(
      log.take_all(G_LOG_LEVEL_WARNING, "Can't find GPIO line siren: No such file or directory"),
      2U);
}

TEST_F(UgpioNamesTest, ANameWhoseNumberCannotBeHadIsExplained) {
  named_line = {.chip = "gpiochip1", .label = "expander", .lines = 16, .offset = 3};
  EXPECT_FALSE(ContextPtr(ugpio_request_one_named("siren", kInput)));
  EXPECT_EQ(errno, ENODEV);
  EXPECT_TRUE(log.took_warning("Can't find the number of GPIO line siren in " + ugpio_host_root() +
                               "/class/gpio: No such device"));
}

TEST_F(UgpioNamesTest, NoNameIsInvalid) {
  EXPECT_FALSE(ContextPtr(ugpio_request_one_named(nullptr, kInput)));
  EXPECT_EQ(errno, EINVAL);
  EXPECT_FALSE(ContextPtr(ugpio_request_named(nullptr)));
}

TEST_F(UgpioNamesTest, ChipsOfOneDeviceAreToldApartByTheirLabels) {
  make_character_device("gpiochip0", "devices/soc/gpiochip0");
  make_chip("gpiochip512", "devices/soc", "512", "bank-a", "32");
  make_chip("gpiochip480", "devices/soc", "480", "bank-b", "32");
  EXPECT_EQ(ugpio_host_line_number({"gpiochip0", "bank-b", 32, 1}), 481U);
}

TEST_F(UgpioNamesTest, ChipsThatCannotBeToldApartAreNotGuessed) {
  make_character_device("gpiochip0", "devices/soc/gpiochip0");
  make_chip("gpiochip512", "devices/soc", "512", "bank", "32");
  make_chip("gpiochip480", "devices/soc", "480", "bank", "32");
  EXPECT_FALSE(ugpio_host_line_number({"gpiochip0", "bank", 32, 1}));
  EXPECT_EQ(errno, ENOTUNIQ);
}

TEST_F(UgpioNamesTest, AChipWithoutADeviceOfItsOwnIsItsOwnDevice) {
  make_character_device("gpiochip0", "devices/gpiochip0");
  make_chip("gpiochip100", "devices/gpiochip0", "100", "lone", "8");
  EXPECT_EQ(ugpio_host_line_number({"gpiochip0", "lone", 8, 7}), 107U);
}

TEST_F(UgpioNamesTest, AChipThatSysfsDoesNotHaveGivesNoDevice) {
  make_character_device("gpiochip0", "devices/soc/gpiochip0");
  make_chip("gpiochip480", "devices/expander", "480", "soc", "32");
  EXPECT_FALSE(ugpio_host_line_number({"gpiochip0", "soc", 32, 1}));
  EXPECT_EQ(errno, ENODEV);
  EXPECT_FALSE(ugpio_host_line_number({"gpiochip7", "soc", 32, 1}));
  EXPECT_EQ(errno, ENODEV);
}

}  // namespace

std::optional<UgpioHostLine> ugpio_host_find_line(const char * /*name*/) {
  if (!named_line) {
    errno = ENOENT;
  }
  return named_line;
}
