// What the port layer may expect of every backend. A backend is put under the contract with a row
// in contract-fixture.cc.
#include <fcntl.h>

#include <algorithm>
#include <set>
#include <string>
#include <vector>

#include "contract-fixture.h"
#include "port/ioport-private.h"

namespace {

constexpr PortType kTypes[] = {PORT_INPUT, PORT_OUTPUT, PORT_CONFIGURABLE};

class EveryBackend : public World {};

INSTANTIATE_TEST_SUITE_P(Every, BackendContract, testing::ValuesIn(all_backends()), name_of);

TEST_F(EveryBackend, IsUnderTheContract) {
  constexpr int beyond = 100;
  std::set<BackendKind> registered;
  for (int number = -beyond; number < beyond; ++number) {
    const auto kind = static_cast<BackendKind>(number);
    if (io_port_has_backend(make_port(kind, PORT_INPUT, {}).get())) {
      registered.insert(kind);
    }
  }
  std::set<BackendKind> under_test;
  for (const auto &row : all_backends()) {
    under_test.insert(row.kind);
  }
  EXPECT_EQ(under_test, registered);
}

// --- The table ---

TEST_P(BackendContract, IsKnownByItsWordAndKind) {
  EXPECT_EQ(io_port_backend_kind(GetParam().word), GetParam().kind);
  const auto port = described();
  EXPECT_TRUE(io_port_has_backend(port.get()));
  EXPECT_EQ(port->backend, GetParam().kind);
}

TEST_P(BackendContract, OffersSupervisionOnlyWhereItHasIt) {
  const auto port = described();
  const PortFunctions &functions = *port->functions;
  const bool offers = GetParam().supervisable;
  EXPECT_EQ(functions.is_supervisable != nullptr, offers);
  EXPECT_EQ(functions.set_supervised != nullptr, offers);
  EXPECT_EQ(functions.get_supervised_ranges != nullptr, offers);
  EXPECT_EQ(functions.set_supervised_ranges != nullptr, offers);
  EXPECT_EQ(functions.get_supervised_readout != nullptr, offers);
  EXPECT_EQ(functions.drop != nullptr, GetParam().drops);
}

TEST_P(BackendContract, HasOneTableForAllItsPorts) {
  EXPECT_EQ(described()->functions, fresh()->functions);
}

TEST_P(BackendContract, GivesEachPortARecordOfItsOwnOnce) {
  const auto one = described();
  const auto two = described();
  const PortBackendData *record = io_port_backend_data(one.get());
  if (record) {
    EXPECT_NE(record, io_port_backend_data(two.get()));
  }
  io_port_set_backend(one.get(), GetParam().kind);
  EXPECT_EQ(io_port_backend_data(one.get()), record);
}

// --- A port that nothing was told about ---

TEST_P(BackendContract, ReadsInactiveBeforeSetUp) {
  EXPECT_FALSE(io_port_get_state(fresh().get()));
  EXPECT_FALSE(io_port_get_state(described().get()));
}

// Whether it was set up or not, the port layer may ask for levels and directions.
TEST_P(BackendContract, EnduresEveryRequestOnFreshData) {
  const auto port = fresh();
  const PortFunctions &functions = *port->functions;
  (void)io_port_read_level(port.get());
  io_port_write_level(port.get(), 1);
  io_port_write_level(port.get(), 0);
  if (functions.set_direction) {
    functions.set_direction(port.get(), true);
    functions.set_direction(port.get(), false);
  }
  if (functions.start_watch) {
    functions.start_watch(port.get());
  }
}

TEST_P(BackendContract, EnduresEveryRequestToAFreshPortOfAnyType) {
  for (const PortType type : kTypes) {
    const auto port = fresh(type);
    io_port_set_watch(port.get());
    EXPECT_FALSE(io_port_set_state(port.get(), true));
    EXPECT_EQ(io_port_set_direction(port.get(), false), type == PORT_CONFIGURABLE);
    io_port_drop(port.get());
    io_port_set_watch(port.get());
  }
}

TEST_P(BackendContract, EnduresASetUpThatWasToldNothing) {
  for (const PortType type : kTypes) {
    const auto port = fresh(type);
    (void)io_port_setup(port.get());
    (void)io_port_get_state(port.get());
    io_port_set_watch(port.get());
    iterate();
  }
}

TEST_P(BackendContract, EnduresAttributesThatItDoesNotKnow) {
  const auto port = described();
  for (const char *section :
       {"", "backend", "device", "input", "output", "io_ctrl", "range", "no-such-section"}) {
    for (const char *value : {"", "-1", "true", "99999999999999999999", "\xC3\xA5"}) {
      io_port_set_backend_property(port.get(), section, "no-such-key", value);
      io_port_set_backend_property(port.get(), section, "", value);
    }
  }
  EXPECT_TRUE(io_port_setup(port.get()));
}

TEST_P(BackendContract, EnduresAttributesAfterSetUp) {
  const auto port = watched();
  for (const auto &[section, key, value] : (this->*GetParam().properties)()) {
    io_port_set_backend_property(port.get(), section, key, value.c_str());
  }
  EXPECT_EQ(reports_of_activation(port), one_report());
}

// --- In service ---

TEST_P(BackendContract, ServesAPortFromSetUpToItsEnd) {
  const auto port = watched();
  EXPECT_TRUE(io_port_is_set_up(port.get()));
  EXPECT_FALSE(io_port_get_state(port.get()));
  if (GetParam().type == PORT_CONFIGURABLE) {
    EXPECT_TRUE(io_port_set_direction(port.get(), false));
    (void)io_port_set_state(port.get(), true);
    EXPECT_TRUE(io_port_set_activelow(port.get(), true, false));
    EXPECT_TRUE(io_port_set_direction(port.get(), true));
  }
}

TEST_P(BackendContract, ReportsAChangeOfItsInputOnce) {
  EXPECT_EQ(reports_of_activation(watched()), one_report());
}

TEST_P(BackendContract, ReportsNothingBeforeItIsWatched) {
  EXPECT_EQ(reports_of_activation(set_up()), Words{});
}

TEST_P(BackendContract, WatchesAPortOnceHoweverOftenItIsArmed) {
  const auto port = watched();
  const Held armed_once = held();
  io_port_set_watch(port.get());
  io_port_set_watch(port.get());
  EXPECT_EQ(held(), armed_once);
  EXPECT_EQ(reports_of_activation(port), one_report());
}

TEST_P(BackendContract, WatchesTheInputAgainThatWasAnOutput) {
  const auto port = watched();
  const Held armed = held();
  if (GetParam().type == PORT_CONFIGURABLE) {
    EXPECT_TRUE(io_port_set_direction(port.get(), false));
    io_port_set_watch(port.get());
    EXPECT_TRUE(io_port_set_direction(port.get(), true));
  }
  EXPECT_EQ(held(), armed);
}

// The descriptors that a second set-up opens get other numbers than those of the first, so that one
// of the first that somebody still waits for is found out.
TEST_P(BackendContract, CanBeSetUpAgainWhileItIsWatched) {
  UniqueFd lowest(open("/dev/null", O_RDONLY | O_CLOEXEC));
  const auto port = watched();
  const Held armed = held();
  lowest.reset();
  EXPECT_TRUE(io_port_setup(port.get()));
  iterate();
  EXPECT_EQ(reports(), Words{});
  EXPECT_TRUE(std::ranges::includes(armed.watched, watched_files()));
  io_port_set_watch(port.get());
  EXPECT_EQ(held(), armed);
  EXPECT_EQ(reports_of_activation(port), one_report());
}

// --- Out of service ---

TEST_P(BackendContract, GivesEverythingBackWhenThePortIsDropped) {
  const auto port = watched();
  io_port_drop(port.get());
  expect_given_back();
  EXPECT_EQ(reports_of_activation(port), Words{});
}

TEST_P(BackendContract, EnduresEveryRequestToADroppedPort) {
  const auto port = watched();
  io_port_drop(port.get());
  io_port_drop(port.get());
  io_port_set_watch(port.get());
  EXPECT_FALSE(io_port_get_state(port.get()));
  EXPECT_FALSE(io_port_set_state(port.get(), true));
  EXPECT_EQ(io_port_set_direction(port.get(), false), GetParam().type == PORT_CONFIGURABLE);
  (void)io_port_set_activelow(port.get(), true, true);
  (void)io_port_set_activelow(port.get(), true, false);
  expect_given_back();
}

TEST_P(BackendContract, BringsADroppedPortBack) {
  const auto port = watched();
  const Held armed = held();
  for (int i = 0; i < 3; ++i) {
    io_port_drop(port.get());
    EXPECT_TRUE(io_port_setup(port.get()));
    io_port_set_watch(port.get());
    EXPECT_EQ(held(), armed);
  }
  EXPECT_EQ(reports_of_activation(port), one_report());
}

TEST_P(BackendContract, ComesIntoServiceWhenItsHardwareAppears) {
  vanish();
  const auto port = described();
  (void)io_port_setup(port.get());
  io_port_set_watch(port.get());
  iterate();
  EXPECT_EQ(reports(), Words{});
  io_port_drop(port.get());
  appear();
  EXPECT_TRUE(io_port_setup(port.get()));
  io_port_set_watch(port.get());
  EXPECT_EQ(reports_of_activation(port), one_report());
}

TEST_P(BackendContract, LosesItsHardwareAndGetsItBack) {
  const auto port = watched();
  vanish();
  (void)io_port_setup(port.get());
  io_port_set_watch(port.get());
  (void)io_port_get_state(port.get());
  iterate();
  io_port_drop(port.get());
  appear();
  EXPECT_TRUE(io_port_setup(port.get()));
  io_port_set_watch(port.get());
  EXPECT_EQ(reports_of_activation(port), one_report());
}

TEST_P(BackendContract, FreesADroppedPortOnce) {
  auto port = set_up();
  io_port_drop(port.get());
  port.reset();
}

TEST_P(BackendContract, MakesWayForAnotherAndTakesThePortBack) {
  const auto port = watched();
  io_port_set_backend(port.get(),
                      GetParam().kind == BACKEND_CHECK ? BACKEND_VIRTUAL : BACKEND_CHECK);
  expect_given_back();
  EXPECT_TRUE(io_port_setup(port.get()));
  io_port_set_backend(port.get(), GetParam().kind);
  (void)io_port_read_level(port.get());
}

}  // namespace
