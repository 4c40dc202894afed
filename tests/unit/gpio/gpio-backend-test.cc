#include <cerrno>
#include <thread>

#include "gpio-fixture.h"

namespace {

using Calls = std::vector<std::string>;

constexpr const char *kCouldNotSet = "Failed to set state on port!\n";
constexpr const char *kCouldNotTurn = "Couldn't change direction on port!\n";

const Calls kNoLineAllocated = {
    "Failed to allocate pin 1/(null)",
    "Port terminal has to do without its input pin 1: Device or resource busy",
    "Failed to allocate pin 2/(null)",
    "Port terminal has to do without its output pin 2: Permission denied",
    "Failed to allocate pin 3/(null)",
    "Port terminal has to do without its io_ctrl pin 3: Device or resource busy"};
constexpr const char *kNotDriven = "Port terminal: its output pin 2 can't be driven: ";
const Calls kNoLineDescribed = {"Port terminal has no input line",
                                "Port terminal has no output line",
                                "Port terminal has no io_ctrl line"};

// --- The hardware description ---

TEST_F(GpioBackendTest, AnUnknownSectionIsLoggedAndChangesNothing) {
  make(PORT_CONFIGURABLE, {{"io-ctrl", "pin", "3"}, {"Input", "pin", "1"}});
  EXPECT_EQ(log.take_all(G_LOG_LEVEL_WARNING, "Could not parse backend data!\n"), 2U);
  EXPECT_TRUE(io_port_setup(port()));
  EXPECT_EQ(log.take_warnings(), kNoLineDescribed);
  EXPECT_TRUE(fake_ugpio().calls.empty());
}

TEST_F(GpioBackendTest, APinWithNumberAndAliasIsRequestedByTheAlias) {
  make(PORT_INPUT, {{"input", "pin", "12"}, {"input", "alias", "alarm"}});
  EXPECT_TRUE(io_port_setup(port()));
  EXPECT_EQ(fake_ugpio().calls, (Calls{"request_one_named alarm 0x14D", "activelow alarm 0"}));
}

// --- Set-up ---

TEST_F(GpioBackendTest, AnInputIsRequestedWithBothEdges) {
  EXPECT_TRUE(io_port_setup(make_input()));
  EXPECT_EQ(fake_ugpio().calls, (Calls{"request_one pin 1 0x14D", "activelow 1 0"}));
}

TEST_F(GpioBackendTest, AnOutputStartsInactive) {
  EXPECT_TRUE(io_port_setup(make_output()));
  EXPECT_EQ(fake_ugpio().calls, (Calls{"request_one pin 2 0x40", "activelow 2 0"}));
}

TEST_F(GpioBackendTest, AnActiveLowOutputStartsHigh) {
  io_port_restore_activelow(make_output(), true, false);
  EXPECT_TRUE(io_port_setup(port()));
  EXPECT_EQ(fake_ugpio().calls.front(), "request_one pin 2 0x42");
}

TEST_F(GpioBackendTest, AnOutputOnAnInvertedPinStartsAtTheOtherLevel) {
  make(PORT_OUTPUT, {{"output", "pin", "2"}, {"output", "inverted", "true"}});
  EXPECT_TRUE(io_port_setup(port()));
  EXPECT_EQ(fake_ugpio().calls, (Calls{"request_one pin 2 0x42", "activelow 2 1"}));
}

TEST_F(GpioBackendTest, AnActiveLowOutputOnAnInvertedPinStartsLow) {
  make(PORT_OUTPUT, {{"output", "pin", "2"}, {"output", "inverted", "true"}});
  io_port_restore_activelow(port(), true, false);
  EXPECT_TRUE(io_port_setup(port()));
  EXPECT_EQ(fake_ugpio().calls.front(), "request_one pin 2 0x40");
}

TEST_F(GpioBackendTest, AConfigurableInputHasItsOutputAndItsDriverOff) {
  io_port_restore_activelow(make_configurable(), true, false);
  EXPECT_TRUE(io_port_setup(port()));
  EXPECT_EQ(fake_ugpio().calls,
            (Calls{"request_one pin 1 0x14D", "activelow 1 0", "request_one pin 2 0x40",
                   "activelow 2 0", "request_one pin 3 0x40", "activelow 3 0"}));
}

TEST_F(GpioBackendTest, AConfigurableOutputStartsInactiveWithItsDriverOn) {
  io_port_restore_activelow(make_configurable(), true, false);
  io_port_restore_direction(port(), false);
  EXPECT_TRUE(io_port_setup(port()));
  EXPECT_EQ(fake_ugpio().calls,
            (Calls{"request_one pin 1 0x14D", "activelow 1 0", "request_one pin 2 0x42",
                   "activelow 2 0", "request_one pin 3 0x42", "activelow 3 0"}));
}

TEST_F(GpioBackendTest, SetUpSucceedsWhenNoLineCanBeHad) {
  line("1").request_error = EBUSY;
  line("2").request_error = EACCES;
  line("3").request_error = EBUSY;
  EXPECT_TRUE(io_port_setup(make_configurable()));
  EXPECT_EQ(log.take_warnings(), kNoLineAllocated);
  EXPECT_FALSE(io_port_in_service(port()));
  EXPECT_EQ(io_port_fault(port()),
            "input pin 1: Device or resource busy; output pin 2: Permission denied; "
            "io_ctrl pin 3: Device or resource busy");
}

TEST_F(GpioBackendTest, ALineThatCannotBePreparedIsNamedToo) {
  line("2").activelow_error = EIO;
  EXPECT_TRUE(io_port_setup(make_output()));
  EXPECT_EQ(log.take_warnings(),
            (Calls{"Failed set active low!",
                   "Port terminal has to do without its output pin 2: Input/output error"}));
  EXPECT_EQ(io_port_fault(port()), "output pin 2: Input/output error");
}

TEST_F(GpioBackendTest, SetUpSucceedsWhenTheDocumentForgetsThePins) {
  EXPECT_TRUE(io_port_setup(make(PORT_CONFIGURABLE, {})));
  EXPECT_EQ(log.take_warnings(), kNoLineDescribed);
  EXPECT_EQ(io_port_fault(port()),
            "no input pin is described; no output pin is described; no io_ctrl pin is described");
}

TEST_F(GpioBackendTest, APortThatHasItsLinesIsInService) {
  EXPECT_TRUE(io_port_setup(make_configurable()));
  EXPECT_TRUE(io_port_in_service(port()));
}

// --- Levels ---

TEST_F(GpioBackendTest, AnyLevelButZeroIsOne) {
  EXPECT_TRUE(io_port_setup(make_input()));
  line("1").value = 4;
  EXPECT_TRUE(io_port_get_state(port()));
}

TEST_F(GpioBackendTest, AFailedReadYieldsOne) {
  EXPECT_TRUE(io_port_setup(make_input()));
  line("1").read_error = EIO;
  EXPECT_TRUE(io_port_get_state(port()));
}

TEST_F(GpioBackendTest, AnOutputIsDrivenAndReadBack) {
  EXPECT_TRUE(io_port_setup(make_output()));
  EXPECT_TRUE(io_port_set_state(port(), true));
  EXPECT_EQ(line("2").value, 1);
  EXPECT_TRUE(io_port_get_state(port()));
  EXPECT_EQ(reported(), States{true});
}

TEST_F(GpioBackendTest, AnOutputThatCannotBeDrivenIsLogged) {
  EXPECT_TRUE(io_port_setup(make_output()));
  line("2").write_error = EIO;
  EXPECT_TRUE(io_port_set_state(port(), true));
  EXPECT_EQ(log.take_warnings(),
            (Calls{kCouldNotSet, kNotDriven + std::string("Input/output error")}));
  EXPECT_TRUE(reported().empty());
}

TEST_F(GpioBackendTest, WhichOutputCannotBeDrivenIsLoggedOnceUntilItCan) {
  EXPECT_TRUE(io_port_setup(make_output()));
  const std::string message = kNotDriven + std::string("Input/output error");
  for (int round = 0; round < 2; ++round) {
    line("2").write_error = EIO;
    for (const bool state : {true, false, true}) {
      EXPECT_TRUE(io_port_set_state(port(), state));
    }
    EXPECT_EQ(log.take_warnings(), (Calls{kCouldNotSet, message, kCouldNotSet, kCouldNotSet}));
    line("2").write_error = 0;
    EXPECT_TRUE(io_port_set_state(port(), true));
    EXPECT_TRUE(log.empty());
  }
}

TEST_F(GpioBackendTest, AnOutputThatWasRefusedSaysWhyWhenItIsDriven) {
  line("siren").request_error = ENOENT;
  make(PORT_OUTPUT, {{"output", "alias", "siren"}});
  EXPECT_TRUE(io_port_setup(port()));
  log.forget();
  EXPECT_TRUE(io_port_set_state(port(), true));
  EXPECT_EQ(
      log.take_warnings(),
      (Calls{kCouldNotSet,
             "Port terminal: its output pin siren can't be driven: No such file or directory"}));
}

// --- Ports without a line ---

TEST_F(GpioBackendTest, APortWhoseLineIsRefusedLivesOn) {
  line("1").request_error = EBUSY;
  line("2").request_error = EACCES;
  line("3").request_error = EBUSY;
  EXPECT_TRUE(io_port_setup(make_configurable()));
  EXPECT_EQ(log.take_warnings(), kNoLineAllocated);
  io_port_set_watch(port());
  EXPECT_TRUE(io_port_get_state(port()));
  EXPECT_TRUE(io_port_set_direction(port(), false));
  EXPECT_TRUE(io_port_get_state(port()));
  EXPECT_TRUE(io_port_set_state(port(), true));
  EXPECT_TRUE(io_port_set_activelow(port(), true, false));
  EXPECT_TRUE(io_port_set_direction(port(), true));
  EXPECT_TRUE(io_port_set_activelow(port(), true, true));
  io_port_set_watch(port());
  EXPECT_GE(log.take_all(G_LOG_LEVEL_WARNING, kCouldNotSet), 3U);
  EXPECT_EQ(log.take_all(G_LOG_LEVEL_WARNING, kCouldNotTurn), 2U);
  EXPECT_TRUE(log.took_warning(kNotDriven + std::string("Permission denied")));
  EXPECT_TRUE(log.took_warning(
      "Port terminal: its io_ctrl pin 3 can't be driven: Device or resource busy"));
  EXPECT_EQ(seams().fd_watches.size(), 0U);
  EXPECT_EQ(serve(), 0);
}

TEST_F(GpioBackendTest, APortWhoseDocumentForgetsThePinsLivesOn) {
  EXPECT_TRUE(io_port_setup(make(PORT_CONFIGURABLE, {})));
  EXPECT_EQ(log.take_warnings(), kNoLineDescribed);
  io_port_set_watch(port());
  EXPECT_TRUE(io_port_get_state(port()));
  EXPECT_TRUE(io_port_set_direction(port(), false));
  EXPECT_TRUE(io_port_set_state(port(), true));
  EXPECT_TRUE(io_port_set_direction(port(), true));
  EXPECT_GE(log.take_all(G_LOG_LEVEL_WARNING, kCouldNotSet), 3U);
  EXPECT_EQ(log.take_all(G_LOG_LEVEL_WARNING, kCouldNotTurn), 2U);
  EXPECT_EQ(seams().fd_watches.size(), 0U);
}

TEST_F(GpioBackendTest, ALineThatDoesNotOpenReadsOneAndIsNotWatched) {
  line("1").open_error = EACCES;
  EXPECT_TRUE(io_port_setup(make_input()));
  io_port_set_watch(port());
  EXPECT_TRUE(io_port_get_state(port()));
  EXPECT_EQ(seams().fd_watches.size(), 0U);
  EXPECT_TRUE(log.took_warning("Failed to open pin fd!"));
  EXPECT_TRUE(
      log.took_warning("Port terminal has to do without its input pin 1: Permission denied"));
}

// --- Direction ---

TEST_F(GpioBackendTest, AnActiveLowPortBecomesAnOutputAtHighLevel) {
  io_port_restore_activelow(make_configurable(), true, false);
  EXPECT_TRUE(io_port_setup(port()));
  fake_ugpio().take_calls();
  EXPECT_TRUE(io_port_set_direction(port(), false));
  EXPECT_EQ(fake_ugpio().calls, (Calls{"set 3 1", "set 2 1"}));
  EXPECT_FALSE(io_port_get_state(port()));
}

TEST_F(GpioBackendTest, ADriverThatCannotBeSwitchedIsLogged) {
  EXPECT_TRUE(io_port_setup(make_configurable()));
  line("3").write_error = EIO;
  EXPECT_TRUE(io_port_set_direction(port(), false));
  EXPECT_TRUE(io_port_set_direction(port(), true));
  EXPECT_EQ(
      log.take_warnings(),
      (Calls{kCouldNotTurn, "Port terminal: its io_ctrl pin 3 can't be driven: Input/output error",
             kCouldNotTurn}));
}

TEST_F(GpioBackendTest, ReadsFollowTheDirection) {
  EXPECT_TRUE(io_port_setup(make_configurable()));
  line("1").value = 1;
  EXPECT_TRUE(io_port_get_state(port()));
  EXPECT_TRUE(io_port_set_direction(port(), false));
  EXPECT_FALSE(io_port_get_state(port()));
}

TEST_F(GpioBackendTest, ADirectionIsReportedOnceWithTheStateOfTheNewRole) {
  EXPECT_TRUE(io_port_setup(make_configurable()));
  io_port_set_watch(port());
  line("1").value = 1;
  EXPECT_TRUE(io_port_set_direction(port(), false));
  EXPECT_EQ(take_reported(), States{false});
  EXPECT_TRUE(io_port_set_direction(port(), true));
  EXPECT_EQ(serve(), 0);
  EXPECT_EQ(take_reported(), States{true});
}

// --- Dropping and coming back ---

TEST_F(GpioBackendTest, DroppingThePortGivesItsLinesBackAndEndsItsWatch) {
  EXPECT_TRUE(io_port_setup(make_configurable()));
  io_port_set_watch(port());
  line("1").signal();
  io_port_drop(port());
  EXPECT_EQ(fake_ugpio().requested, 0);
  EXPECT_EQ(seams().alive_fd_watches(), 0);
  EXPECT_EQ(serve(), 0);
}

TEST_F(GpioBackendTest, ADroppedPortTakesEveryCall) {
  EXPECT_TRUE(io_port_setup(make_configurable()));
  io_port_drop(port());
  io_port_set_watch(port());
  EXPECT_FALSE(io_port_get_state(port()));
  EXPECT_TRUE(io_port_set_direction(port(), false));
  EXPECT_FALSE(io_port_set_state(port(), true));
  EXPECT_TRUE(io_port_set_activelow(port(), true, false));
  EXPECT_TRUE(log.took_warning("Set state on incorrect port"));
}

TEST_F(GpioBackendTest, ADroppedPortCanBeSetUpAgain) {
  make(PORT_INPUT, {{"input", "alias", "alarm"}, {"input", "inverted", "true"}});
  EXPECT_TRUE(io_port_setup(port()));
  io_port_drop(port());
  fake_ugpio().take_calls();
  EXPECT_TRUE(io_port_setup(port()));
  EXPECT_EQ(fake_ugpio().calls, (Calls{"request_one_named alarm 0x14D", "activelow alarm 1"}));
  io_port_set_watch(port());
  line("alarm").edge(1);
  serve();
  EXPECT_EQ(reported(), States{true});
}

// --- Threads ---

TEST_F(GpioBackendTest, AnActionThreadDrivesWhileTheMainThreadReads) {
  EXPECT_TRUE(io_port_setup(make_output()));
  port_listener().port_changed = nullptr;
  std::thread action([this] {
    for (int i = 0; i < 1000; ++i) {
      io_port_set_state(port(), i % 2 == 0);
    }
    io_port_set_state(port(), true);
  });
  for (int i = 0; i < 1000; ++i) {
    (void)io_port_get_state(port());
  }
  action.join();
  EXPECT_TRUE(io_port_get_state(port()));
}

}  // namespace
