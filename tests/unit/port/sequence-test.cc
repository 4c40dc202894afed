// Action sequences: which ports run them, what happens at each step, and how they end.
#include <poll.h>

#include <algorithm>
#include <atomic>
#include <limits>
#include <thread>

#include "port/port-listener.h"
#include "support/deadline.h"
#include "support/port-fixture.h"

namespace {

constexpr const char *kRefused = "Set action seq on incorrect port";
constexpr std::int32_t kNotInThisTest = 2'000'000;  // half an hour: only a cancel ends the step
constexpr std::int32_t kLongerThanTimeoutMs = 30'000;
constexpr std::size_t kCancels = 100;
constexpr std::int64_t kMicrosecondsPerMs = 1000;

class Sequence : public PortFixture {
 protected:
  // No thread of a test outlives it, so that the next one hears only its own.
  ~Sequence() override { io_port_wait_for_action_threads(); }

  static bool drive(const IOPortRef &port, std::vector<ActionStep> steps) {
    return io_port_run_action_sequence(port.get(), {false, std::move(steps)});
  }
  static bool report(const IOPortRef &port, std::vector<ActionStep> steps) {
    return io_port_run_action_sequence(port.get(), {true, std::move(steps)});
  }
  // Waits until the sequence of port 1 has ended and its thread is gone.
  bool ended() {
    const bool done = listener.wait_for("done 1");
    if (done) {
      io_port_wait_for_action_threads();
    }
    return done;
  }
  // A port whose sequence holds its first step, on, until somebody cancels it.
  IOPortRef held_output(PortBuilder builder = PortBuilder()) {
    auto port = builder.output().set_up();
    EXPECT_TRUE(drive(port, {{true, kNotInThisTest}, {false, 0}}));
    EXPECT_TRUE(listener.wait_for("changed 1 on"));
    return port;
  }
};

// --- Those who are told ---

std::atomic<int> waits = 0;

TEST_F(Sequence, WithoutPausesWaitsNowAndThenUntilItsReportsAreTaken) {
  waits = 0;
  port_listener().wait_until_sent = [](GCancellable * /*cancelled*/, std::int64_t deadline) {
    EXPECT_GT(deadline, g_get_monotonic_time());
    ++waits;
  };
  const auto port = PortBuilder().output().set_up();
  ASSERT_TRUE(drive(port, std::vector<ActionStep>(1000, {true, 0})));
  ASSERT_TRUE(ended());
  EXPECT_EQ(waits, 1000 / 64);
}

TEST_F(Sequence, HoldsNoLockWhileItWaitsUntilItsReportsAreTaken) {
  static IOPort *driven = nullptr;
  port_listener().wait_until_sent = [](GCancellable * /*cancelled*/, std::int64_t /*deadline*/) {
    std::thread([] { EXPECT_TRUE(io_port_set_state(driven, false)); }).join();
  };
  const auto port = PortBuilder().output().set_up();
  driven = port.get();
  ASSERT_TRUE(drive(port, std::vector<ActionStep>(64, {true, 0})));
  ASSERT_TRUE(ended());
  EXPECT_EQ(check_record(port).state, 0);
}

TEST_F(Sequence, IsCancelledWhileNobodyTakesItsReports) {
  waits = 0;
  port_listener().wait_until_sent = [](GCancellable *cancelled, std::int64_t /*deadline*/) {
    ++waits;
    pollfd cancel = {.fd = g_cancellable_get_fd(cancelled), .events = POLLIN, .revents = 0};
    EXPECT_EQ(poll(&cancel, 1, kLongerThanTimeoutMs), 1);
    g_cancellable_release_fd(cancelled);
  };
  const auto port = PortBuilder().output().set_up();
  ASSERT_TRUE(drive(port, std::vector<ActionStep>(1000, {true, 0})));
  while (waits == 0) {
    g_thread_yield();
  }
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, false));
  ASSERT_TRUE(ended());
  EXPECT_EQ(waits, 1);
}

// --- Running ---

TEST_F(Sequence, DrivesThePortThroughItsStepsInOrder) {
  const auto port = PortBuilder().output().set_up();
  ASSERT_TRUE(drive(port, {{true, 1}, {false, 1}, {true, 1}}));
  ASSERT_TRUE(ended());
  EXPECT_EQ(listener.heard(), (Lines{"changed 1 on", "changed 1 off", "changed 1 on", "done 1"}));
  EXPECT_EQ(check_record(port).state, 1);
  EXPECT_FALSE(io_port_is_busy(port.get()));
}

TEST_F(Sequence, LastsTheSumOfItsTimesTheLastIncluded) {
  const auto port = PortBuilder().output().set_up();
  const std::int64_t begin = g_get_monotonic_time();
  ASSERT_TRUE(drive(port, {{true, 5}, {false, 5}, {true, 5}}));
  ASSERT_TRUE(ended());
  EXPECT_GE(g_get_monotonic_time() - begin, 15 * kMicrosecondsPerMs);
}

TEST_F(Sequence, DrivesAnActiveLowOutputTheOtherWay) {
  const auto port = PortBuilder().output().activelow().set_up();
  check_record(port).state = 1;
  ASSERT_TRUE(drive(port, {{true, 0}}));
  ASSERT_TRUE(ended());
  EXPECT_EQ(check_record(port).state, 0);
}

TEST_F(Sequence, SendsTheEventsOfItsSteps) {
  const auto port = PortBuilder().output().event(event_for_outputs("siren")).set_up();
  ASSERT_TRUE(drive(port, {{true, 0}, {true, 0}, {false, 0}}));
  ASSERT_TRUE(ended());
  EXPECT_EQ(listener.heard(),
            (Lines{"send siren 1", "changed 1 on", "send siren 0", "changed 1 off", "done 1"}));
}

TEST_F(Sequence, DoesNotWaitForTimesBelowOne) {
  const auto port = PortBuilder().output().set_up();
  ASSERT_TRUE(drive(port, {{true, 0}, {false, -1}, {true, -kNotInThisTest}, {false, 0}}));
  ASSERT_TRUE(ended());
  EXPECT_EQ(listener.times("done 1"), 1U);
  EXPECT_EQ(check_record(port).state, 0);
}

// Milliseconds become microseconds in 32 bits: the first two wrap to a time before now, the third
// to less than a millisecond, and the lowest number there is to none.
TEST_F(Sequence, LetsTimesWrapThatAreTooLongForThirtyTwoBits) {
  const auto port = PortBuilder().output().set_up();
  ASSERT_TRUE(drive(port, {{true, 2'147'484},
                           {false, 4'294'967},
                           {true, 4'294'968},
                           {false, std::numeric_limits<std::int32_t>::min()}}));
  ASSERT_TRUE(ended());
  EXPECT_EQ(check_record(port).state, 0);
}

TEST_F(Sequence, StillWaitsForTheLongestTimeThatDoesNotWrap) {
  const auto port = PortBuilder().output().set_up();
  ASSERT_TRUE(drive(port, {{true, 2'147'483}, {false, 0}}));
  ASSERT_TRUE(listener.wait_for("changed 1 on"));
  EXPECT_TRUE(io_port_is_busy(port.get()));
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, false));
  EXPECT_EQ(listener.times("changed 1 off"), 0U);
}

TEST_F(Sequence, AnnouncesEachEndOnce) {
  const auto port = PortBuilder().output().set_up();
  for (int i = 0; i < 3; ++i) {
    ASSERT_TRUE(drive(port, {{true, 0}, {false, 0}}));
    ASSERT_TRUE(ended());
    (void)listener.heard();
  }
  EXPECT_EQ(listener.times("done 1"), 3U);
}

TEST_F(Sequence, RunsBesideThoseOfOtherPorts) {
  const auto one = PortBuilder().number(1).output().set_up();
  const auto two = PortBuilder().number(2).output().set_up();
  ASSERT_TRUE(drive(one, {{true, kNotInThisTest}}));
  ASSERT_TRUE(drive(two, {{true, 0}}));
  EXPECT_TRUE(listener.wait_for("done 2"));
  EXPECT_TRUE(io_port_is_busy(one.get()));
  EXPECT_TRUE(io_port_set_activelow(one.get(), true, false));
  EXPECT_TRUE(listener.wait_for("done 1"));
}

TEST_F(Sequence, EndsSilentlyBeforeAnyoneListens) {
  const auto port = PortBuilder().output().set_up();
  port_listener() = {};
  ASSERT_TRUE(drive(port, {{true, 0}}));
  io_port_wait_for_action_threads();
  EXPECT_EQ(check_record(port).state, 1);
}

// --- Steps that only report ---

TEST_F(Sequence, ReportsVirtualStepsWithoutTouchingTheLine) {
  const auto port = PortBuilder().output().event(event_for_outputs("siren")).set_up();
  ASSERT_TRUE(report(port, {{true, 0}, {true, 0}}));
  ASSERT_TRUE(ended());
  EXPECT_EQ(check_record(port).state, 0);
  EXPECT_EQ(listener.heard(),
            (Lines{"send siren 1", "changed 1 on", "send siren 1", "changed 1 on", "done 1"}));
  EXPECT_TRUE(listener.changes().front().virtual_trig);
}

TEST_F(Sequence, ReportsVirtualStepsOfInputsToo) {
  const auto port = PortBuilder().input().set_up();
  ASSERT_TRUE(report(port, {{true, 0}, {false, 0}}));
  ASSERT_TRUE(ended());
  EXPECT_EQ(listener.heard(), (Lines{"changed 1 on", "changed 1 off", "done 1"}));
}

TEST_F(Sequence, StoresVirtualStepsOnVirtualOutputs) {
  const auto port = PortBuilder().backend(BACKEND_VIRTUAL).output().set_up();
  ASSERT_TRUE(report(port, {{false, 0}, {true, 0}}));
  ASSERT_TRUE(ended());
  EXPECT_TRUE(io_port_get_state(port.get()));
}

// --- Refusals ---

TEST_F(Sequence, IsRefusedOnAnInput) {
  const auto input = PortBuilder().input().set_up();
  const auto configured = PortBuilder().configurable_input().set_up();
  EXPECT_FALSE(drive(input, {{true, 0}}));
  EXPECT_FALSE(drive(configured, {{true, 0}}));
  EXPECT_EQ(log.take_all(G_LOG_LEVEL_WARNING, kRefused), 2U);
  EXPECT_FALSE(io_port_is_busy(input.get()));
  EXPECT_EQ(listener.heard(), Lines{});
}

TEST_F(Sequence, IsRefusedOnAVirtualPort) {
  const auto port = PortBuilder().backend(BACKEND_VIRTUAL).output().set_up();
  EXPECT_FALSE(drive(port, {{true, 0}}));
  EXPECT_TRUE(log.took_warning(kRefused));
}

TEST_F(Sequence, IsRefusedOnAPortThatIsNotSetUp) {
  const auto port = PortBuilder().output().build();
  EXPECT_FALSE(drive(port, {{true, 0}}));
  EXPECT_FALSE(report(port, {{true, 0}}));
  EXPECT_EQ(log.take_all(G_LOG_LEVEL_WARNING, kRefused), 2U);
  EXPECT_EQ(listener.heard(), Lines{});
}

TEST_F(Sequence, IsRefusedOnAPortThatWasDropped) {
  const auto port = PortBuilder().output().set_up();
  io_port_drop(port.get());
  EXPECT_FALSE(drive(port, {{true, 0}}));
  EXPECT_TRUE(log.took_warning(kRefused));
}

TEST_F(Sequence, IsRefusedWithoutSteps) {
  const auto port = PortBuilder().output().set_up();
  EXPECT_FALSE(drive(port, {}));
  EXPECT_FALSE(report(port, {}));
  EXPECT_EQ(log.take_all(G_LOG_LEVEL_WARNING, kRefused), 2U);
  EXPECT_FALSE(io_port_is_busy(port.get()));
}

TEST_F(Sequence, IsRefusedWhileAnotherRuns) {
  const auto port = held_output();
  EXPECT_TRUE(io_port_is_busy(port.get()));
  EXPECT_FALSE(drive(port, {{false, 0}}));
  EXPECT_FALSE(report(port, {{false, 0}}));
  EXPECT_EQ(log.take_all(G_LOG_LEVEL_WARNING, kRefused), 2U);
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, false));
  EXPECT_EQ(listener.times("done 1"), 1U);
}

TEST_F(Sequence, IsBusyFromTheMomentThatItWasStarted) {
  const auto port = PortBuilder().output().set_up();
  ASSERT_TRUE(drive(port, {{true, kNotInThisTest}}));
  EXPECT_TRUE(io_port_is_busy(port.get()));
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, false));
  EXPECT_FALSE(io_port_is_busy(port.get()));
}

// --- Cancelling ---

TEST_F(Sequence, EndsWhenTheSenseChanges) {
  const auto port = held_output();
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, false));
  EXPECT_EQ(listener.times("done 1"), 1U);
  EXPECT_FALSE(io_port_is_busy(port.get()));
  EXPECT_TRUE(io_port_get_state(port.get()));
  EXPECT_EQ(listener.times("changed 1 off"), 0U);
}

TEST_F(Sequence, EndsWhenTheDirectionChanges) {
  const auto port = PortBuilder().configurable_output().set_up();
  ASSERT_TRUE(drive(port, {{true, kNotInThisTest}, {false, 0}}));
  ASSERT_TRUE(listener.wait_for("changed 1 on"));
  EXPECT_TRUE(io_port_set_direction(port.get(), true));
  EXPECT_EQ(listener.times("done 1"), 1U);
  EXPECT_EQ(check_record(port).state, 1);
}

TEST_F(Sequence, EndsBeforeTheChangeThatCancelsItIsReported) {
  const auto port = PortBuilder().configurable_output().set_up();
  ASSERT_TRUE(drive(port, {{true, kNotInThisTest}}));
  ASSERT_TRUE(listener.wait_for("changed 1 on"));
  EXPECT_TRUE(io_port_set_direction(port.get(), true));
  EXPECT_EQ(listener.heard(), (Lines{"changed 1 on", "done 1", "changed 1 on"}));
}

TEST_F(Sequence, EndsWhenThePortIsDropped) {
  const auto port = held_output();
  io_port_drop(port.get());
  EXPECT_EQ(listener.times("done 1"), 1U);
  EXPECT_FALSE(io_port_get_state(port.get()));
}

TEST_F(Sequence, EndsAtShutdown) {
  auto port = held_output();
  port_registry_add(port.get());
  port.reset();
  port_registry_drop_all();
  EXPECT_EQ(listener.times("done 1"), 1U);
}

TEST_F(Sequence, EndsAlsoWhenCancelledBeforeItsFirstStep) {
  const auto port = PortBuilder().output().set_up();
  for (int i = 0; i < 200; ++i) {
    ASSERT_TRUE(drive(port, {{true, kNotInThisTest}}));
    ASSERT_TRUE(io_port_set_activelow(port.get(), i % 2 == 0, false));
    ASSERT_FALSE(io_port_is_busy(port.get()));
  }
  EXPECT_EQ(listener.times("done 1"), 200U);
}

TEST_F(Sequence, IsNotCancelledByAChangeOfLongAgo) {
  const auto port = PortBuilder().output().set_up();
  ASSERT_TRUE(io_port_set_activelow(port.get(), true, false));
  (void)listener.heard();
  ASSERT_TRUE(drive(port, {{true, 0}, {false, 0}, {true, 0}}));
  ASSERT_TRUE(ended());
  EXPECT_EQ(listener.heard(), (Lines{"changed 1 on", "changed 1 off", "changed 1 on", "done 1"}));
}

TEST_F(Sequence, MayBeFollowedByAnotherAfterACancel) {
  const auto port = held_output();
  ASSERT_TRUE(io_port_set_activelow(port.get(), true, false));
  ASSERT_TRUE(drive(port, {{false, 0}}));
  io_port_wait_for_action_threads();
  EXPECT_EQ(listener.times("done 1"), 2U);
  EXPECT_FALSE(io_port_get_state(port.get()));
}

TEST_F(Sequence, GoesOnWhenASenseIsSetThatThePortDoesNotHave) {
  const auto port = held_output();
  EXPECT_FALSE(io_port_set_activelow(port.get(), true, true));
  EXPECT_FALSE(io_port_set_direction(port.get(), true));
  EXPECT_TRUE(io_port_is_busy(port.get()));
  ASSERT_TRUE(io_port_set_activelow(port.get(), true, false));
}

TEST_F(Sequence, LetsAStateThroughWhileItWaits) {
  const auto port = held_output();
  EXPECT_TRUE(io_port_set_state(port.get(), false));
  EXPECT_EQ(check_record(port).state, 0);
  EXPECT_TRUE(io_port_is_busy(port.get()));
  ASSERT_TRUE(io_port_set_activelow(port.get(), true, false));
}

// A cancel must not take the end of the sequence that it stopped for nothing, when the next one has
// begun by the time that it wakes.
TEST_F(Sequence, CanBeCancelledWhileOthersKeepStartingNewOnes) {
  const auto port = PortBuilder().output().set_up();
  std::atomic<bool> stop = false;
  std::thread starter([&] {
    while (!stop) {
      (void)drive(port, {{true, kLongerThanTimeoutMs}});
    }
  });
  std::int64_t slowest = 0;
  while (listener.times("done 1") < kCancels && slowest < kTestTimeoutUs) {
    const std::int64_t begin = g_get_monotonic_time();
    EXPECT_TRUE(
        io_port_set_activelow(port.get(), !io_port_get_activelow(port.get(), false), false));
    slowest = std::max(slowest, g_get_monotonic_time() - begin);
    log.forget();  // the refusals
  }
  stop = true;
  starter.join();
  EXPECT_TRUE(io_port_set_activelow(port.get(), false, false));
  EXPECT_LT(slowest, kTestTimeoutUs);
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, false));
  EXPECT_FALSE(io_port_is_busy(port.get()));
  log.forget();
}

// --- The port's life ---

TEST_F(Sequence, KeepsItsPortAlive) {
  PortBuilder builder;
  builder.output().event(event_for_outputs("siren"));
  {
    const auto port = builder.set_up();
    ASSERT_TRUE(drive(port, {{true, 1}, {false, 1}}));
  }
  ASSERT_TRUE(ended());
  EXPECT_EQ(listener.heard().back(), "undeclare siren");
}

TEST_F(Sequence, LeavesNoThreadToWaitForWhenNoneRuns) {
  io_port_wait_for_action_threads();
}

}  // namespace
