// The state of a port: between what it says and the level on its line.
#include <thread>

#include "port/ioport-private.h"
#include "support/port-fixture.h"

namespace {

constexpr const char *kRefused = "Set state on incorrect port";

class PortState : public PortFixture {};

// --- Reading ---

TEST_F(PortState, FollowsTheRawLevelOfAnInput) {
  const auto port = PortBuilder().input().set_up();
  EXPECT_FALSE(io_port_get_state(port.get()));
  check_record(port).state = 1;
  EXPECT_TRUE(io_port_get_state(port.get()));
}

TEST_F(PortState, IsInvertedForAnActiveLowInput) {
  const auto port = PortBuilder().input().activelow().set_up();
  EXPECT_TRUE(io_port_get_state(port.get()));
  check_record(port).state = 1;
  EXPECT_FALSE(io_port_get_state(port.get()));
}

TEST_F(PortState, IsInactiveWhileTheLevelIsUnknownWhateverTheSense) {
  const auto plain = PortBuilder().input().set_up();
  const auto inverted = PortBuilder().input().activelow().set_up();
  for (const int level : {2, 3, 5, INT32_MAX, -1}) {
    check_record(plain).state = level;
    check_record(inverted).state = level;
    EXPECT_FALSE(io_port_get_state(plain.get())) << level;
    EXPECT_FALSE(io_port_get_state(inverted.get())) << level;
  }
}

TEST_F(PortState, IsInactiveBeforeSetUp) {
  const auto port = PortBuilder().input().activelow().build();
  check_record(port).state = 1;
  EXPECT_FALSE(io_port_get_state(port.get()));
  check_record(port).state = 0;
  EXPECT_FALSE(io_port_get_state(port.get()));
  EXPECT_FALSE(io_port_is_set_up(port.get()));
}

TEST_F(PortState, UsesTheSenseOfTheRoleThatAConfigurablePortHas) {
  const auto port = PortBuilder().configurable_input().build();
  io_port_restore_activelow(port.get(), true, true);
  ASSERT_TRUE(io_port_setup(port.get()));
  EXPECT_TRUE(io_port_get_state(port.get()));
  ASSERT_TRUE(io_port_set_direction(port.get(), false));
  EXPECT_FALSE(io_port_get_state(port.get()));
}

// --- Driving ---

TEST_F(PortState, DrivesTheLineOfAnOutput) {
  const auto port = PortBuilder().output().set_up();
  EXPECT_TRUE(io_port_set_state(port.get(), true));
  EXPECT_EQ(check_record(port).state, 1);
  EXPECT_TRUE(io_port_get_state(port.get()));
  EXPECT_EQ(listener.heard(), Lines{"changed 1 on"});
  EXPECT_TRUE(io_port_set_state(port.get(), false));
  EXPECT_EQ(check_record(port).state, 0);
  EXPECT_EQ(listener.heard(), Lines{"changed 1 off"});
}

TEST_F(PortState, DrivesAnActiveLowOutputTheOtherWay) {
  const auto port = PortBuilder().output().activelow().set_up();
  check_record(port).state = 1;
  EXPECT_TRUE(io_port_set_state(port.get(), true));
  EXPECT_EQ(check_record(port).state, 0);
  EXPECT_TRUE(io_port_get_state(port.get()));
  EXPECT_EQ(listener.heard(), Lines{"changed 1 on"});
}

TEST_F(PortState, TellsNothingWhenAnOutputKeepsItsState) {
  const auto port = PortBuilder().output().event(event_for_outputs("siren")).set_up();
  EXPECT_TRUE(io_port_set_state(port.get(), true));
  EXPECT_EQ(listener.heard(), (Lines{"send siren 1", "changed 1 on"}));
  EXPECT_TRUE(io_port_set_state(port.get(), true));
  EXPECT_EQ(listener.heard(), Lines{});
}

TEST_F(PortState, TellsNothingWhenTheLineDoesNotFollow) {
  const auto port = PortBuilder().backend(BACKEND_NULL).output().set_up();
  EXPECT_TRUE(io_port_set_state(port.get(), true));
  EXPECT_FALSE(io_port_get_state(port.get()));
  EXPECT_EQ(listener.heard(), Lines{});
}

TEST_F(PortState, DrivesAnOutputThatIsSilencedAndTellsNothing) {
  const auto port = PortBuilder().output().event(event_for_outputs("siren")).set_up();
  io_port_set_events_enabled(port.get(), false);
  (void)listener.heard();
  EXPECT_TRUE(io_port_set_state(port.get(), true));
  EXPECT_EQ(check_record(port).state, 1);
  EXPECT_TRUE(io_port_get_state(port.get()));
  EXPECT_EQ(listener.heard(), Lines{});
}

TEST_F(PortState, DrivesAConfigurablePortWhileItIsAnOutput) {
  const auto port = PortBuilder().configurable_output().set_up();
  EXPECT_TRUE(io_port_set_state(port.get(), true));
  EXPECT_EQ(check_record(port).state, 1);
}

TEST_F(PortState, RefusesToDriveAnInput) {
  const auto port = PortBuilder().input().set_up();
  EXPECT_FALSE(io_port_set_state(port.get(), true));
  EXPECT_TRUE(log.took_warning(kRefused));
  EXPECT_EQ(check_record(port).state, 0);
}

TEST_F(PortState, RefusesToDriveAConfigurablePortWhileItIsAnInput) {
  const auto port = PortBuilder().configurable_input().set_up();
  EXPECT_FALSE(io_port_set_state(port.get(), true));
  EXPECT_TRUE(log.took_warning(kRefused));
  EXPECT_EQ(check_record(port).state, 0);
}

TEST_F(PortState, RefusesToDriveAVirtualOutput) {
  const auto port = PortBuilder().backend(BACKEND_VIRTUAL).output().set_up();
  EXPECT_FALSE(io_port_set_state(port.get(), true));
  EXPECT_TRUE(log.took_warning(kRefused));
  EXPECT_FALSE(io_port_get_state(port.get()));
}

TEST_F(PortState, RefusesToDriveAPortThatIsNotSetUp) {
  const auto port = PortBuilder().output().build();
  EXPECT_FALSE(io_port_set_state(port.get(), true));
  EXPECT_TRUE(log.took_warning(kRefused));
  EXPECT_EQ(check_record(port).state, 0);
  EXPECT_EQ(listener.heard(), Lines{});
}

TEST_F(PortState, LeavesThePortFreeAfterDrivingIt) {
  const auto port = PortBuilder().output().set_up();
  EXPECT_FALSE(io_port_is_busy(port.get()));
  EXPECT_TRUE(io_port_set_state(port.get(), true));
  EXPECT_FALSE(io_port_is_busy(port.get()));
}

TEST_F(PortState, IsBusyWhileSomebodyHoldsThePort) {
  const auto port = PortBuilder().output().set_up();
  {
    const std::lock_guard lock(port->lock);
    std::thread([&] { EXPECT_TRUE(io_port_is_busy(port.get())); }).join();
  }
  EXPECT_FALSE(io_port_is_busy(port.get()));
}

// An input is never asked this way but by code that holds the lock; the sense is then the output's.
TEST_F(PortState, UsesTheOutputsSenseWhenDrivenWithoutChecks) {
  const auto port = PortBuilder().input().build();
  io_port_restore_activelow(port.get(), true, false);
  ASSERT_TRUE(io_port_setup(port.get()));
  const std::lock_guard lock(port->lock);
  io_port_set_state_internal(port.get(), false);
  EXPECT_EQ(check_record(port).state, 1);
  EXPECT_EQ(listener.heard(), Lines{"changed 1 on"});
}

TEST_F(PortState, DrivingNoPortAtAllIsOnlyLogged) {
  io_port_set_state_internal(nullptr, true);
  EXPECT_TRUE(log.took_containing(G_LOG_LEVEL_CRITICAL, "assertion 'ioport != NULL' failed"));
}

// --- Reporting without hardware ---

TEST_F(PortState, OfAVirtualOutputIsWhatClientsReport) {
  const auto port = PortBuilder().backend(BACKEND_VIRTUAL).output().number(7).set_up();
  EXPECT_TRUE(io_port_set_virtual(port.get(), true));
  EXPECT_TRUE(io_port_get_state(port.get()));
  EXPECT_EQ(listener.heard(), Lines{"changed 7 on"});
  EXPECT_TRUE(listener.changes().back().virtual_trig);
}

TEST_F(PortState, OfAVirtualOutputIsStoredWithoutInversion) {
  const auto port = PortBuilder().backend(BACKEND_VIRTUAL).output().activelow().set_up();
  EXPECT_TRUE(io_port_set_virtual(port.get(), true));
  EXPECT_FALSE(io_port_get_state(port.get()));
}

TEST_F(PortState, OfAVirtualInputIsReportedButNotStored) {
  const auto port = PortBuilder().backend(BACKEND_VIRTUAL).input().set_up();
  EXPECT_TRUE(io_port_set_virtual(port.get(), true));
  EXPECT_FALSE(io_port_get_state(port.get()));
  EXPECT_EQ(listener.heard(), Lines{"changed 1 on"});
}

TEST_F(PortState, OfAVirtualConfigurablePortIsReportedButNotStored) {
  const auto port = PortBuilder().backend(BACKEND_VIRTUAL).configurable_output().set_up();
  EXPECT_TRUE(io_port_set_virtual(port.get(), true));
  EXPECT_FALSE(io_port_get_state(port.get()));
}

TEST_F(PortState, ReportedByClientsLeavesTheLineAlone) {
  const auto port = PortBuilder().output().event(event_for_outputs("siren")).set_up();
  EXPECT_TRUE(io_port_set_virtual(port.get(), true));
  EXPECT_EQ(check_record(port).state, 0);
  EXPECT_EQ(listener.heard(), (Lines{"send siren 1", "changed 1 on"}));
}

TEST_F(PortState, IsReportedEachTimeThatAClientSaysSo) {
  const auto port = PortBuilder().backend(BACKEND_VIRTUAL).output().set_up();
  EXPECT_TRUE(io_port_set_virtual(port.get(), true));
  EXPECT_TRUE(io_port_set_virtual(port.get(), true));
  EXPECT_EQ(listener.heard(), (Lines{"changed 1 on", "changed 1 on"}));
}

TEST_F(PortState, IsNeitherStoredNorReportedByClientsWhileEventsAreOff) {
  const auto port = PortBuilder().backend(BACKEND_VIRTUAL).output().set_up();
  io_port_set_events_enabled(port.get(), false);
  EXPECT_TRUE(io_port_set_virtual(port.get(), true));
  EXPECT_FALSE(io_port_get_state(port.get()));
  EXPECT_EQ(listener.heard(), Lines{});
}

// --- Watching ---

TEST_F(PortState, IsWatchedOnInputs) {
  const auto port = PortBuilder().input().set_up();
  EXPECT_FALSE(check_record(port).watching);
  io_port_set_watch(port.get());
  EXPECT_TRUE(check_record(port).watching);
}

TEST_F(PortState, IsNotWatchedOnOutputs) {
  const auto output = PortBuilder().output().set_up();
  const auto configured = PortBuilder().configurable_output().set_up();
  io_port_set_watch(output.get());
  io_port_set_watch(configured.get());
  EXPECT_FALSE(check_record(output).watching);
  EXPECT_FALSE(check_record(configured).watching);
}

TEST_F(PortState, IsNotWatchedWhileEventsAreOff) {
  const auto port = PortBuilder().input().set_up();
  io_port_set_events_enabled(port.get(), false);
  io_port_set_watch(port.get());
  EXPECT_FALSE(check_record(port).watching);
}

}  // namespace
