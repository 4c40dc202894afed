// The way of ports through service: named, set up, parked, brought back and freed.
#include "port/registry-fixture.h"

namespace {

using RegistryService = Registry;

// --- Default names ---

TEST_F(RegistryService, NamesInputsAndOutputsByRisingNumber) {
  add(port("c", 2).input());
  add(port("b", 1).configurable_input());
  add(port("a", 0).input());
  port_registry_assign_default_names();
  EXPECT_EQ(input_name(0), "Input 1");
  EXPECT_EQ(input_name(1), "Input 2");
  EXPECT_EQ(output_name(1), "Output 1");
  EXPECT_EQ(input_name(2), "Input 3");
}

TEST_F(RegistryService, NamesNoPortWhoseNumberIsNotBelowTheirCount) {
  add(port("a", 0).output());
  add(port("b", 1).output());
  add(port("c", 5).output());
  port_registry_assign_default_names();
  EXPECT_EQ(output_name(0), "Output 1");
  EXPECT_EQ(output_name(1), "Output 2");
  EXPECT_EQ(output_name(5), std::nullopt);
}

TEST_F(RegistryService, CountsPortsThatHaveNamesAlready) {
  add(port("a", 0).configurable_input().names("Door", "Relay"));
  add(port("b", 1).configurable_output());
  port_registry_assign_default_names();
  EXPECT_EQ(input_name(0), "Door");
  EXPECT_EQ(output_name(0), "Relay");
  EXPECT_EQ(input_name(1), "Input 2");
  EXPECT_EQ(output_name(1), "Output 2");
}

TEST_F(RegistryService, LeavesEmptyNamesAlone) {
  add(port("a", 0).input().names("", ""));
  port_registry_assign_default_names();
  EXPECT_EQ(input_name(0), "");
}

TEST_F(RegistryService, NamesTheDetectorAfterWhatItIs) {
  add(port("pir_detector", 0).input());
  add(port("door", 1).input());
  port_registry_assign_default_names();
  EXPECT_EQ(input_name(0), "PIR sensor");
  EXPECT_EQ(input_name(1), "Input 2");
}

TEST_F(RegistryService, NamesADetectorThatIsConfigurableTheSame) {
  add(port("pir_detector", 0).configurable_input());
  port_registry_assign_default_names();
  EXPECT_EQ(input_name(0), "PIR sensor");
  EXPECT_EQ(output_name(0), "Output 1");
}

TEST_F(RegistryService, SkipsNumbersThatNoPortHas) {
  add(port("a", 0).input());
  add(unflagged("odd", 1).input());
  add(port("c", 2).input());
  port_registry_assign_default_names();
  EXPECT_EQ(input_name(2), "Input 2");
}

// --- Setting up, parking, coming back ---

TEST_F(RegistryService, SetsUpEveryPort) {
  add(port("a", 0));
  add(port("b", 1));
  port_registry_setup_all();
  EXPECT_TRUE(io_port_is_set_up(port_registry_find(0).get()));
  EXPECT_TRUE(io_port_is_set_up(port_registry_find(1).get()));
}

TEST_F(RegistryService, ParksAnOptionalPortThatFails) {
  add(failing("broken", 0).optional());
  add(port("fine", 1));
  port_registry_setup_all();
  EXPECT_EQ(ids_in_order(), Lines{"fine"});
  EXPECT_EQ(port_registry_find(0), nullptr);
  EXPECT_EQ(port_registry_get_by_id("broken"), nullptr);
  EXPECT_EQ(id_of(port_registry_find_parked(0)), "broken");
  EXPECT_EQ(port_registry_count_inputs(), 1U);
}

TEST_F(RegistryService, KeepsAPortThatFailsAndIsNotOptional) {
  add(failing("broken", 0));
  port_registry_setup_all();
  EXPECT_EQ(id_of(port_registry_find(0)), "broken");
  EXPECT_FALSE(io_port_is_set_up(port_registry_find(0).get()));
  EXPECT_EQ(port_registry_find_parked(0), nullptr);
}

TEST_F(RegistryService, KeepsAPortWithoutABackendOutOfService) {
  const IOPortRef bare(io_port_new());
  io_port_set_id(bare.get(), "bare");
  port_registry_add(bare.get());
  port_registry_setup_all();
  EXPECT_TRUE(log.took_warning("Port bare has no backend and stays out of service"));
  EXPECT_EQ(io_port_fault(port_registry_nth(0).get()), "it has no backend");
  EXPECT_EQ(ids_in_order(), Lines{"bare"});
}

TEST_F(RegistryService, LogsHowManyPortsAreInServiceAndWhyTheOthersAreNot) {
  add(port("door", 0));
  add(failing("siren", 1));
  add(failing("module", 2).optional());
  add(port("gate", 3));
  port_registry_setup_all();
  port_registry_log_service();
  EXPECT_EQ(log.take_warnings(),
            (Lines{"Port siren, number 1, is out of service (listed): its description says so",
                   "Port module, number 2, is out of service (not listed): its description says "
                   "so"}));
  EXPECT_TRUE(log.took(G_LOG_LEVEL_INFO, "2 of 4 ports are in service"));
}

TEST_F(RegistryService, LogsOneLineWhenAllPortsAreInService) {
  add(port("door", 0));
  port_registry_setup_all();
  port_registry_log_service();
  EXPECT_TRUE(log.took(G_LOG_LEVEL_INFO, "1 of 1 ports are in service"));
  EXPECT_TRUE(log.empty());
}

TEST_F(RegistryService, AFaultIsForgottenWhenTheSetUpBeginsAnew) {
  add(failing("module", 0).optional());
  port_registry_setup_all();
  const IOPortRef module = port_registry_find_parked(0);
  EXPECT_FALSE(io_port_in_service(module.get()));
  repair(module);
  EXPECT_EQ(retry_parked(), 1U);
  EXPECT_TRUE(io_port_in_service(module.get()));
  EXPECT_EQ(io_port_fault(module.get()), "");
}

TEST_F(RegistryService, BringsAParkedPortBackOnceItWorks) {
  add(port("fine", 1));
  add(failing("broken", 0).optional());
  port_registry_setup_all();
  EXPECT_EQ(retry_parked(), 0U);
  repair(port_registry_find_parked(0));
  EXPECT_EQ(retry_parked(), 1U);
  EXPECT_EQ(ids_in_order(), (Lines{"broken", "fine"}));
  EXPECT_TRUE(io_port_is_set_up(port_registry_find(0).get()));
  EXPECT_EQ(port_registry_find_parked(0), nullptr);
  EXPECT_EQ(retry_parked(), 0U);
}

TEST_F(RegistryService, BringsBackOnlyTheParkedPortsThatWork) {
  add(failing("a", 0).optional());
  add(failing("b", 1).optional());
  add(failing("c", 2).optional());
  port_registry_setup_all();
  EXPECT_EQ(port_registry_count(), 0U);
  repair(port_registry_find_parked(0));
  repair(port_registry_find_parked(2));
  EXPECT_EQ(retry_parked(), 2U);
  EXPECT_EQ(id_of(port_registry_find_parked(1)), "b");
  EXPECT_EQ(port_registry_count(), 2U);
}

TEST_F(RegistryService, FindsParkedPortsByTheSameRules) {
  add(failing("hidden", 3).optional().flag("ioport", "false"));
  port_registry_setup_all();
  EXPECT_EQ(port_registry_find_parked(3), nullptr);
}

// A list is searched for the port that entered it first.
TEST_F(RegistryService, FindsThePortThatWasParkedFirstOfTwoWithOneNumber) {
  const auto one = port("one", 3).optional().set_up_and_registered();
  const auto two = port("two", 3).optional().set_up_and_registered();
  for (const auto &[first, second] : {std::pair(one.get(), two.get()), {two.get(), one.get()}}) {
    port_registry_park(first);
    port_registry_park(second);
    EXPECT_EQ(port_registry_find_parked(3).get(), first);
    EXPECT_EQ(retry_parked(), 2U);
  }
}

// Start-up walks from the newest port to the oldest.
TEST_F(RegistryService, ParksTheNewestOfThePortsThatFailFirst) {
  add(failing("older", 3).optional());
  add(failing("newer", 3).optional());
  port_registry_setup_all();
  EXPECT_EQ(id_of(port_registry_find_parked(3)), "newer");
}

// Each list is filled at its front, so both ways turn the order round.
TEST_F(RegistryService, PutsParkedPortsInFrontOfOnesThatWereParkedBefore) {
  for (const char *id : {"a", "b", "c"}) {
    add(port(id, 0).optional());
  }
  port_registry_setup_all();
  for (const char *id : {"b", "a", "c"}) {
    port_registry_park(port_registry_get_by_id(id).get());
  }
  EXPECT_EQ(retry_parked(), 3U);
  EXPECT_EQ(ids_in_order(), (Lines{"b", "a", "c"}));
}

TEST_F(RegistryService, ParksAPortOnRequestWhenItIsOptional) {
  const auto optional = port("o", 0).optional().set_up_and_registered();
  const auto needed = port("n", 1).set_up_and_registered();
  io_port_drop(optional.get());
  port_registry_park(optional.get());
  port_registry_park(needed.get());
  EXPECT_EQ(ids_in_order(), Lines{"n"});
  EXPECT_EQ(id_of(port_registry_find_parked(0)), "o");
  EXPECT_EQ(retry_parked(), 1U);
  EXPECT_EQ(ids_in_order(), (Lines{"o", "n"}));
  EXPECT_TRUE(io_port_is_set_up(optional.get()));
}

TEST_F(RegistryService, DoesNotParkWhatItDoesNotHold) {
  const auto stranger = port("s", 0).optional().set_up();
  port_registry_park(stranger.get());
  EXPECT_EQ(port_registry_find_parked(0), nullptr);
}

TEST_F(RegistryService, DoesNotParkAPortTwice) {
  const auto optional = port("o", 0).optional().set_up_and_registered();
  port_registry_park(optional.get());
  port_registry_park(optional.get());
  EXPECT_EQ(retry_parked(), 1U);
  EXPECT_EQ(port_registry_count(), 1U);
}

// --- Shutdown ---

TEST_F(RegistryService, FreesActiveAndParkedPortsAtShutdown) {
  add(port("a", 0).event(event_for_inputs("active")));
  add(failing("b", 1).optional().event(event_for_inputs("parked")));
  port_registry_setup_all();
  port_registry_drop_all();
  EXPECT_EQ(listener.heard(), (Lines{"undeclare active", "undeclare parked"}));
  EXPECT_EQ(port_registry_count(), 0U);
  EXPECT_EQ(port_registry_find_parked(1), nullptr);
}

TEST_F(RegistryService, FreesPortsAtShutdownThatOthersStillRefer) {
  IOPortRef mine = port("a", 0).event(event_for_inputs("alarm")).registered();
  port_registry_drop_all();
  EXPECT_EQ(listener.heard(), Lines{"undeclare alarm"});
  (void)mine.release();  // freed already
}

TEST_F(RegistryService, MayBeEmptiedTwiceAndUsedAgain) {
  add(port("a", 0));
  port_registry_drop_all();
  port_registry_drop_all();
  add(port("b", 1));
  EXPECT_EQ(ids_in_order(), Lines{"b"});
}

}  // namespace
