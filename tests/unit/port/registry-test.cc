// The daemon's ports: in which order they stand, how they are found and counted.
#include "port/registry-fixture.h"
#include "support/fake-supervised.h"

namespace {

// --- Order and lookups ---

TEST_F(Registry, IsEmptyAtFirst) {
  EXPECT_EQ(port_registry_count(), 0U);
  EXPECT_EQ(port_registry_nth(0), nullptr);
  EXPECT_EQ(port_registry_find(0), nullptr);
  EXPECT_EQ(port_registry_find_parked(0), nullptr);
  EXPECT_EQ(port_registry_get_by_id("any"), nullptr);
  EXPECT_FALSE(port_registry_any_port_active());
}

TEST_F(Registry, RunsFromTheNewestPortToTheOldest) {
  add(port("a", 0));
  add(port("b", 1));
  add(port("c", 2));
  EXPECT_EQ(ids_in_order(), (Lines{"c", "b", "a"}));
  EXPECT_EQ(id_of(port_registry_nth(0)), "c");
  EXPECT_EQ(id_of(port_registry_nth(2)), "a");
  EXPECT_EQ(port_registry_nth(3), nullptr);
  EXPECT_EQ(port_registry_nth(SIZE_MAX), nullptr);
  EXPECT_EQ(port_registry_count(), 3U);
}

TEST_F(Registry, FindsTheFirstDeclaredOfTwoPortsWithOneNumber) {
  add(port("first", 3));
  add(port("second", 3));
  EXPECT_EQ(id_of(port_registry_find(3)), "first");
}

TEST_F(Registry, FindsOnlyPortsThatTakePart) {
  add(unflagged("neither", 3));
  EXPECT_EQ(port_registry_find(3), nullptr);
  PortBuilder virtual_only = unflagged("virtual", 3);
  add(virtual_only.flag("virtual"));
  EXPECT_EQ(id_of(port_registry_find(3)), "virtual");
}

TEST_F(Registry, CountsVirtualPortsLikeOthersWhenNumbersMeet) {
  PortBuilder virtual_only = unflagged("virtual", 3);
  add(virtual_only.flag("virtual"));
  add(port("later", 3));
  EXPECT_EQ(id_of(port_registry_find(3)), "virtual");
}

TEST_F(Registry, DoesNotFindByNumberWhatHasNoBackend) {
  const IOPortRef bare(io_port_new());
  io_port_set_number(bare.get(), 3);
  io_port_set_flag(bare.get(), "ioport", "true");
  port_registry_add(bare.get());
  EXPECT_EQ(port_registry_find(3), nullptr);
}

TEST_F(Registry, FindsOddNumbersOnlyAsTheyAre) {
  add(port("unnumbered", -1));
  add(port("large", INT32_MAX));
  EXPECT_EQ(port_registry_find(UINT32_MAX), nullptr);
  EXPECT_EQ(port_registry_find(0), nullptr);
  EXPECT_EQ(id_of(port_registry_find(INT32_MAX)), "large");
}

TEST_F(Registry, FindsTheNewestOfTwoPortsWithOneName) {
  add(port("twin", 1));
  add(port("twin", 2));
  EXPECT_EQ(io_port_get_number(port_registry_get_by_id("twin").get()), 2);
  EXPECT_EQ(port_registry_get_by_id("Twin"), nullptr);
  EXPECT_EQ(port_registry_get_by_id(""), nullptr);
}

TEST_F(Registry, FindsAPortByNameForACallerThatHoldsTheLock) {
  add(port("a", 1));
  const auto lock = port_registry_lock();
  EXPECT_EQ(port_registry_find_by_id_locked("a"), port_registry_active_locked().front());
  EXPECT_EQ(port_registry_find_by_id_locked("b"), nullptr);
}

TEST_F(Registry, DoesNotTakeAPortWithoutANameForOneWithAnEmptyName) {
  const IOPortRef nameless(io_port_new());
  port_registry_add(nameless.get());
  EXPECT_EQ(port_registry_get_by_id(""), nullptr);
}

TEST_F(Registry, RemovesOnePortByName) {
  add(port("twin", 1));
  add(port("twin", 2));
  add(port("other", 3));
  port_registry_remove_by_id("twin");
  EXPECT_EQ(ids_in_order(), (Lines{"other", "twin"}));
  EXPECT_EQ(io_port_get_number(port_registry_get_by_id("twin").get()), 1);
  port_registry_remove_by_id("nobody");
  EXPECT_EQ(port_registry_count(), 2U);
}

TEST_F(Registry, KeepsAPortAliveForWhoeverLookedItUp) {
  PortBuilder builder = port("a", 1);
  add(builder.event(event_for_inputs("alarm")));
  IOPortRef found = port_registry_find(1);
  port_registry_remove_by_id("a");
  EXPECT_EQ(listener.heard(), Lines{});
  EXPECT_EQ(id_of(found), "a");
  found.reset();
  EXPECT_EQ(listener.heard(), Lines{"undeclare alarm"});
}

TEST_F(Registry, KeepsAPortAliveByItself) {
  PortBuilder builder = port("a", 1);
  IOPortRef mine = builder.event(event_for_inputs("alarm")).registered();
  mine.reset();
  EXPECT_EQ(listener.heard(), Lines{});
  port_registry_remove_by_id("a");
  EXPECT_EQ(listener.heard(), Lines{"undeclare alarm"});
}

// --- Counting and passes ---

TEST_F(Registry, CountsThePortsOfTheDeviceByTheirRole) {
  add(port("i", 0).input());
  add(port("o", 1).output());
  add(port("ci", 2).configurable_input());
  add(port("co", 3).configurable_output());
  add(unflagged("hidden input", 4).input());
  add(unflagged("hidden output", 5).output());
  EXPECT_EQ(port_registry_count_inputs(), 2U);
  EXPECT_EQ(port_registry_count_outputs(), 2U);
  ASSERT_TRUE(io_port_set_direction(port_registry_find(2).get(), false));
  EXPECT_EQ(port_registry_count_inputs(), 1U);
  EXPECT_EQ(port_registry_count_outputs(), 3U);
}

TEST_F(Registry, ListsTheSupervisablePortsInItsOrder) {
  register_fake_supervised();
  add(port("a", 1).backend(kFakeSupervisedKind));
  add(port("b", 2));
  add(port("c", 3).backend(kFakeSupervisedKind));
  const IOPortRef bare(io_port_new());
  port_registry_add(bare.get());
  EXPECT_EQ(port_registry_supervisable_numbers(), (std::vector<std::uint32_t>{3, 1}));
  backends_register();
}

TEST_F(Registry, KnowsWhetherAPortWithTheAnyPortEventIsActive) {
  const auto plain = port("plain", 0).set_up_and_registered();
  const auto any = port("any", 1).event(event_for_inputs("PortAny")).set_up_and_registered();
  check_record(plain).state = 1;
  EXPECT_FALSE(port_registry_any_port_active());
  check_record(any).state = 1;
  EXPECT_TRUE(port_registry_any_port_active());
  io_port_set_events_enabled(any.get(), false);
  EXPECT_FALSE(port_registry_any_port_active());
}

TEST_F(Registry, VisitsThePortsThatHaveABackend) {
  add(port("a", 0));
  const IOPortRef bare(io_port_new());
  port_registry_add(bare.get());
  add(port("b", 1));
  Lines visited;
  port_registry_for_each([&](IOPort *p) { visited.emplace_back(io_port_describe(p)); });
  EXPECT_EQ(visited, (Lines{"b", "a"}));
}

TEST_F(Registry, ArmsTheWatchesOfInputs) {
  const auto input = port("i", 0).input().set_up_and_registered();
  const auto output = port("o", 1).output().set_up_and_registered();
  port_registry_arm_watches();
  EXPECT_TRUE(check_record(input).watching);
  EXPECT_FALSE(check_record(output).watching);
}

TEST_F(Registry, DeclaresTheEventsOfPortsThatMaySpeak) {
  add(port("a", 0).event(event_for_inputs("alarm")));
  const auto silent = port("b", 1).event(event_for_inputs("silent")).registered();
  io_port_set_events_enabled(silent.get(), false);
  (void)listener.heard();
  port_registry_declare_events();
  EXPECT_EQ(listener.heard(), Lines{"declare alarm"});
}

TEST_F(Registry, GoesOnDeclaringAfterAnEventThatCanNotBe) {
  add(port("a", 0).event(event_for_inputs("alarm")));
  add(port("b", 1).event(event_for_inputs("broken")));
  listener.refuse("broken");
  port_registry_declare_events();
  EXPECT_TRUE(log.took_warning("Could not declare event broken"));
  EXPECT_EQ(listener.heard(), (Lines{"declare broken", "declare alarm"}));
}

// The event library asks for the state of every port while an event is declared.
TEST_F(Registry, MayBeAskedWhileEventsAreDeclared) {
  add(port("a", 0).event(event_for_inputs("PortAny")));
  port_listener().declare_event = [](IOPort *, IoEvent *) {
    return !port_registry_any_port_active();
  };
  port_registry_declare_events();
}

}  // namespace
