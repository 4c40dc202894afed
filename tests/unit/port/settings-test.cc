// What a port is called and flagged, and the settings that users change while it runs.
#include "port/ioport-private.h"
#include "port/port-name.h"
#include "support/port-fixture.h"

namespace {

class PortSettings : public PortFixture {};
class PortFlags : public PortFixture {};
class PortNames : public PortFixture {};
class PortSense : public PortFixture {};
class PortDirection : public PortFixture {};

// --- Defaults, flags and legacy settings ---

TEST_F(PortSettings, OfANewPortAreTheDefaults) {
  const IOPortRef port(io_port_new());
  EXPECT_EQ(io_port_get_type(port.get()), PORT_INPUT);
  EXPECT_EQ(port->backend, 0);
  EXPECT_FALSE(io_port_has_backend(port.get()));
  EXPECT_FALSE(io_port_get_id(port.get()));
  EXPECT_EQ(io_port_get_number(port.get()), -1);
  EXPECT_FALSE(io_port_get_activelow(port.get(), true));
  EXPECT_FALSE(io_port_get_activelow(port.get(), false));
  EXPECT_FALSE(io_port_is_supervised(port.get()));
  EXPECT_TRUE(io_port_events_enabled(port.get()));
  EXPECT_FALSE(io_port_is_set_up(port.get()));
  EXPECT_FALSE(io_port_is_optional(port.get()));
  EXPECT_TRUE(io_port_get_flags(port.get()).empty());
  EXPECT_TRUE(io_port_events(port.get()).empty());
  EXPECT_FALSE(io_port_is_busy(port.get()));
}

TEST_F(PortSettings, OfANewPortHoldTheLegacyDefaults) {
  const IOPortRef port(io_port_new());
  EXPECT_EQ(io_port_get_button(port.get()), BUTTON_NONE);
  EXPECT_EQ(io_port_get_pulse_time(port.get()), 0U);
  EXPECT_EQ(io_port_get_delay_time(port.get()), 0);
  EXPECT_EQ(io_port_get_mode(port.get()), PORT_MODE_BISTABLE);
  EXPECT_EQ(io_port_get_spare_setting(port.get()), 1U);
}

TEST_F(PortSettings, HaveNoModesButTheTwo) {
  const auto port = PortBuilder().output().build();
  EXPECT_TRUE(io_port_set_mode(port.get(), PORT_MODE_MONOSTABLE));
  EXPECT_EQ(io_port_get_mode(port.get()), 1);
  for (const int mode : {0, 3, -1, INT32_MAX, INT32_MIN}) {
    EXPECT_FALSE(io_port_set_mode(port.get(), mode)) << mode;
  }
  EXPECT_EQ(io_port_get_mode(port.get()), 1);
  EXPECT_TRUE(io_port_set_mode(port.get(), PORT_MODE_BISTABLE));
  EXPECT_EQ(io_port_get_mode(port.get()), 2);
}

TEST_F(PortSettings, AreKeptAsGiven) {
  const auto port = PortBuilder().output().build();
  io_port_set_delay_time(port.get(), -1);
  io_port_set_pulse_time(port.get(), UINT32_MAX);
  io_port_set_button(port.get(), BUTTON_ACTINACT);
  EXPECT_EQ(io_port_get_delay_time(port.get()), -1);
  EXPECT_EQ(io_port_get_pulse_time(port.get()), UINT32_MAX);
  EXPECT_EQ(io_port_get_button(port.get()), BUTTON_ACTINACT);
}

TEST_F(PortSettings, IgnoreASpareSettingOfNothing) {
  const auto port = PortBuilder().build();
  io_port_set_spare_setting(port.get(), 7);
  io_port_set_spare_setting(port.get(), 0);
  EXPECT_EQ(io_port_get_spare_setting(port.get()), 7U);
}

TEST_F(PortSettings, OfNoPortAreTheAgreedOnes) {
  EXPECT_EQ(io_port_get_mode(nullptr), 0);
  EXPECT_EQ(io_port_get_delay_time(nullptr), -1);
  EXPECT_EQ(io_port_get_spare_setting(nullptr), 0U);
  EXPECT_FALSE(io_port_is_ioport(nullptr));
}

TEST_F(PortSettings, DescribeAPortWithoutANameToo) {
  const IOPortRef port(io_port_new());
  EXPECT_STREQ(io_port_describe(port.get()), "(without name)");
  io_port_set_id(port.get(), "relay1");
  EXPECT_STREQ(io_port_describe(port.get()), "relay1");
}

TEST_F(PortFlags, AreSetByTheWordTrueInAnyCase) {
  const auto port = PortBuilder().build();
  for (const char *yes : {"true", "TRUE", "True"}) {
    io_port_set_flag(port.get(), "flag", yes);
    EXPECT_TRUE(io_port_get_flag(port.get(), "flag")) << yes;
  }
  for (const char *no : {"false", "yes", "1", "", "true ", " true", "truely"}) {
    io_port_set_flag(port.get(), "flag", no);
    EXPECT_FALSE(io_port_get_flag(port.get(), "flag")) << no;
  }
}

TEST_F(PortFlags, ThatAreAbsentReadFalseAndCanBeToldFromFalseOnes) {
  const auto port = PortBuilder().flag("hidden", "false").build();
  EXPECT_FALSE(io_port_get_flag(port.get(), "hidden"));
  EXPECT_FALSE(io_port_get_flag(port.get(), "virtual"));
  EXPECT_EQ(io_port_lookup_flag(port.get(), "hidden"), false);
  EXPECT_EQ(io_port_lookup_flag(port.get(), "virtual"), std::nullopt);
}

TEST_F(PortFlags, ReadFalseOnAPortWithoutABackend) {
  const IOPortRef port(io_port_new());
  io_port_set_flag(port.get(), "ioport", "true");
  EXPECT_FALSE(io_port_get_flag(port.get(), "ioport"));
  EXPECT_FALSE(io_port_is_ioport(port.get()));
  EXPECT_EQ(io_port_lookup_flag(port.get(), "ioport"), true);
}

TEST_F(PortFlags, AreListedByName) {
  const auto port = PortBuilder().flag("virtual").flag("hidden", "no").build();
  const std::vector<std::pair<std::string, bool>> expected = {
      {"hidden", false}, {"ioport", true}, {"virtual", true}};
  EXPECT_EQ(io_port_get_flags(port.get()), expected);
}

// --- Names ---

TEST_F(PortNames, AreThoseOfTheRoleInUse) {
  EXPECT_EQ(io_port_get_name(PortBuilder().input().names("in", "out").build().get()), "in");
  EXPECT_EQ(io_port_get_name(PortBuilder().output().names("in", "out").build().get()), "out");
  EXPECT_EQ(io_port_get_name(PortBuilder().configurable_input().names("in", "out").build().get()),
            "in");
  EXPECT_EQ(io_port_get_name(PortBuilder().configurable_output().names("in", "out").build().get()),
            "out");
}

TEST_F(PortNames, AreUnsetUntilGiven) {
  EXPECT_EQ(io_port_get_name(PortBuilder().build().get()), std::nullopt);
}

TEST_F(PortNames, OfNoPortAreLogged) {
  EXPECT_EQ(io_port_get_name(nullptr), std::nullopt);
  EXPECT_TRUE(log.took_containing(G_LOG_LEVEL_CRITICAL, "io_port_get_name"));
}

struct Names {
  std::optional<std::string> input = "untouched";
  std::optional<std::string> output = "untouched";
};

Names names_of(const IOPortRef &port) {
  Names names;
  io_port_get_names(port.get(), &names.input, &names.output);
  return names;
}

TEST_F(PortNames, AreGivenForTheSidesThatThePortHas) {
  const Names input = names_of(PortBuilder().input().names("in", "out").build());
  EXPECT_EQ(input.input, "in");
  EXPECT_EQ(input.output, "untouched");
  const Names output = names_of(PortBuilder().output().names("in", "out").build());
  EXPECT_EQ(output.input, "untouched");
  EXPECT_EQ(output.output, "out");
  const Names both = names_of(PortBuilder().configurable_input().names("in", "out").build());
  EXPECT_EQ(both.input, "in");
  EXPECT_EQ(both.output, "out");
  const Names none = names_of(nullptr);
  EXPECT_EQ(none.input, "untouched");
  EXPECT_EQ(none.output, "untouched");
}

TEST_F(PortNames, CanNotBeSetForASideThatThePortDoesNotHave) {
  const auto input = PortBuilder().input().build();
  const auto output = PortBuilder().output().build();
  EXPECT_FALSE(io_port_set_output_name(input.get(), "name"));
  EXPECT_FALSE(io_port_set_input_name(output.get(), "name"));
  EXPECT_FALSE(io_port_set_input_name(nullptr, "name"));
  EXPECT_FALSE(io_port_set_output_name(nullptr, "name"));
  EXPECT_EQ(io_port_get_name(input.get()), std::nullopt);
  EXPECT_EQ(io_port_get_name(output.get()), std::nullopt);
}

TEST_F(PortNames, ThatChangeMakeTheEventsKnownAnew) {
  const auto port = PortBuilder().input().event(event_for_inputs("alarm")).build();
  EXPECT_TRUE(io_port_set_input_name(port.get(), "Door"));
  EXPECT_EQ(io_port_get_name(port.get()), "Door");
  EXPECT_EQ(listener.heard(), Lines{"redeclare alarm"});
}

TEST_F(PortNames, ThatStayTheSameLeaveTheEventsAlone) {
  const auto port =
      PortBuilder().input().names("Door", "").event(event_for_inputs("alarm")).build();
  EXPECT_TRUE(io_port_set_input_name(port.get(), "Door"));
  EXPECT_EQ(listener.heard(), Lines{});
}

TEST_F(PortNames, OfTheOtherRoleLeaveTheEventsAlone) {
  const auto port = PortBuilder().configurable_input().event(event_for_inputs("alarm")).build();
  EXPECT_TRUE(io_port_set_output_name(port.get(), "Relay"));
  EXPECT_EQ(listener.heard(), Lines{});
  EXPECT_TRUE(io_port_set_input_name(port.get(), "Door"));
  EXPECT_EQ(listener.heard(), Lines{"redeclare alarm"});
}

TEST_F(PortNames, AreUtf8OfAtMost4096Bytes) {
  const auto port = PortBuilder().input().names("Door", "").build();
  std::string euros;
  while (euros.size() + 3 <= kPortNameMaxBytes) {
    euros += "\u20ac";
  }
  EXPECT_FALSE(io_port_set_input_name(port.get(), euros + "xx"));
  EXPECT_FALSE(io_port_set_input_name(port.get(), "Caf\xe9"));
  EXPECT_FALSE(io_port_set_input_name(port.get(), std::string("a\0b", 3)));
  EXPECT_EQ(io_port_get_name(port.get()), "Door");
  EXPECT_TRUE(io_port_set_input_name(port.get(), euros + "x"));
}

TEST_F(PortNames, ThatCanNotBeOnesAreLeftOutOfWhatIsRestored) {
  const auto port = PortBuilder().id("gate").input().names("Door", "").build();
  io_port_restore_name(port.get(), std::string(kPortNameMaxBytes + 1, 'x'), true);
  EXPECT_TRUE(log.took_containing(G_LOG_LEVEL_WARNING, "Port gate: the input name is ignored"));
  io_port_restore_name(port.get(), "Caf\xe9", true);
  EXPECT_TRUE(log.took_containing(G_LOG_LEVEL_WARNING, "Port gate: the input name is ignored"));
  EXPECT_EQ(io_port_get_name(port.get()), "Door");
}

TEST_F(PortNames, MayBeEmptyWhichIsNotUnset) {
  const auto port = PortBuilder().output().event(event_for_outputs("siren")).build();
  EXPECT_TRUE(io_port_set_output_name(port.get(), ""));
  EXPECT_EQ(io_port_get_name(port.get()), "");
  EXPECT_EQ(listener.heard(), Lines{"redeclare siren"});
}

// --- Active-low sense ---

TEST_F(PortSense, OfAnOutputFlipsTheLineAndKeepsTheState) {
  const auto port = PortBuilder().output().event(event_for_outputs("siren")).set_up();
  ASSERT_TRUE(io_port_set_state(port.get(), true));
  (void)listener.heard();
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, false));
  EXPECT_EQ(check_record(port).state, 0);
  EXPECT_TRUE(io_port_get_state(port.get()));
  EXPECT_TRUE(io_port_set_activelow(port.get(), false, false));
  EXPECT_EQ(check_record(port).state, 1);
  EXPECT_TRUE(io_port_get_state(port.get()));
}

TEST_F(PortSense, OfAnInactiveOutputFlipsTheLineToo) {
  const auto port = PortBuilder().output().set_up();
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, false));
  EXPECT_EQ(check_record(port).state, 1);
  EXPECT_FALSE(io_port_get_state(port.get()));
}

TEST_F(PortSense, OfAnInputReportsTheStateAnew) {
  const auto port = PortBuilder().input().event(event_for_inputs("alarm")).set_up();
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, true));
  EXPECT_TRUE(io_port_get_state(port.get()));
  EXPECT_EQ(listener.heard(), (Lines{"send alarm 1", "changed 1 on"}));
  EXPECT_FALSE(listener.changes().back().virtual_trig);
  EXPECT_TRUE(listener.changes().back().activelow);
}

TEST_F(PortSense, OfAnInputLetsItsNextEventsPassTheRepeatFilter) {
  const auto port = PortBuilder().input().event(event_for_inputs("alarm")).set_up();
  EXPECT_FALSE(io_port_events(port.get()).front().filter_reset);
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, true));
  EXPECT_TRUE(io_port_events(port.get()).front().filter_reset);
}

TEST_F(PortSense, OfAnOutputLetsItsNextEventsPassTheRepeatFilter) {
  const auto port = PortBuilder()
                        .output()
                        .event(event_for_outputs("siren"))
                        .event(event_for_inputs("alarm"))
                        .set_up();
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, false));
  for (const auto &event : io_port_events(port.get())) {
    EXPECT_TRUE(event.filter_reset) << *event.name;
  }
}

TEST_F(PortSense, OfTheOtherRoleLetsTheNextEventsPassToo) {
  const auto port = PortBuilder().configurable_input().event(event_for_inputs("alarm")).set_up();
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, false));
  EXPECT_TRUE(io_port_events(port.get()).front().filter_reset);
}

TEST_F(PortSense, ThatIsGivenAgainDoesNothing) {
  const auto port = PortBuilder().configurable_input().event(event_for_inputs("alarm")).set_up();
  EXPECT_TRUE(io_port_set_activelow(port.get(), false, true));
  EXPECT_TRUE(io_port_set_activelow(port.get(), false, false));
  EXPECT_FALSE(io_port_events(port.get()).front().filter_reset);
  EXPECT_EQ(listener.heard(), Lines{});
}

TEST_F(PortSense, OfTheOtherRoleIsStoredSilently) {
  const auto port = PortBuilder().configurable_input().set_up();
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, false));
  EXPECT_EQ(check_record(port).state, 0);
  EXPECT_TRUE(io_port_get_activelow(port.get(), false));
  ASSERT_TRUE(io_port_set_direction(port.get(), false));
  (void)listener.heard();
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, true));
  EXPECT_EQ(listener.heard(), Lines{});
}

TEST_F(PortSense, BelongsToTheSidesThatThePortHas) {
  const auto input = PortBuilder().input().set_up();
  const auto output = PortBuilder().output().set_up();
  EXPECT_FALSE(io_port_set_activelow(input.get(), true, false));
  EXPECT_FALSE(io_port_set_activelow(output.get(), true, true));
  EXPECT_FALSE(io_port_get_activelow(input.get(), false));
  EXPECT_FALSE(io_port_get_activelow(output.get(), true));
}

TEST_F(PortSense, IsStoredOnAPortThatIsNotSetUp) {
  const auto output = PortBuilder().output().build();
  EXPECT_TRUE(io_port_set_activelow(output.get(), true, false));
  EXPECT_TRUE(io_port_get_activelow(output.get(), false));
  EXPECT_EQ(check_record(output).state, 0);
  const auto input = PortBuilder().input().build();
  EXPECT_TRUE(io_port_set_activelow(input.get(), true, true));
  EXPECT_EQ(listener.heard(), Lines{});
}

TEST_F(PortSense, IsChangedSilentlyWhileEventsAreOff) {
  const auto port = PortBuilder().input().event(event_for_inputs("alarm")).set_up();
  io_port_set_events_enabled(port.get(), false);
  (void)listener.heard();
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, true));
  EXPECT_TRUE(io_port_get_state(port.get()));
  EXPECT_EQ(listener.heard(), Lines{});
}

TEST_F(PortSense, LeavesThePortFree) {
  const auto port = PortBuilder().output().set_up();
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, false));
  EXPECT_FALSE(io_port_is_busy(port.get()));
}

// --- Direction ---

TEST_F(PortDirection, IsFixedUnlessThePortIsConfigurable) {
  const auto input = PortBuilder().input().set_up();
  const auto output = PortBuilder().output().set_up();
  EXPECT_FALSE(io_port_set_direction(input.get(), false));
  EXPECT_FALSE(io_port_set_direction(output.get(), true));
  EXPECT_TRUE(io_port_input(input.get()));
  EXPECT_FALSE(io_port_input(output.get()));
  EXPECT_EQ(listener.heard(), Lines{});
}

TEST_F(PortDirection, ToInputTellsTheBackendAndArmsTheWatch) {
  const auto port = PortBuilder().configurable_output().set_up();
  EXPECT_TRUE(io_port_set_direction(port.get(), true));
  EXPECT_TRUE(io_port_input(port.get()));
  EXPECT_TRUE(io_port_direction_input(port.get()));
  EXPECT_EQ(check_record(port).direction, 1);
  EXPECT_TRUE(check_record(port).watching);
}

TEST_F(PortDirection, ToOutputTellsTheBackendAndArmsNoWatch) {
  const auto port = PortBuilder().configurable_input().set_up();
  check_record(port).direction = 1;
  EXPECT_TRUE(io_port_set_direction(port.get(), false));
  EXPECT_FALSE(io_port_input(port.get()));
  EXPECT_EQ(check_record(port).direction, 0);
  EXPECT_FALSE(check_record(port).watching);
}

TEST_F(PortDirection, ExchangesTheEventsOfTheRolesAndReportsTheState) {
  const auto port = PortBuilder()
                        .configurable_output()
                        .event(event_for_outputs("siren"))
                        .event(event_for_inputs("alarm"))
                        .set_up();
  check_record(port).state = 1;
  EXPECT_TRUE(io_port_set_direction(port.get(), true));
  EXPECT_EQ(listener.heard(), (Lines{"redeclare alarm", "declare alarm", "undeclare siren",
                                     "send alarm 1", "changed 1 on"}));
  EXPECT_TRUE(io_port_set_direction(port.get(), false));
  EXPECT_EQ(listener.heard(), (Lines{"undeclare alarm", "redeclare siren", "declare siren",
                                     "send siren 1", "changed 1 on"}));
}

TEST_F(PortDirection, IsReportedAlsoWhenItIsGivenAgain) {
  const auto port = PortBuilder().configurable_input().set_up();
  EXPECT_TRUE(io_port_set_direction(port.get(), true));
  EXPECT_EQ(listener.heard(), Lines{"changed 1 off"});
}

TEST_F(PortDirection, IsOnlyStoredOnAPortThatIsNotSetUp) {
  const auto port = PortBuilder().configurable_input().event(event_for_outputs("siren")).build();
  EXPECT_TRUE(io_port_set_direction(port.get(), false));
  EXPECT_FALSE(io_port_input(port.get()));
  EXPECT_EQ(listener.heard(), Lines{});
  EXPECT_FALSE(check_record(port).watching);
}

TEST_F(PortDirection, IsKnownWithoutABackendToo) {
  const IOPortRef port(io_port_new());
  EXPECT_TRUE(io_port_direction_input(port.get()));
  io_port_set_type(port.get(), PORT_OUTPUT);
  EXPECT_FALSE(io_port_direction_input(port.get()));
  io_port_set_type(port.get(), PORT_CONFIGURABLE);
  EXPECT_TRUE(io_port_direction_input(port.get()));
  EXPECT_TRUE(io_port_set_direction(port.get(), false));
  EXPECT_FALSE(io_port_direction_input(port.get()));
}

}  // namespace
