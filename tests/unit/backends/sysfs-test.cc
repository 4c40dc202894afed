// Sysfs ports, read from plain files.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <string>
#include <thread>

#include "base/unique-fd.h"
#include "port/ioport-private.h"
#include "support/file-size-limit.h"
#include "support/port-fixture.h"
#include "support/temp-dir.h"

namespace {

constexpr std::int64_t kMicrosecondsPerMs = 1000;
constexpr int kInverted = 1;
constexpr int kClearFlag = 2;

class Sysfs : public PortFixture {
 protected:
  TempDir dir;

  // A watched port on the file; nothing has been read yet.
  static IOPortRef watched(const std::string &path, int options = 0) {
    auto port = described(path, options).set_up();
    io_port_set_watch(port.get());
    return port;
  }
  static PortBuilder described(const std::string &path, int options = 0) {
    PortBuilder builder;
    builder.input()
        .backend(BACKEND_SYSFS)
        .property("device", "path", path.c_str())
        .property("device", "timeout", "1");
    if (options & kInverted) {
      builder.property("device", "inverted", "true");
    }
    if (options & kClearFlag) {
      builder.property("device", "clear_flag", "true");
    }
    return builder;
  }
  // The timer of the port is all that the main context waits for.
  static void poll() { g_main_context_iteration(nullptr, TRUE); }
  static std::uint32_t raw(const IOPortRef &port) { return io_port_read_level(port.get()); }
  // The level that one poll of a file with that contents gives.
  std::uint32_t level_of(std::string_view contents, int options = 0) {
    const auto port = watched(dir.write("flag", contents), options);
    poll();
    return raw(port);
  }
  bool took_unexpected(const char *number) {
    return log.took_warning(std::string("Unexpected value: ") + number +
                            " when reading: " + dir.path("flag"));
  }
};

// --- Reading ---

TEST_F(Sysfs, ReadsOneWithOrWithoutALineEnd) {
  EXPECT_EQ(level_of("1"), 1U);
  EXPECT_EQ(level_of("1\n"), 1U);
  EXPECT_EQ(level_of("01\n"), 1U);
  EXPECT_EQ(level_of(" \t1"), 1U);
  EXPECT_EQ(level_of("+1"), 1U);
}

TEST_F(Sysfs, ReadsZeroAndWhateverIsNoNumberAsInactive) {
  EXPECT_EQ(level_of("0\n"), 0U);
  EXPECT_EQ(level_of(""), 0U);
  EXPECT_EQ(level_of("on\n"), 0U);
  EXPECT_EQ(level_of("\n1"), 1U);  // a line end is white space
}

TEST_F(Sysfs, ReadsTheOtherWayWhenInverted) {
  EXPECT_EQ(level_of("1\n", kInverted), 0U);
  EXPECT_EQ(level_of("0\n", kInverted), 1U);
  EXPECT_EQ(level_of("", kInverted), 1U);
}

TEST_F(Sysfs, WarnsOfOtherNumbersAndTakesThemForZero) {
  EXPECT_EQ(level_of("2\n"), 0U);
  EXPECT_TRUE(took_unexpected("2"));
  EXPECT_EQ(level_of("-1"), 0U);
  EXPECT_TRUE(took_unexpected("-1"));
  EXPECT_EQ(level_of("10"), 0U);
  EXPECT_TRUE(took_unexpected("10"));
  EXPECT_EQ(level_of("2", kInverted), 1U);
  EXPECT_TRUE(took_unexpected("2"));
}

TEST_F(Sysfs, WarnsOfNumbersBeyondThirtyTwoBits) {
  const std::string format_warning =
      "Unexpected format when parsing input when reading: " + dir.path("flag") +
      "! : Numerical result out of range";
  EXPECT_EQ(level_of("99999999999999999999"), 0U);
  EXPECT_TRUE(log.took_warning(format_warning));
  EXPECT_TRUE(took_unexpected("2147483647"));
  EXPECT_EQ(level_of("-2147483649"), 0U);
  EXPECT_TRUE(log.took_warning(format_warning));
  EXPECT_TRUE(took_unexpected("-2147483648"));
  EXPECT_EQ(level_of("4294967297"), 0U);  // not 1, as it would be in its lower 32 bits
  EXPECT_TRUE(log.took_warning(format_warning));
  EXPECT_TRUE(took_unexpected("2147483647"));
  EXPECT_EQ(level_of("2147483647"), 0U);
  EXPECT_TRUE(took_unexpected("2147483647"));
}

TEST_F(Sysfs, ReadsTheFirstSixtyThreeBytes) {
  EXPECT_EQ(level_of("1" + std::string(500, ' ')), 1U);
  EXPECT_EQ(level_of(std::string(62, '0') + "1" + "junk"), 1U);
  EXPECT_EQ(level_of(std::string(63, '0') + "1"), 0U);
  EXPECT_EQ(level_of(std::string(64, ' ') + "1"), 0U);
}

TEST_F(Sysfs, StopsAtAZeroByte) {
  EXPECT_EQ(level_of(std::string_view("1\0002", 3)), 1U);
}

TEST_F(Sysfs, ReadsADirectoryAsInactiveEvenInverted) {
  for (const int options : {0, kInverted}) {
    const auto port = watched(dir.path(), options);
    poll();
    EXPECT_EQ(raw(port), 0U);
    EXPECT_TRUE(log.took_warning("Error failed to read " + dir.path() + "! : Is a directory"));
  }
}

TEST_F(Sysfs, FollowsTheFileFromPollToPoll) {
  const auto port = watched(dir.write("flag", "0\n"));
  for (const char *contents : {"1\n", "0\n", "1\n", "1\n"}) {
    dir.write("flag", contents);
    poll();
    EXPECT_EQ(raw(port), contents[0] == '1' ? 1U : 0U);
  }
}

TEST_F(Sysfs, GoesOnReadingAFileThatWasUnlinked) {
  const auto port = watched(dir.write("flag", "1\n"));
  ASSERT_EQ(unlink(dir.path("flag").c_str()), 0);
  poll();
  EXPECT_EQ(raw(port), 1U);
}

TEST_F(Sysfs, ReadsNothingBetweenPolls) {
  const auto port = watched(dir.write("flag", "1\n"));
  EXPECT_EQ(raw(port), 0U);
  EXPECT_FALSE(io_port_get_state(port.get()));
}

// --- Reporting ---

TEST_F(Sysfs, ReportsAChangeOnce) {
  const auto port = watched(dir.write("flag", "1\n"));
  poll();
  poll();
  EXPECT_EQ(listener.heard(), Lines{"changed 1 on"});
  dir.write("flag", "0\n");
  poll();
  EXPECT_EQ(listener.heard(), Lines{"changed 1 off"});
}

TEST_F(Sysfs, ReportsTheLogicalStateOfAnActiveLowPort) {
  const auto port = described(dir.write("flag", "1\n")).activelow().set_up();
  io_port_set_watch(port.get());
  EXPECT_TRUE(io_port_get_state(port.get()));
  poll();
  EXPECT_EQ(listener.heard(), Lines{"changed 1 off"});
}

TEST_F(Sysfs, SaysNothingWhileTheFirstReadingIsInactive) {
  const auto port = watched(dir.write("flag", "0\n"));
  poll();
  EXPECT_EQ(listener.heard(), Lines{});
}

// --- Latched flags ---

TEST_F(Sysfs, ClearsALatchedFlagAfterReadingIt) {
  const auto port = watched(dir.write("flag", "1\n"), kClearFlag);
  poll();
  EXPECT_EQ(raw(port), 1U);
  EXPECT_EQ(dir.read("flag"), "0\n");
  poll();
  EXPECT_EQ(raw(port), 0U);
  EXPECT_EQ(listener.heard(), (Lines{"changed 1 on", "changed 1 off"}));
}

TEST_F(Sysfs, ClearsALatchedFlagThatIsInverted) {
  const auto port = watched(dir.write("flag", "1\n"), kClearFlag | kInverted);
  poll();
  EXPECT_EQ(raw(port), 0U);
  EXPECT_EQ(dir.read("flag"), "0\n");
}

TEST_F(Sysfs, LeavesOtherContentsOfALatchedFlagAlone) {
  const auto port = watched(dir.write("flag", "2\n"), kClearFlag);
  poll();
  EXPECT_EQ(dir.read("flag"), "2\n");
  EXPECT_TRUE(took_unexpected("2"));
}

TEST_F(Sysfs, DoesNotClearAFlagThatIsNotLatched) {
  EXPECT_EQ(level_of("1\n"), 1U);
  EXPECT_EQ(dir.read("flag"), "1\n");
}

TEST_F(Sysfs, ReadsALatchedFlagThatItCanNotClear) {
  const auto port = watched(dir.write("flag", "1\n"), kClearFlag);
  {
    const FileSizeLimit limit(0);
    poll();
  }
  EXPECT_EQ(raw(port), 1U);
  EXPECT_TRUE(log.took_warning("Sysfs write failed: File too large"));
  poll();
  EXPECT_EQ(dir.read("flag"), "0\n");
}

// --- Set-up ---

TEST_F(Sysfs, WarnsOfAFileThatItCanNotOpen) {
  const auto port = described("/nonexistent/flag").build();
  EXPECT_FALSE(io_port_setup(port.get()));
  EXPECT_TRUE(log.took_warning("Failed to open /nonexistent/flag: No such file or directory"));
}

TEST_F(Sysfs, SaysNothingOfAnOptionalFileThatItCanNotOpen) {
  const auto port = described("/nonexistent/flag").optional().build();
  EXPECT_FALSE(io_port_setup(port.get()));
}

TEST_F(Sysfs, OpensALatchedFlagForWriting) {
  const auto port = described(dir.path(), kClearFlag).build();
  EXPECT_FALSE(io_port_setup(port.get()));
  EXPECT_TRUE(log.took_warning("Failed to open " + dir.path() + ": Is a directory"));
}

TEST_F(Sysfs, ReadsAFileThatItCouldNotOpenByItsInversion) {
  const auto plain = described("/nonexistent/flag").optional().build();
  const auto inverted = described("/nonexistent/flag", kInverted).optional().build();
  EXPECT_FALSE(io_port_setup(plain.get()));
  EXPECT_FALSE(io_port_setup(inverted.get()));
  io_port_set_watch(plain.get());
  io_port_set_watch(inverted.get());
  for (int i = 0; i < 2; ++i) {
    poll();
    EXPECT_EQ(raw(plain), 0U);
    EXPECT_EQ(raw(inverted), 1U);
  }
}

TEST_F(Sysfs, OpensItsFileAgainWhenItIsSetUpAgain) {
  const auto port = described(dir.path("flag")).optional().build();
  EXPECT_FALSE(io_port_setup(port.get()));
  dir.write("flag", "1\n");
  EXPECT_TRUE(io_port_setup(port.get()));
  io_port_set_watch(port.get());
  poll();
  EXPECT_EQ(raw(port), 1U);
}

// Opened without that flag, a pipe that nobody writes to would hold the start for ever.
TEST_F(Sysfs, OpensAPipeThatNobodyWritesTo) {
  const std::string pipe = dir.path("pipe");
  ASSERT_EQ(mkfifo(pipe.c_str(), 0600), 0);
  const auto port = described(pipe).build();
  std::atomic<bool> opened = false;
  std::thread rescuer([&] {
    // Long for every machine; then the set-up is let go, so that the test ends.
    for (int tries = 0; !opened && tries < 500; ++tries) {
      g_usleep(10'000);
    }
    if (!opened) {
      const UniqueFd writer(open(pipe.c_str(), O_WRONLY | O_NONBLOCK | O_CLOEXEC));
      ADD_FAILURE() << "the set-up waits for a writer";
    }
  });
  EXPECT_TRUE(io_port_setup(port.get()));
  opened = true;
  rescuer.join();
}

TEST_F(Sysfs, SetsUpInputsOnly) {
  const std::string file = dir.write("flag", "1\n");
  const auto output = described(file).output().build();
  const auto configurable = described(file).configurable_input().build();
  EXPECT_FALSE(io_port_setup(output.get()));
  EXPECT_FALSE(io_port_setup(configurable.get()));
  EXPECT_EQ(log.take_all(G_LOG_LEVEL_WARNING, "Port port: a sysfs port can only be an input"), 2U);
}

TEST_F(Sysfs, IgnoresStatesAndDirections) {
  const auto port = watched(dir.write("flag", "0\n"));
  io_port_write_level(port.get(), 1);
  EXPECT_FALSE(io_port_set_direction(port.get(), false));
  EXPECT_EQ(raw(port), 0U);
  poll();
  EXPECT_EQ(raw(port), 0U);
  EXPECT_EQ(dir.read("flag"), "0\n");
}

// --- Description ---

TEST_F(Sysfs, TakesThePathThatIsGivenLast) {
  dir.write("old", "1\n");
  const std::string file = dir.write("new", "0\n");
  const auto port = described(dir.path("old")).property("device", "path", file.c_str()).set_up();
  io_port_set_watch(port.get());
  poll();
  EXPECT_EQ(raw(port), 0U);
}

TEST_F(Sysfs, TakesNoWordButTrueForYes) {
  for (const char *word : {"TRUE", "True", "yes", "1", "", "false", "true "}) {
    const auto port = described(dir.write("flag", "1\n"))
                          .property("device", "inverted", word)
                          .property("device", "clear_flag", word)
                          .set_up();
    io_port_set_watch(port.get());
    poll();
    EXPECT_EQ(raw(port), 1U) << word;
    EXPECT_EQ(dir.read("flag"), "1\n") << word;
  }
}

TEST_F(Sysfs, TakesAYesBack) {
  const auto port = described(dir.write("flag", "1\n"), kInverted)
                        .property("device", "inverted", "false")
                        .set_up();
  io_port_set_watch(port.get());
  poll();
  EXPECT_EQ(raw(port), 1U);
}

TEST_F(Sysfs, WarnsOfSectionsThatItDoesNotKnow) {
  const auto port =
      PortBuilder().backend(BACKEND_SYSFS).property("input", "path", "/dev/null").build();
  EXPECT_TRUE(log.took_warning("Could not parse backend data!\n"));
  EXPECT_FALSE(io_port_setup(port.get()));
  EXPECT_TRUE(log.took_containing(G_LOG_LEVEL_WARNING, "Failed to open : "));
}

TEST_F(Sysfs, IgnoresKeysThatItDoesNotKnow) {
  const auto port = described("/dev/null").property("device", "colour", "red").build();
  EXPECT_TRUE(io_port_setup(port.get()));
}

// --- The timer ---

// When the port is polled next, counted from the moment that its watch was armed.
std::pair<std::int64_t, std::int64_t> poll_interval_bounds(const char *timeout) {
  const auto port = PortBuilder()
                        .backend(BACKEND_SYSFS)
                        .property("device", "path", "/dev/null")
                        .property("device", "timeout", timeout)
                        .set_up();
  const std::int64_t before = g_get_monotonic_time();
  io_port_set_watch(port.get());
  const std::int64_t after = g_get_monotonic_time();
  GSource *source = g_main_context_find_source_by_user_data(nullptr, port.get());
  EXPECT_NE(source, nullptr);
  const std::int64_t ready = source ? g_source_get_ready_time(source) : 0;
  return {ready - after, ready - before};
}

void expect_interval(const char *timeout, std::int64_t ms) {
  const auto [least, most] = poll_interval_bounds(timeout);
  EXPECT_LE(least, ms * kMicrosecondsPerMs) << timeout;
  EXPECT_GE(most, ms * kMicrosecondsPerMs) << timeout;
}

TEST_F(Sysfs, PollsAtTheIntervalOfItsDescriptionInTheBaseThatItHas) {
  expect_interval("100", 100);
  expect_interval("0x64", 100);
  expect_interval("0144", 100);
  expect_interval("250 ms", 250);
  expect_interval("-1", UINT32_MAX);
}

TEST_F(Sysfs, PollsAtASensibleIntervalWhereItsDescriptionHasNone) {
  for (const char *timeout : {"soon", "", "0"}) {
    expect_interval(timeout, 10);
    EXPECT_TRUE(
        log.took_warning("Port port: no valid polling interval is given: polling every 10 ms"));
  }
}

TEST_F(Sysfs, GoesOnPollingWhenItIsArmedAnew) {
  const auto port =
      described(dir.write("flag", "0")).property("device", "timeout", "60000").set_up();
  io_port_set_watch(port.get());
  const GSource *source = g_main_context_find_source_by_user_data(nullptr, port.get());
  io_port_set_watch(port.get());
  EXPECT_EQ(g_main_context_find_source_by_user_data(nullptr, port.get()), source)
      << "its next look must not be put off";
}

TEST_F(Sysfs, PollsOnceAnIntervalHoweverOftenItIsArmed) {
  const auto port = watched(dir.write("flag", "2"));
  io_port_set_watch(port.get());
  io_port_set_watch(port.get());
  poll();
  const std::string warning = "Unexpected value: 2 when reading: " + dir.path("flag");
  EXPECT_EQ(log.take_all(G_LOG_LEVEL_WARNING, warning), 1U);
  poll();
  EXPECT_EQ(log.take_all(G_LOG_LEVEL_WARNING, warning), 1U);
}

TEST_F(Sysfs, StopsPollingWhenItsPortIsFreed) {
  auto port = watched(dir.write("flag", "2"));
  IOPort *gone = port.get();
  port.reset();
  EXPECT_EQ(g_main_context_find_source_by_user_data(nullptr, gone), nullptr);
}

}  // namespace
