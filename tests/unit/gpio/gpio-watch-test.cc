// Edges of watched lines, up to what becomes of lines that fail.
#include <cerrno>

#include "gpio-fixture.h"

namespace {

// --- Watch and edges ---

TEST_F(GpioBackendTest, TheWatchIsForErrorsAlone) {
  make_watched_input();
  EXPECT_EQ(seams().fd_conditions, std::vector<GIOCondition>{G_IO_ERR});
}

TEST_F(GpioBackendTest, AnEdgeIsReportedAfterTheLineWasDebounced) {
  make_watched_input();
  line("1").edge(1);
  EXPECT_EQ(serve(), 1);
  EXPECT_EQ(reported(), States{true});
  EXPECT_EQ(seams().sleeps, std::vector<gulong>{500});
}

TEST_F(GpioBackendTest, EveryEdgeIsReported) {
  make_watched_input();
  for (const bool level : {true, false, true}) {
    line("1").edge(level ? 1 : 0);
    serve();
  }
  EXPECT_EQ(reported(), (States{true, false, true}));
}

TEST_F(GpioBackendTest, AnEdgeOfAnActiveLowInputIsReportedInverted) {
  io_port_restore_activelow(make_watched_input(), true, true);
  line("1").edge(1);
  serve();
  EXPECT_EQ(reported(), States{false});
}

TEST_F(GpioBackendTest, WithoutAnEdgeNothingIsReported) {
  make_watched_input();
  EXPECT_EQ(serve(), 0);
  EXPECT_TRUE(reported().empty());
}

TEST_F(GpioBackendTest, ALineThatMovesAfterItsReportIsReportedAgain) {
  make_watched_input();
  line("1").script = {1, 0, 0, 1, 1};
  line("1").edge(1);
  serve();
  EXPECT_EQ(reported(), (States{true, false, true}));
}

TEST_F(GpioBackendTest, AfterABurstTheReportedStateIsTheStateOfTheLine) {
  make_watched_input();
  for (int i = 0; i < 41; ++i) {
    line("1").script.push_back(i % 2);
  }
  line("1").edge(1);
  serve();
  EXPECT_EQ(reported().back(), io_port_get_state(port()));
  EXPECT_TRUE(reported().back());
}

TEST_F(GpioBackendTest, ALineThatNeverRestsLeavesTurnsToOthers) {
  make_watched_input();
  for (int i = 0; i < 2000; ++i) {
    line("1").script.push_back(i % 2);
  }
  line("1").edge(0);
  EXPECT_TRUE(g_main_context_iteration(nullptr, FALSE));
  EXPECT_FALSE(line("1").script.empty()) << "one turn served the whole burst";
  EXPECT_LT(serve(1000), 1000);
  EXPECT_TRUE(line("1").script.empty()) << "the port lost sight of the line";
  EXPECT_FALSE(reported().back());
}

TEST_F(GpioBackendTest, AnEdgeIsAcknowledgedSoThatTheLoopRests) {
  make_watched_input();
  line("1").edge(1);
  EXPECT_EQ(serve(), 1);
  EXPECT_FALSE(line("1").signals());
  EXPECT_EQ(seams().alive_fd_watches(), 1);
}

TEST_F(GpioBackendTest, AnEdgeIsAcknowledgedWhileEventsAreOff) {
  io_port_set_events_enabled(make_watched_input(), false);
  line("1").edge(1);
  EXPECT_EQ(serve(), 1);
  EXPECT_FALSE(line("1").signals());
  EXPECT_TRUE(reported().empty());
}

TEST_F(GpioBackendTest, AClientThatReadsFirstDoesNotSwallowTheChange) {
  make_watched_input();
  line("1").edge(1);
  EXPECT_TRUE(io_port_get_state(port()));
  EXPECT_FALSE(line("1").signals());
  EXPECT_EQ(serve(), 1);
  EXPECT_EQ(reported(), States{true});
}

TEST_F(GpioBackendTest, AClientThatReadsDuringTheEdgeCausesNoSecondReport) {
  make_watched_input();
  line("1").acknowledges = false;
  line("1").edge(1);
  EXPECT_TRUE(io_port_get_state(port()));
  line("1").acknowledges = true;
  EXPECT_EQ(serve(), 1);
  EXPECT_EQ(reported(), States{true});
}

TEST_F(GpioBackendTest, APortHasOneWatchAfterAnyNumberOfAnnouncementsAndDirections) {
  EXPECT_TRUE(io_port_setup(make_configurable()));
  for (int i = 0; i < 5; ++i) {
    io_port_set_watch(port());
    EXPECT_EQ(seams().alive_fd_watches(), 1);
    EXPECT_TRUE(io_port_set_direction(port(), false));
    EXPECT_EQ(seams().alive_fd_watches(), 0);
    EXPECT_TRUE(io_port_set_direction(port(), true));
    EXPECT_EQ(seams().alive_fd_watches(), 1);
  }
  take_reported();
  line("1").edge(1);
  serve();
  EXPECT_EQ(reported(), States{true});
}

TEST_F(GpioBackendTest, AnEdgeThatWaitsDuringARepeatedAnnouncementIsReported) {
  make_watched_input();
  line("1").edge(1);
  io_port_set_watch(port());
  serve();
  EXPECT_EQ(reported(), States{true});
}

TEST_F(GpioBackendTest, AnOutputIsNotWatched) {
  EXPECT_TRUE(io_port_setup(make_output()));
  io_port_set_watch(port());
  EXPECT_TRUE(seams().fd_watches.empty());
}

// --- Lines that fail or go away while they are watched ---

TEST_F(GpioBackendTest, AnUnreadableLineIsReportedActiveAndDoesNotSpin) {
  make_watched_input();
  line("1").read_error = ENODEV;
  line("1").acknowledges = false;
  line("1").signal();
  EXPECT_TRUE(g_main_context_iteration(nullptr, FALSE));
  EXPECT_EQ(reported(), States{true});
  EXPECT_EQ(seams().alive_fd_watches(), 0);
  EXPECT_EQ(seams().intervals, std::vector<guint>{1000});
  serve(5);
  EXPECT_EQ(reported(), States{true}) << "looking again is no news";
  EXPECT_TRUE(log.took_warning("Port terminal: the line can't be read"));
}

TEST_F(GpioBackendTest, ALineThatBecomesReadableAgainIsReportedAndWatched) {
  make_watched_input();
  line("1").read_error = EIO;
  line("1").signal();
  EXPECT_TRUE(g_main_context_iteration(nullptr, FALSE));
  EXPECT_EQ(take_reported(), States{true});
  line("1").read_error = 0;
  serve();
  EXPECT_EQ(take_reported(), States{false});
  line("1").edge(1);
  serve();
  EXPECT_EQ(take_reported(), States{true});
}

TEST_F(GpioBackendTest, AClientWhoseReadFailsDoesNotSwallowTheChange) {
  make_watched_input();
  line("1").edge(1);
  line("1").read_error = EIO;
  EXPECT_TRUE(io_port_get_state(port()));
  EXPECT_FALSE(line("1").signals());
  EXPECT_TRUE(g_main_context_iteration(nullptr, FALSE));
  EXPECT_EQ(seams().intervals, std::vector<guint>{1000});
  line("1").read_error = 0;
  serve();
  EXPECT_EQ(reported(), States{true});
}

TEST_F(GpioBackendTest, AClientWhoseReadFailsInventsNoChange) {
  make_watched_input();
  line("1").read_error = EIO;
  EXPECT_TRUE(io_port_get_state(port()));
  EXPECT_TRUE(g_main_context_iteration(nullptr, FALSE));
  EXPECT_EQ(seams().intervals, std::vector<guint>{1000});
  line("1").read_error = 0;
  serve();
  EXPECT_TRUE(reported().empty());
  EXPECT_EQ(seams().alive_fd_watches(), 1);
}

TEST_F(GpioBackendTest, AfterAnUnacknowledgedFailureTheWatchComesBackWithTheLine) {
  make_watched_input();
  line("1").read_error = ENODEV;
  line("1").acknowledges = false;
  line("1").signal();
  EXPECT_TRUE(g_main_context_iteration(nullptr, FALSE));
  line("1").read_error = 0;
  line("1").acknowledges = true;
  serve();
  EXPECT_EQ(seams().alive_fd_watches(), 1);
  EXPECT_EQ(take_reported(), (States{true, false}));
  EXPECT_TRUE(log.took_warning("Port terminal: the line can't be read"));
}

// The line may have moved there and back meanwhile.
TEST_F(GpioBackendTest, ALineThatWasNotFollowedForAWhileIsReportedAnew) {
  make_watched_input();
  line("1").script = {1, -1};
  line("1").acknowledges = false;
  line("1").edge(1);
  EXPECT_TRUE(g_main_context_iteration(nullptr, FALSE));
  EXPECT_EQ(take_reported(), States{true});
  EXPECT_EQ(seams().alive_fd_watches(), 0);
  line("1").acknowledges = true;
  serve();
  EXPECT_EQ(take_reported(), States{true});
  EXPECT_EQ(seams().alive_fd_watches(), 1);
  EXPECT_TRUE(log.took_warning("Port terminal: the line can't be read"));
}

TEST_F(GpioBackendTest, ADescriptorThatHangsUpIsNoLongerWatched) {
  EXPECT_TRUE(io_port_setup(make_input()));
  line("1").hang_up();
  io_port_set_watch(port());
  EXPECT_EQ(serve(), 1);
  EXPECT_EQ(seams().alive_fd_watches(), 0);
  EXPECT_TRUE(reported().empty());
  EXPECT_TRUE(log.took_warning("Port terminal: the line is gone and no longer watched"));
}

TEST_F(GpioBackendTest, ADescriptorThatIsGoneIsNoLongerWatched) {
  make_watched_input();
  line("1").vanish();
  EXPECT_EQ(serve(), 1);
  EXPECT_EQ(seams().alive_fd_watches(), 0);
  EXPECT_TRUE(log.took_warning("Port terminal: the line is gone and no longer watched"));
}

}  // namespace
