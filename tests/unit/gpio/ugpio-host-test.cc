#include "platform/host/ugpio-host.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <ugpio/ugpio.h>
#include <unistd.h>

#include <cerrno>
#include <memory>

#include "base/glib-ptr.h"
#include "kernel-tree.h"
#include "log-capture.h"

namespace {

using Writes = std::vector<std::string>;
using ContextPtr = std::unique_ptr<ugpio_t, GlibDeleter<ugpio_free>>;

constexpr unsigned int kInput = 0x14D;
constexpr unsigned int kOutputHigh = 0x42;
constexpr unsigned int kOutputLow = 0x40;
constexpr uid_t kNobody = 65534;

std::optional<UgpioHostLine> named_line;

class UgpioHostTest : public testing::Test {
 protected:
  UgpioHostTest() { named_line.reset(); }

  static ContextPtr request(unsigned int flags) {
    return ContextPtr(ugpio_request_one(12, flags, "pin"));
  }
  static ContextPtr open(unsigned int flags) {
    ContextPtr context = request(flags);
    EXPECT_EQ(ugpio_full_open(context.get()), 0);
    return context;
  }
  std::string line_file(const char *name) const {
    return tree.read_file(std::string("class/gpio/gpio12/") + name);
  }
  void set_line_file(const char *name, const char *text) const {
    tree.write_file(std::string("class/gpio/gpio12/") + name, text);
  }

  LogCapture log;
  KernelTree tree;
};

// Takes root's rights away for a while; for other users there is nothing to take away.
class Unprivileged {
 public:
  Unprivileged() {
    if (was_root_) {
      EXPECT_EQ(seteuid(kNobody), 0);
    }
  }
  Unprivileged(const Unprivileged &) = delete;
  Unprivileged &operator=(const Unprivileged &) = delete;
  ~Unprivileged() {
    if (was_root_) {
      EXPECT_EQ(seteuid(0), 0);
    }
  }

 private:
  bool was_root_ = geteuid() == 0;
};

// --- Requests ---

TEST_F(UgpioHostTest, AnInputIsExportedAndSignalsBothEdges) {
  const ContextPtr context = request(kInput);
  ASSERT_TRUE(context);
  EXPECT_EQ(tree.writes, (Writes{"export 12", "gpio12/direction in", "gpio12/edge both"}));
}

TEST_F(UgpioHostTest, EachTriggerHasItsWord) {
  const ContextPtr falling = request(0x5);
  EXPECT_EQ(line_file("edge"), "falling");
  const ContextPtr rising = request(0x9);
  EXPECT_EQ(line_file("edge"), "rising");
}

TEST_F(UgpioHostTest, AnInitiallyHighOutputGetsDirectionAndLevelInOneStep) {
  const ContextPtr context = request(kOutputHigh);
  ASSERT_TRUE(context);
  EXPECT_EQ(tree.writes, (Writes{"export 12", "gpio12/direction high"}));
  EXPECT_EQ(line_file("value"), "0\n") << "the value file is not touched";
}

TEST_F(UgpioHostTest, AnInitiallyLowOutputGetsDirectionAndLevelInOneStep) {
  const ContextPtr context = request(kOutputLow);
  ASSERT_TRUE(context);
  EXPECT_EQ(tree.writes, (Writes{"export 12", "gpio12/direction low"}));
}

TEST_F(UgpioHostTest, TheSenseFollowsTheInitialLevel) {
  const ContextPtr context = open(kOutputHigh);
  EXPECT_EQ(ugpio_set_activelow(context.get(), 1), 0);
  EXPECT_EQ(tree.writes, (Writes{"export 12", "gpio12/direction high", "gpio12/active_low 1"}));
}

TEST_F(UgpioHostTest, APlainRequestLeavesTheDirectionAlone) {
  const ContextPtr context(ugpio_request(12, "control"));
  ASSERT_TRUE(context);
  EXPECT_EQ(tree.writes, Writes{"export 12"});
}

TEST_F(UgpioHostTest, ALongerTextInTheFileLeavesNoRest) {
  tree.attributes["direction"] = "output\n";
  const ContextPtr context = request(kInput);
  EXPECT_EQ(line_file("direction"), "in");
}

TEST_F(UgpioHostTest, AFreedLineIsUnexported) {
  request(kInput).reset();
  EXPECT_EQ(tree.writes.back(), "unexport 12");
}

// --- Lines that were exported before ---

TEST_F(UgpioHostTest, ALineExportedBeforeIsUsedAndNotUnexported) {
  tree.make_line("12");
  request(kOutputHigh).reset();
  EXPECT_EQ(tree.writes, Writes{"gpio12/direction high"});
}

TEST_F(UgpioHostTest, ALineExportedInTheSameMomentIsUsedAndNotUnexported) {
  tree.errors["export"] = EBUSY;
  tree.on_export = [this] { tree.make_line("12"); };
  request(kInput).reset();
  EXPECT_EQ(tree.writes, (Writes{"export 12", "gpio12/direction in", "gpio12/edge both"}));
}

TEST_F(UgpioHostTest, EdgesLeftByAnEarlierUserAreOffBeforeTheLineBecomesAnOutput) {
  tree.attributes["edge"] = "both\n";
  tree.make_line("12");
  const ContextPtr context = request(kOutputLow);
  EXPECT_EQ(tree.writes, (Writes{"gpio12/edge none", "gpio12/direction low"}));
}

TEST_F(UgpioHostTest, AnInputWithoutTriggersHasItsEdgesOff) {
  tree.attributes["edge"] = "rising\n";
  tree.make_line("12");
  const ContextPtr context = request(0x1);
  EXPECT_EQ(tree.writes, (Writes{"gpio12/direction in", "gpio12/edge none"}));
}

// --- Failures ---

TEST_F(UgpioHostTest, ARefusedExportGivesItsReason) {
  for (const int code : {EBUSY, EACCES, EINVAL, EPERM}) {
    tree.errors["export"] = code;
    errno = 0;
    EXPECT_FALSE(request(kInput));
    EXPECT_EQ(errno, code);
  }
  EXPECT_EQ(tree.slept, 0);
}

TEST_F(UgpioHostTest, AnExportThatMayNotBeWrittenGivesAccessDenied) {
  tree.set_mode("class/gpio/export", 0444);
  const Unprivileged nobody;
  EXPECT_FALSE(request(kInput));
  EXPECT_EQ(errno, EACCES);
}

TEST_F(UgpioHostTest, WithoutSysfsGpioNothingCanBeRequested) {
  tree.remove("class");
  EXPECT_FALSE(request(kInput));
  EXPECT_EQ(errno, ENOENT);
  EXPECT_FALSE(ContextPtr(ugpio_request(12, "control")));
}

TEST_F(UgpioHostTest, ARefusedDirectionGivesTheLineBackAndKeepsTheReason) {
  tree.errors["direction"] = EIO;
  tree.errors["unexport"] = EPERM;
  EXPECT_FALSE(request(kOutputHigh));
  EXPECT_EQ(errno, EIO);
  EXPECT_EQ(tree.writes.back(), "unexport 12");
}

TEST_F(UgpioHostTest, RefusedEdgesGiveTheLineBack) {
  tree.errors["edge"] = EBUSY;
  EXPECT_FALSE(request(kInput));
  EXPECT_EQ(errno, EBUSY);
  EXPECT_EQ(tree.writes.back(), "unexport 12");
}

TEST_F(UgpioHostTest, ALineThatCannotInterruptIsReadableAllTheSame) {
  tree.attributes.erase("edge");
  tree.attributes["value"] = "1\n";
  const ContextPtr context = open(kInput);
  EXPECT_EQ(ugpio_get_value(context.get()), 1);
  EXPECT_EQ(log.count("GPIO 12 can't signal edges: its changes go unseen"), 1);
}

TEST_F(UgpioHostTest, ARefusedSenseGivesItsReason) {
  const ContextPtr context = open(kInput);
  tree.errors["active_low"] = EPERM;
  EXPECT_EQ(ugpio_set_activelow(context.get(), 1), -1);
  EXPECT_EQ(errno, EPERM);
}

TEST_F(UgpioHostTest, ALineWithoutValueDoesNotOpen) {
  tree.attributes.erase("value");
  const ContextPtr context = request(kInput);
  EXPECT_EQ(ugpio_full_open(context.get()), -1);
  EXPECT_EQ(errno, ENOENT);
  EXPECT_EQ(ugpio_fd(context.get()), -1);
}

// --- Files that come late ---

TEST_F(UgpioHostTest, TheFilesOfAFreshLineAreWaitedFor) {
  tree.exports = false;
  tree.on_sleep = [this] {
    if (tree.slept >= 20'000) {
      tree.make_line("12");
      tree.on_sleep = nullptr;
    }
  };
  EXPECT_TRUE(request(kInput));
}

TEST_F(UgpioHostTest, TheRightsToAFreshLineAreWaitedFor) {
  if (geteuid() == 0) {
    tree.exports = false;
    tree.set_mode("class/gpio/export", 0666);
    tree.on_sleep = [this] {
      const uid_t user = geteuid();
      ASSERT_EQ(seteuid(0), 0);
      if (tree.slept == 1'000) {
        tree.make_line("12");
      } else if (tree.slept == 20'000) {
        for (const auto &[name, text] : tree.attributes) {
          tree.set_mode("class/gpio/gpio12/" + name, 0666);
        }
      }
      ASSERT_EQ(seteuid(user), 0);
    };
    const Unprivileged nobody;
    EXPECT_TRUE(request(kInput));
    EXPECT_EQ(tree.slept, 20'000);
  }
}

TEST_F(UgpioHostTest, ALineThatNeverAppearsIsNotWaitedForLong) {
  tree.exports = false;
  EXPECT_FALSE(request(kInput));
  EXPECT_EQ(errno, ENOENT);
  EXPECT_LE(tree.slept, 500'000);
  EXPECT_EQ(tree.writes.back(), "unexport 12");
}

TEST_F(UgpioHostTest, ALineExportedBeforeIsNotWaitedFor) {
  tree.attributes.erase("direction");
  tree.make_line("12");
  EXPECT_FALSE(request(kInput));
  EXPECT_EQ(errno, ENOENT);
  EXPECT_EQ(tree.slept, 0);
}

// --- Values ---

TEST_F(UgpioHostTest, TheValueIsReadFromTheStartEveryTime) {
  const ContextPtr context = open(kInput);
  EXPECT_EQ(ugpio_get_value(context.get()), 0);
  set_line_file("value", "1\n");
  EXPECT_EQ(ugpio_get_value(context.get()), 1);
  EXPECT_EQ(ugpio_get_value(context.get()), 1);
}

// The kernel signals on every descriptor that was never read.
TEST_F(UgpioHostTest, AnOpenedLineHasBeenReadSoThatItSignalsOnlyEdges) {
  const ContextPtr context = open(kInput);
  EXPECT_EQ(tree.reads, 1);
}

TEST_F(UgpioHostTest, AValueThatIsNoLevelCannotBeRead) {
  const ContextPtr context = open(kInput);
  for (const char *text : {"", "x\n", "\n", "-1\n"}) {
    set_line_file("value", text);
    EXPECT_EQ(ugpio_get_value(context.get()), -1) << text;
    EXPECT_EQ(errno, EIO);
  }
}

TEST_F(UgpioHostTest, AnUnreadableValueGivesItsReason) {
  const ContextPtr context = open(kOutputLow);
  const int fd = ugpio_fd(context.get());
  const int write_only = ::open("/dev/null", O_WRONLY | O_CLOEXEC);
  ASSERT_EQ(dup2(write_only, fd), fd);
  close(write_only);
  EXPECT_EQ(ugpio_get_value(context.get()), -1);
  EXPECT_EQ(errno, EBADF);
}

TEST_F(UgpioHostTest, AnOutputIsDrivenThroughItsValue) {
  const ContextPtr context = open(kOutputLow);
  EXPECT_EQ(ugpio_set_value(context.get(), 1), 0);
  EXPECT_EQ(line_file("value"), "1\n");
  EXPECT_EQ(ugpio_get_value(context.get()), 1);
  EXPECT_EQ(ugpio_set_value(context.get(), 0), 0);
  EXPECT_EQ(line_file("value"), "0\n");
}

TEST_F(UgpioHostTest, AnyValueButZeroIsHigh) {
  const ContextPtr context = open(kOutputLow);
  EXPECT_EQ(ugpio_set_value(context.get(), 7), 0);
  EXPECT_EQ(line_file("value"), "1\n");
}

TEST_F(UgpioHostTest, AnInputCannotBeDriven) {
  const ContextPtr context = open(kInput);
  EXPECT_EQ(ugpio_set_value(context.get(), 1), -1);
  EXPECT_NE(errno, 0);
  EXPECT_EQ(line_file("value"), "0\n");
}

TEST_F(UgpioHostTest, AValueThatMayOnlyBeReadIsOpenedForReading) {
  if (geteuid() == 0) {
    tree.make_line("12");
    tree.set_mode("class/gpio/gpio12/value", 0444);
    const ContextPtr context = request(kOutputLow);
    const Unprivileged nobody;
    EXPECT_EQ(ugpio_full_open(context.get()), 0);
    EXPECT_EQ(ugpio_get_value(context.get()), 0);
    EXPECT_EQ(ugpio_set_value(context.get(), 1), -1);
  }
}

TEST_F(UgpioHostTest, TheDescriptorIsTheValueFiles) {
  const ContextPtr context = open(kInput);
  const GCharPtr path(g_file_read_link(
      ("/proc/self/fd/" + std::to_string(ugpio_fd(context.get()))).c_str(), nullptr));
  EXPECT_TRUE(g_str_has_suffix(path.get(), "/class/gpio/gpio12/value"));
}

TEST_F(UgpioHostTest, ALineThatIsNotOpenFailsInEveryCall) {
  const ContextPtr context = request(kOutputLow);
  EXPECT_EQ(ugpio_get_value(context.get()), -1);
  EXPECT_EQ(errno, EBADF);
  EXPECT_EQ(ugpio_set_value(context.get(), 1), -1);
  EXPECT_EQ(errno, EBADF);
  EXPECT_EQ(ugpio_fd(context.get()), -1);
  EXPECT_EQ(errno, EBADF);
}

TEST_F(UgpioHostTest, AClosedLineCanBeOpenedAgain) {
  const ContextPtr context = open(kInput);
  ugpio_close(context.get());
  EXPECT_EQ(ugpio_fd(context.get()), -1);
  EXPECT_EQ(ugpio_full_open(context.get()), 0);
  EXPECT_EQ(ugpio_full_open(context.get()), 0);
  EXPECT_EQ(ugpio_get_value(context.get()), 0);
}

TEST_F(UgpioHostTest, NoContextFailsInEveryCallAndNeverCrashes) {
  const auto fails = [](int result) { return result == -1 && std::exchange(errno, 0) == EINVAL; };
  EXPECT_TRUE(fails(ugpio_full_open(nullptr)));
  EXPECT_TRUE(fails(ugpio_set_activelow(nullptr, 1)));
  EXPECT_TRUE(fails(ugpio_get_value(nullptr)));
  EXPECT_TRUE(fails(ugpio_set_value(nullptr, 1)));
  EXPECT_TRUE(fails(ugpio_fd(nullptr)));
  ugpio_close(nullptr);
  ugpio_free(nullptr);
}

// --- Names ---

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
