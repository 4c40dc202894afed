#include <fcntl.h>

#include <functional>

#include "ugpio-fixture.h"

namespace {

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
  tree.make_line(12);
  request(kOutputHigh).reset();
  EXPECT_EQ(tree.writes, Writes{"gpio12/direction high"});
}

TEST_F(UgpioHostTest, ALineExportedInTheSameMomentIsUsedAndNotUnexported) {
  tree.errors["export"] = EBUSY;
  tree.on_export = [this] { tree.make_line(12); };
  request(kInput).reset();
  EXPECT_EQ(tree.writes, (Writes{"export 12", "gpio12/direction in", "gpio12/edge both"}));
}

TEST_F(UgpioHostTest, EdgesLeftByAnEarlierUserAreOffBeforeTheLineBecomesAnOutput) {
  tree.attributes["edge"] = "both\n";
  tree.make_line(12);
  const ContextPtr context = request(kOutputLow);
  EXPECT_EQ(tree.writes, (Writes{"gpio12/edge none", "gpio12/direction low"}));
}

TEST_F(UgpioHostTest, AnInputWithoutTriggersHasItsEdgesOff) {
  tree.attributes["edge"] = "rising\n";
  tree.make_line(12);
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
    EXPECT_TRUE(warned("Can't export GPIO 12 with", "export", code));
  }
  EXPECT_EQ(tree.slept, 0);
}

TEST_F(UgpioHostTest, AnExportThatMayNotBeWrittenGivesAccessDenied) {
  tree.set_mode("class/gpio/export", 0444);
  const Unprivileged nobody;
  EXPECT_FALSE(request(kInput));
  EXPECT_EQ(errno, EACCES);
  EXPECT_TRUE(warned("Can't export GPIO 12 with", "export", EACCES));
}

TEST_F(UgpioHostTest, WithoutSysfsGpioNothingCanBeRequested) {
  tree.remove("class");
  EXPECT_FALSE(request(kInput));
  EXPECT_EQ(errno, ENOENT);
  EXPECT_FALSE(ContextPtr(ugpio_request(12, "control")));
  EXPECT_TRUE(warned("Can't export GPIO 12 with", "export", ENOENT));
  EXPECT_TRUE(warned("Can't export GPIO 12 with", "export", ENOENT));
}

TEST_F(UgpioHostTest, ARefusedDirectionGivesTheLineBackAndKeepsTheReason) {
  tree.errors["direction"] = EIO;
  tree.errors["unexport"] = EPERM;
  EXPECT_FALSE(request(kOutputHigh));
  EXPECT_EQ(errno, EIO);
  EXPECT_EQ(tree.writes.back(), "unexport 12");
  EXPECT_TRUE(warned("Can't write", "gpio12/direction", EIO));
  EXPECT_TRUE(warned("Can't give GPIO 12 back with", "unexport", EPERM));
}

TEST_F(UgpioHostTest, RefusedEdgesGiveTheLineBack) {
  tree.errors["edge"] = EBUSY;
  EXPECT_FALSE(request(kInput));
  EXPECT_EQ(errno, EBUSY);
  EXPECT_EQ(tree.writes.back(), "unexport 12");
  EXPECT_TRUE(warned("Can't write", "gpio12/edge", EBUSY));
}

TEST_F(UgpioHostTest, ALineThatCannotInterruptIsReadableAllTheSame) {
  tree.attributes.erase("edge");
  tree.attributes["value"] = "1\n";
  const ContextPtr context = open(kInput);
  EXPECT_EQ(ugpio_get_value(context.get()), 1);
  EXPECT_TRUE(log.took_warning("GPIO 12 has no edge interrupts: its changes are not detected"));
  EXPECT_EQ(tree.slept, 0) << "the kernel will not show the file later either";
}

TEST_F(UgpioHostTest, ARefusedSenseGivesItsReason) {
  const ContextPtr context = open(kInput);
  tree.errors["active_low"] = EPERM;
  EXPECT_EQ(ugpio_set_activelow(context.get(), 1), -1);
  EXPECT_EQ(errno, EPERM);
  EXPECT_TRUE(warned("Can't write", "gpio12/active_low", EPERM));
}

TEST_F(UgpioHostTest, ALineWithoutValueDoesNotOpen) {
  tree.attributes.erase("value");
  const ContextPtr context = request(kInput);
  EXPECT_EQ(ugpio_full_open(context.get()), -1);
  EXPECT_EQ(errno, ENOENT);
  EXPECT_EQ(ugpio_fd(context.get()), -1);
  EXPECT_TRUE(warned("Can't open", "gpio12/value", ENOENT));
}

// --- Files that come late ---

TEST_F(UgpioHostTest, TheFilesOfAFreshLineAreWaitedFor) {
  tree.exports = false;
  tree.on_sleep = [this] {
    if (tree.slept >= 20'000) {
      tree.make_line(12);
      tree.on_sleep = nullptr;
    }
  };
  EXPECT_TRUE(request(kInput));
}

// A line that appears after 1 ms, without the rights that `withhold` takes away until 20 ms.
class UgpioLateRightsTest : public UgpioHostTest {
 protected:
  void expect_rights_are_waited_for(const std::function<void()> &withhold) {
    tree.exports = false;
    tree.set_mode("class/gpio/export", 0666);
    tree.on_sleep = [this, &withhold] {
      const Privileged owner;
      if (tree.slept == 1'000) {
        tree.make_line(12);
        withhold();
      } else if (tree.slept == 20'000) {
        set_line_modes(0666);
      }
    };
    ContextPtr context;
    {
      const Unprivileged nobody;
      context = request(kInput);
    }
    EXPECT_TRUE(context);
    EXPECT_EQ(tree.slept, 20'000);
    tree.on_sleep = nullptr;
  }
};

TEST_F(UgpioLateRightsTest, TheRightsToAFreshLineAreWaitedFor) {
  expect_rights_are_waited_for([this] { set_line_modes(0); });
}

TEST_F(UgpioLateRightsTest, TheRightsToTheEdgesAreWaitedForEvenWhenTheDirectionCouldBeWritten) {
  expect_rights_are_waited_for([this] {
    set_line_modes(0666);
    tree.set_mode("class/gpio/gpio12/edge", 0);
  });
}

TEST_F(UgpioHostTest, ALineThatNeverAppearsIsNotWaitedForLong) {
  tree.exports = false;
  EXPECT_FALSE(request(kInput));
  EXPECT_EQ(errno, ENOENT);
  EXPECT_LE(tree.slept, 500'000);
  EXPECT_EQ(tree.writes.back(), "unexport 12");
  EXPECT_TRUE(warned("Can't write", "gpio12/direction", ENOENT));
}

TEST_F(UgpioHostTest, ALineExportedBeforeIsNotWaitedFor) {
  tree.attributes.erase("direction");
  tree.make_line(12);
  EXPECT_FALSE(request(kInput));
  EXPECT_EQ(errno, ENOENT);
  EXPECT_EQ(tree.slept, 0);
  EXPECT_TRUE(warned("Can't write", "gpio12/direction", ENOENT));
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
  tree.make_line(12);
  tree.set_mode("class/gpio/gpio12/value", 0444);
  const ContextPtr context = request(kOutputLow);
  const Unprivileged nobody;
  EXPECT_EQ(ugpio_full_open(context.get()), 0);
  EXPECT_EQ(ugpio_get_value(context.get()), 0);
  EXPECT_EQ(ugpio_set_value(context.get(), 1), -1);
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

}  // namespace
