// The daemon's ports: in which order they stand, how they are found, named, parked and freed.
#include <algorithm>
#include <string>

#include "port/port-registry.h"
#include "support/fake-supervised.h"
#include "support/port-fixture.h"

namespace {

class Registry : public PortFixture {
 protected:
  // Puts the port in the registry; the references are the registry's alone.
  static void add(PortBuilder &builder) { (void)builder.registered(); }
  static void add(PortBuilder &&builder) { (void)builder.registered(); }

  static std::string id_of(const IOPortRef &port) {
    return port ? io_port_get_id(port.get()).value_or("(without name)") : "(none)";
  }
  static Lines ids_in_order() {
    Lines ids;
    const auto lock = port_registry_lock();
    for (const IOPort *port : port_registry_active_locked()) {
      ids.push_back(io_port_get_id(port).value_or("(without name)"));
    }
    return ids;
  }
  static std::optional<std::string> input_name(std::uint32_t number) { return names(number).first; }
  static std::optional<std::string> output_name(std::uint32_t number) {
    return names(number).second;
  }

 private:
  static std::pair<std::optional<std::string>, std::optional<std::string>> names(
      std::uint32_t number) {
    std::pair<std::optional<std::string>, std::optional<std::string>> both;
    io_port_get_names(port_registry_find(number).get(), &both.first, &both.second);
    return both;
  }
};

PortBuilder port(const char *id, int number) {
  PortBuilder builder;
  builder.id(id).number(number);
  return builder;
}

PortBuilder unflagged(const char *id, int number) {
  PortBuilder builder = port(id, number);
  builder.flag("ioport", "false");
  return builder;
}

PortBuilder failing(const char *id, int number) {
  PortBuilder builder = port(id, number);
  builder.property("any", "setup", "fail");
  return builder;
}

// Lets the next set-up of the port succeed.
void repair(const IOPortRef &broken) {
  check_record(broken).properties.clear();
}

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

// --- Default names ---

TEST_F(Registry, NamesInputsAndOutputsByRisingNumber) {
  add(port("c", 2).input());
  add(port("b", 1).configurable_input());
  add(port("a", 0).input());
  port_registry_assign_default_names();
  EXPECT_EQ(input_name(0), "Input 1");
  EXPECT_EQ(input_name(1), "Input 2");
  EXPECT_EQ(output_name(1), "Output 1");
  EXPECT_EQ(input_name(2), "Input 3");
}

TEST_F(Registry, NamesNoPortWhoseNumberIsNotBelowTheirCount) {
  add(port("a", 0).output());
  add(port("b", 1).output());
  add(port("c", 5).output());
  port_registry_assign_default_names();
  EXPECT_EQ(output_name(0), "Output 1");
  EXPECT_EQ(output_name(1), "Output 2");
  EXPECT_EQ(output_name(5), std::nullopt);
}

TEST_F(Registry, CountsPortsThatHaveNamesAlready) {
  add(port("a", 0).configurable_input().names("Door", "Relay"));
  add(port("b", 1).configurable_output());
  port_registry_assign_default_names();
  EXPECT_EQ(input_name(0), "Door");
  EXPECT_EQ(output_name(0), "Relay");
  EXPECT_EQ(input_name(1), "Input 2");
  EXPECT_EQ(output_name(1), "Output 2");
}

TEST_F(Registry, LeavesEmptyNamesAlone) {
  add(port("a", 0).input().names("", ""));
  port_registry_assign_default_names();
  EXPECT_EQ(input_name(0), "");
}

TEST_F(Registry, NamesTheDetectorAfterWhatItIs) {
  add(port("pir_detector", 0).input());
  add(port("door", 1).input());
  port_registry_assign_default_names();
  EXPECT_EQ(input_name(0), "PIR sensor");
  EXPECT_EQ(input_name(1), "Input 2");
}

TEST_F(Registry, NamesADetectorThatIsConfigurableTheSame) {
  add(port("pir_detector", 0).configurable_input());
  port_registry_assign_default_names();
  EXPECT_EQ(input_name(0), "PIR sensor");
  EXPECT_EQ(output_name(0), "Output 1");
}

TEST_F(Registry, SkipsNumbersThatNoPortHas) {
  add(port("a", 0).input());
  add(unflagged("odd", 1).input());
  add(port("c", 2).input());
  port_registry_assign_default_names();
  EXPECT_EQ(input_name(2), "Input 2");
}

// --- Setting up, parking, coming back ---

TEST_F(Registry, SetsUpEveryPort) {
  add(port("a", 0));
  add(port("b", 1));
  port_registry_setup_all();
  EXPECT_TRUE(io_port_is_set_up(port_registry_find(0).get()));
  EXPECT_TRUE(io_port_is_set_up(port_registry_find(1).get()));
}

TEST_F(Registry, ParksAnOptionalPortThatFails) {
  add(failing("broken", 0).optional());
  add(port("fine", 1));
  port_registry_setup_all();
  EXPECT_EQ(ids_in_order(), Lines{"fine"});
  EXPECT_EQ(port_registry_find(0), nullptr);
  EXPECT_EQ(port_registry_get_by_id("broken"), nullptr);
  EXPECT_EQ(id_of(port_registry_find_parked(0)), "broken");
  EXPECT_EQ(port_registry_count_inputs(), 1U);
}

TEST_F(Registry, KeepsAPortThatFailsAndIsNotOptional) {
  add(failing("broken", 0));
  port_registry_setup_all();
  EXPECT_EQ(id_of(port_registry_find(0)), "broken");
  EXPECT_FALSE(io_port_is_set_up(port_registry_find(0).get()));
  EXPECT_EQ(port_registry_find_parked(0), nullptr);
}

TEST_F(Registry, KeepsAPortWithoutABackendOutOfService) {
  const IOPortRef bare(io_port_new());
  io_port_set_id(bare.get(), "bare");
  port_registry_add(bare.get());
  port_registry_setup_all();
  EXPECT_TRUE(log.took_warning("Port bare has no backend and stays out of service"));
  EXPECT_EQ(ids_in_order(), Lines{"bare"});
}

TEST_F(Registry, BringsAParkedPortBackOnceItWorks) {
  add(port("fine", 1));
  add(failing("broken", 0).optional());
  port_registry_setup_all();
  EXPECT_EQ(port_registry_retry_parked(), 0U);
  repair(port_registry_find_parked(0));
  EXPECT_EQ(port_registry_retry_parked(), 1U);
  EXPECT_EQ(ids_in_order(), (Lines{"broken", "fine"}));
  EXPECT_TRUE(io_port_is_set_up(port_registry_find(0).get()));
  EXPECT_EQ(port_registry_find_parked(0), nullptr);
  EXPECT_EQ(port_registry_retry_parked(), 0U);
}

TEST_F(Registry, BringsBackOnlyTheParkedPortsThatWork) {
  add(failing("a", 0).optional());
  add(failing("b", 1).optional());
  add(failing("c", 2).optional());
  port_registry_setup_all();
  EXPECT_EQ(port_registry_count(), 0U);
  repair(port_registry_find_parked(0));
  repair(port_registry_find_parked(2));
  EXPECT_EQ(port_registry_retry_parked(), 2U);
  EXPECT_EQ(id_of(port_registry_find_parked(1)), "b");
  EXPECT_EQ(port_registry_count(), 2U);
}

TEST_F(Registry, FindsParkedPortsByTheSameRules) {
  add(failing("hidden", 3).optional().flag("ioport", "false"));
  port_registry_setup_all();
  EXPECT_EQ(port_registry_find_parked(3), nullptr);
}

TEST_F(Registry, ParksAPortOnRequestWhenItIsOptional) {
  const auto optional = port("o", 0).optional().set_up_and_registered();
  const auto needed = port("n", 1).set_up_and_registered();
  io_port_drop(optional.get());
  port_registry_park(optional.get());
  port_registry_park(needed.get());
  EXPECT_EQ(ids_in_order(), Lines{"n"});
  EXPECT_EQ(id_of(port_registry_find_parked(0)), "o");
  EXPECT_EQ(port_registry_retry_parked(), 1U);
  EXPECT_EQ(ids_in_order(), (Lines{"o", "n"}));
  EXPECT_TRUE(io_port_is_set_up(optional.get()));
}

TEST_F(Registry, DoesNotParkWhatItDoesNotHold) {
  const auto stranger = port("s", 0).optional().set_up();
  port_registry_park(stranger.get());
  EXPECT_EQ(port_registry_find_parked(0), nullptr);
}

TEST_F(Registry, DoesNotParkAPortTwice) {
  const auto optional = port("o", 0).optional().set_up_and_registered();
  port_registry_park(optional.get());
  port_registry_park(optional.get());
  EXPECT_EQ(port_registry_retry_parked(), 1U);
  EXPECT_EQ(port_registry_count(), 1U);
}

// --- Shutdown ---

TEST_F(Registry, FreesActiveAndParkedPortsAtShutdown) {
  add(port("a", 0).event(event_for_inputs("active")));
  add(failing("b", 1).optional().event(event_for_inputs("parked")));
  port_registry_setup_all();
  port_registry_drop_all();
  EXPECT_EQ(listener.heard(), (Lines{"undeclare active", "undeclare parked"}));
  EXPECT_EQ(port_registry_count(), 0U);
  EXPECT_EQ(port_registry_find_parked(1), nullptr);
}

TEST_F(Registry, FreesPortsAtShutdownThatOthersStillRefer) {
  IOPortRef mine = port("a", 0).event(event_for_inputs("alarm")).registered();
  port_registry_drop_all();
  EXPECT_EQ(listener.heard(), Lines{"undeclare alarm"});
  (void)mine.release();  // freed already
}

TEST_F(Registry, MayBeEmptiedTwiceAndUsedAgain) {
  add(port("a", 0));
  port_registry_drop_all();
  port_registry_drop_all();
  add(port("b", 1));
  EXPECT_EQ(ids_in_order(), Lines{"b"});
}

}  // namespace
