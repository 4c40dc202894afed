// A port on an I/O box, while the box takes its time.
#include <memory>
#include <string>
#include <vector>

#include "backends/iobox-backend.h"
#include "fake-io-box.h"
#include "support/deadline.h"
#include "support/port-fixture.h"

namespace {

using Calls = std::vector<std::string>;

// Whether the port reads active when its event is declared.
bool active_when_declared = false;

bool declare(IOPort *port, IoEvent * /*event*/) {
  active_when_declared = io_port_get_state(port);
  return true;
}

class IoBoxInBackground : public PortFixture {
 protected:
  IoBoxInBackground() {
    fake_io_box() = {};
    io_box_calls();
  }

  static PortBuilder on_box() {
    PortBuilder builder;
    builder.backend(BACKEND_IOBOX);
    return builder;
  }
  static IOPortRef in_service(PortBuilder &builder) {
    auto port = builder.build();
    EXPECT_TRUE(io_port_setup(port.get()));
    io_port_set_watch(port.get());
    io_box_calls();
    return port;
  }
  static bool wait_until_idle(const IOPortRef &port) {
    bool idle = false;
    io_port_when_idle(port.get(), [&] { idle = true; });
    return iterate_until([&] { return idle; });
  }
};

TEST_F(IoBoxInBackground, IsInServiceWhenTheBoxHasAnsweredAndNotBefore) {
  fake_io_box().hangs_in = "GetIOState";
  const auto port = on_box().input().build();
  io_port_begin_setup(port.get());
  ASSERT_TRUE(io_box_hangs());
  EXPECT_FALSE(io_port_is_set_up(port.get()));
  EXPECT_FALSE(io_port_events_enabled(port.get()));
  io_box_recovers();
  ASSERT_TRUE(wait_until_idle(port));
  EXPECT_TRUE(io_port_is_set_up(port.get()));
  EXPECT_TRUE(io_port_events_enabled(port.get()));
  EXPECT_EQ(io_box_calls(),
            (Calls{"GetIOBoxConnected ()", "GetIOPortStatus (1,)", "GetIOState (1,)"}));
}

TEST_F(IoBoxInBackground, KnowsTheStateBeforeItsEventsAreDeclared) {
  port_listener().declare_event = declare;
  active_when_declared = false;
  fake_io_box().state = "closed";
  const auto port = in_service(on_box().input().event(event_for_inputs("alarm")));
  EXPECT_TRUE(active_when_declared);
}

TEST_F(IoBoxInBackground, TakesASignalForNewerThanTheAnswerThatItOvertakes) {
  fake_io_box().hangs_in = "GetIOState";
  const auto port = on_box().input().build();
  io_port_begin_setup(port.get());
  ASSERT_TRUE(io_box_hangs());
  io_box_signals(1, "closed");
  io_box_recovers();
  ASSERT_TRUE(wait_until_idle(port));
  EXPECT_TRUE(io_port_get_state(port.get()));
}

TEST_F(IoBoxInBackground, HasTheStateThatWasAskedForWhileTheBoxHangs) {
  const auto port = in_service(on_box().output());
  fake_io_box().hangs_in = "SetIOMode";
  EXPECT_TRUE(io_port_set_state(port.get(), true));
  ASSERT_TRUE(io_box_hangs());
  EXPECT_TRUE(io_port_get_state(port.get()));
  EXPECT_TRUE(io_port_set_state(port.get(), false));
  EXPECT_FALSE(io_port_get_state(port.get()));
  io_box_recovers();
  ASSERT_TRUE(wait_until_idle(port));
  EXPECT_EQ(io_box_calls(), (Calls{"SetIOMode (1, 1, 'out')", "SetIOMode (1, 0, 'out')"}));
}

TEST_F(IoBoxInBackground, HasTheLevelThatTheBoxIsToldWhenAnInputBecomesAnOutput) {
  const auto port = in_service(on_box().configurable_input());
  io_box_signals(1, "closed");
  EXPECT_TRUE(io_port_get_state(port.get()));
  EXPECT_TRUE(io_port_set_direction(port.get(), false));
  EXPECT_FALSE(io_port_get_state(port.get()));
  ASSERT_TRUE(wait_until_idle(port));
  EXPECT_EQ(io_box_calls(), Calls{"SetIOMode (1, 0, 'out')"});
}

TEST_F(IoBoxInBackground, TellsEventsForSupervisedInputsTheLine) {
  const auto port = in_service(
      on_box().input().event(event_for_inputs("plain")).event(event_for_supervised_inputs("line")));
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  listener.heard();
  io_box_signals(1, "cut");
  io_box_signals(1, "short");
  EXPECT_EQ(listener.heard(), (Lines{"send line 3", "send plain 0", "changed 1 off", "send line 2",
                                     "send plain 0", "changed 1 off"}));
  ASSERT_TRUE(wait_until_idle(port));
}

TEST_F(IoBoxInBackground, TellsABoxThatIsStartedAnewItsModesAndReportsWhatHasChanged) {
  const auto output = in_service(on_box().number(2).output());
  EXPECT_TRUE(io_port_set_state(output.get(), true));
  const auto input = in_service(on_box().number(1).input());
  ASSERT_TRUE(wait_until_idle(output));
  io_box_calls();
  listener.heard();
  fake_io_box().state = "closed";
  io_box_restarts();
  ASSERT_TRUE(wait_until_idle(input));
  EXPECT_EQ(io_box_calls(),
            (Calls{"SetIOMode (2, 1, 'out')", "SetIOMode (1, 0, 'in')", "GetIOState (1,)"}));
  EXPECT_EQ(listener.heard(), Lines{"changed 1 on"});
  io_box_restarts();
  ASSERT_TRUE(wait_until_idle(input));
  EXPECT_EQ(listener.heard(), Lines{});
}

TEST_F(IoBoxInBackground, IsDroppedWhileTheBoxHangsAndNoLongerListens) {
  const auto port = in_service(on_box().output());
  fake_io_box().hangs_in = "SetIOMode";
  EXPECT_TRUE(io_port_set_state(port.get(), true));
  ASSERT_TRUE(io_box_hangs());
  io_port_drop(port.get());
  io_box_signals(1, "closed");
  io_box_restarts();
  io_box_recovers();
  ASSERT_TRUE(wait_until_idle(port));
  EXPECT_FALSE(io_port_get_state(port.get()));
  EXPECT_EQ(io_box_calls(), Calls{"SetIOMode (1, 1, 'out')"});
}

}  // namespace
