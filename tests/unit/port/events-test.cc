// Which events of a port apply, when they are made known and when they are sent.
#include "support/fake-supervised.h"
#include "support/port-fixture.h"

namespace {

class PortEvents : public PortFixture {
 protected:
  PortEvents() { register_fake_supervised(); }
  ~PortEvents() override { backends_register(); }

  static PortBuilder with_an_event_for_each_role() {
    PortBuilder builder;
    builder.backend(kFakeSupervisedKind)
        .event(event_for_outputs("output"))
        .event(event_for_inputs("input"))
        .event(event_for_supervised_inputs("supervised"));
    return builder;
  }
};

TEST_F(PortEvents, OfAnInputAreThoseForInputs) {
  const auto port = with_an_event_for_each_role().input().set_up();
  io_port_report_state(port.get(), 1);
  EXPECT_EQ(listener.heard(), (Lines{"send input 1", "changed 1 on"}));
}

TEST_F(PortEvents, OfAnOutputAreThoseForOutputs) {
  const auto port = with_an_event_for_each_role().output().set_up();
  io_port_report_state(port.get(), 0);
  EXPECT_EQ(listener.heard(), (Lines{"send output 0", "changed 1 off"}));
}

TEST_F(PortEvents, OfASupervisedInputAreThoseForBothKindsOfInput) {
  const auto port = with_an_event_for_each_role().input().set_up();
  io_port_restore_supervised(port.get(), true);
  io_port_report_state(port.get(), SUPERVISED_STATE_CUT);
  EXPECT_EQ(listener.heard(), (Lines{"send supervised 3", "send input 3", "changed 1 on"}));
}

TEST_F(PortEvents, OfASupervisedPortThatIsAnOutputNowAreThoseForOutputs) {
  const auto port = with_an_event_for_each_role().configurable_output().set_up();
  io_port_restore_supervised(port.get(), true);
  EXPECT_FALSE(io_port_supervised_input(port.get()));
  io_port_report_state(port.get(), 1);
  EXPECT_EQ(listener.heard(), (Lines{"send output 1", "changed 1 on"}));
}

TEST_F(PortEvents, ApplyByRole) {
  const auto port = with_an_event_for_each_role().configurable_input().set_up();
  const IoEvent for_all;
  IoEvent for_none;
  for_none.input = false;
  for_none.output = false;
  for (const bool input : {true, false}) {
    io_port_restore_direction(port.get(), input);
    EXPECT_TRUE(io_port_event_applies(port.get(), for_all));
    EXPECT_FALSE(io_port_event_applies(port.get(), for_none));
    EXPECT_EQ(io_port_event_applies(port.get(), event_for_inputs("i")), input);
    EXPECT_EQ(io_port_event_applies(port.get(), event_for_outputs("o")), !input);
    EXPECT_FALSE(io_port_event_applies(port.get(), event_for_supervised_inputs("s")));
  }
}

TEST_F(PortEvents, AreSentInTheOrderOfTheListBeforePortChanged) {
  const auto port =
      PortBuilder().input().event(event_for_inputs("old")).event(event_for_inputs("new")).set_up();
  io_port_report_state(port.get(), 1);
  EXPECT_EQ(listener.heard(), (Lines{"send new 1", "send old 1", "changed 1 on"}));
}

TEST_F(PortEvents, TellThePortAsItIsInPortChanged) {
  const auto port =
      PortBuilder().number(4).output().activelow().flag("virtual").flag("hidden").set_up();
  io_port_send_signal(port.get(), true, true);
  ASSERT_EQ(listener.changes().size(), 1U);
  const PortChange change = listener.changes().front();
  EXPECT_EQ(change.number, 4);
  EXPECT_TRUE(change.is_virtual);
  EXPECT_TRUE(change.hidden);
  EXPECT_FALSE(change.input);
  EXPECT_TRUE(change.virtual_trig);
  EXPECT_TRUE(change.state);
  EXPECT_TRUE(change.activelow);
}

TEST_F(PortEvents, TellThePlainestPortInPortChanged) {
  const auto port = PortBuilder().number(2).input().set_up();
  io_port_restore_activelow(port.get(), true, false);
  io_port_send_signal(port.get(), false, false);
  ASSERT_EQ(listener.changes().size(), 1U);
  const PortChange change = listener.changes().front();
  EXPECT_EQ(change.number, 2);
  EXPECT_FALSE(change.is_virtual);
  EXPECT_FALSE(change.hidden);
  EXPECT_TRUE(change.input);
  EXPECT_FALSE(change.virtual_trig);
  EXPECT_FALSE(change.state);
  EXPECT_FALSE(change.activelow);
}

TEST_F(PortEvents, OfAPortThatIsSilencedAreWithdrawnAndNotSent) {
  const auto port = PortBuilder().input().event(event_for_inputs("alarm")).set_up();
  io_port_set_events_enabled(port.get(), false);
  EXPECT_EQ(listener.heard(), Lines{"undeclare alarm"});
  io_port_report_state(port.get(), 1);
  io_port_send_signal(port.get(), false, true);
  EXPECT_EQ(listener.heard(), Lines{});
  EXPECT_FALSE(io_port_events_enabled(port.get()));
}

TEST_F(PortEvents, AreDeclaredWhenThePortMaySpeakAgain) {
  const auto port = PortBuilder().input().event(event_for_inputs("alarm")).set_up();
  io_port_set_events_enabled(port.get(), false);
  (void)listener.heard();
  io_port_set_events_enabled(port.get(), true);
  EXPECT_EQ(listener.heard(), Lines{"declare alarm"});
  io_port_report_state(port.get(), 1);
  EXPECT_EQ(listener.heard(), (Lines{"send alarm 1", "changed 1 on"}));
}

TEST_F(PortEvents, StayAsTheyAreWhenSwitchedToWhatTheyAre) {
  const auto port = PortBuilder().input().event(event_for_inputs("alarm")).set_up();
  io_port_set_events_enabled(port.get(), true);
  EXPECT_EQ(listener.heard(), Lines{});
  io_port_set_events_enabled(port.get(), false);
  io_port_set_events_enabled(port.get(), false);
  EXPECT_EQ(listener.heard(), Lines{"undeclare alarm"});
}

TEST_F(PortEvents, ThatCanNotBeDeclaredAreLoggedAndTheOthersAreStill) {
  const auto port = PortBuilder()
                        .event(event_for_inputs("last"))
                        .event(event_for_inputs("broken"))
                        .event(event_for_inputs("first"))
                        .set_up();
  listener.refuse("broken");
  io_port_declare_events(port.get());
  EXPECT_EQ(listener.heard(), (Lines{"declare first", "declare broken", "declare last"}));
  EXPECT_TRUE(log.took_warning("Could not declare event broken"));
}

TEST_F(PortEvents, WithoutANameAreLoggedTooWhenTheyCanNotBeDeclared) {
  IoEvent nameless;
  const auto port = PortBuilder().event(nameless).set_up();
  listener.refuse("(none)");
  io_port_declare_events(port.get());
  EXPECT_TRUE(log.took_warning("Could not declare event "));
}

TEST_F(PortEvents, LoseTheirFilterAllAtOnce) {
  const auto port =
      PortBuilder().event(event_for_inputs("one")).event(event_for_outputs("two")).build();
  io_port_reset_event_filters(port.get());
  for (const auto &event : io_port_events(port.get())) {
    EXPECT_TRUE(event.filter_reset);
  }
}

TEST_F(PortEvents, ContainTheSharedAnyPortEventByName) {
  const auto with = PortBuilder()
                        .event(event_for_inputs("alarm"))
                        .event(event_for_inputs("PortAny"))
                        .event(event_for_inputs("bell"))
                        .build();
  const auto without = PortBuilder().event(event_for_inputs("portany")).event(IoEvent{}).build();
  EXPECT_TRUE(io_port_got_port_any(with.get()));
  EXPECT_FALSE(io_port_got_port_any(without.get()));
  io_port_set_events_enabled(with.get(), false);
  EXPECT_FALSE(io_port_got_port_any(with.get()));
}

TEST_F(PortEvents, AreWithdrawnWithTheirPort) {
  auto port = PortBuilder().event(event_for_inputs("alarm")).build();
  port.reset();
  EXPECT_EQ(listener.heard(), Lines{"undeclare alarm"});
}

TEST_F(PortEvents, AreSkippedWithoutAWordBeforeAnyoneListens) {
  const auto port = PortBuilder().configurable_output().event(event_for_outputs("siren")).set_up();
  port_listener() = {};
  EXPECT_TRUE(io_port_set_state(port.get(), true));
  EXPECT_TRUE(io_port_set_virtual(port.get(), true));
  EXPECT_TRUE(io_port_set_output_name(port.get(), "Siren"));
  EXPECT_TRUE(io_port_set_direction(port.get(), true));
  io_port_declare_events(port.get());
  io_port_set_events_enabled(port.get(), false);
  io_port_set_events_enabled(port.get(), true);
  EXPECT_EQ(listener.heard(), Lines{});
}

}  // namespace
