// What the port layer may expect of the backends that can supervise their ports, at every stage of
// a port's life.
#include <string_view>
#include <vector>

#include "base/glib-ptr.h"
#include "contract-fixture.h"

namespace {

const SupervisedRanges kRanges = {{SUPERVISED_STATE_CUT, 2000, 1000},
                                  {SUPERVISED_STATE_CLOSED, 900, 800}};

class Supervisable : public BackendContract {
 protected:
  static IOPortRef dropped(IOPortRef port) {
    io_port_drop(port.get());
    return port;
  }
  std::vector<IOPortRef> every_stage() const {
    std::vector<IOPortRef> ports;
    ports.push_back(fresh());
    ports.push_back(fresh(PORT_OUTPUT));
    ports.push_back(fresh(PORT_CONFIGURABLE));
    ports.push_back(described());
    ports.push_back(dropped(described()));
    ports.push_back(dropped(watched()));
    ports.push_back(watched());
    return ports;
  }
  // Of a port that has nothing but the output.
  IOPortRef output() const {
    auto properties = (this->*GetParam().properties)();
    std::erase_if(properties, [](const Property &property) {
      return std::string_view(property.section) == "input";
    });
    return make_port(GetParam().kind, PORT_OUTPUT, properties);
  }
};

INSTANTIATE_TEST_SUITE_P(Every, Supervisable, testing::ValuesIn(supervisable_backends()), name_of);

TEST_P(Supervisable, IsSupervisableOnceItIsDescribed) {
  EXPECT_TRUE(io_port_is_supervisable(described().get()));
  EXPECT_TRUE(io_port_is_supervisable(watched().get()));
}

TEST_P(Supervisable, WatchesNothingBeforeItIsSetUp) {
  const auto port = described();
  io_port_set_watch(port.get());
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  expect_given_back();
}

// --- Switching ---

TEST_P(Supervisable, SwitchesAtEveryStage) {
  for (const auto &port : every_stage()) {
    const bool switches = io_port_is_supervisable(port.get());
    const bool before = io_port_is_supervised(port.get());
    for (const bool on : {true, false, true}) {
      EXPECT_EQ(io_port_set_supervised(port.get(), on), switches);
      EXPECT_EQ(io_port_is_supervised(port.get()), switches ? on : before);
      (void)io_port_get_state(port.get());
      (void)io_port_get_supervised_state(port.get());
    }
  }
}

TEST_P(Supervisable, WatchesTheSameAfterItWasSwitchedToAndFro) {
  const auto port = watched();
  const Held armed = held();
  for (int i = 0; i < 2; ++i) {
    EXPECT_TRUE(io_port_set_supervised(port.get(), !GetParam().measured));
    EXPECT_TRUE(io_port_set_supervised(port.get(), !GetParam().measured));
    EXPECT_TRUE(io_port_set_supervised(port.get(), GetParam().measured));
    EXPECT_TRUE(io_port_set_supervised(port.get(), GetParam().measured));
    EXPECT_EQ(held(), armed);
  }
  EXPECT_EQ(reports_of_activation(port), one_report());
}

TEST_P(Supervisable, GivesEverythingBackAfterASwitch) {
  const auto port = watched();
  EXPECT_TRUE(io_port_set_supervised(port.get(), !GetParam().measured));
  io_port_drop(port.get());
  expect_given_back();
}

TEST_P(Supervisable, CanBeSwitchedWhileItIsAnOutput) {
  const auto port = watched();
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  const Held supervised = held();
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_TRUE(io_port_set_direction(port.get(), false));
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_TRUE(io_port_set_direction(port.get(), true));
  EXPECT_EQ(held(), supervised);
}

// --- Ranges ---

TEST_P(Supervisable, TakesRangesWholeOrNotAtAllAtEveryStage) {
  for (const auto &port : every_stage()) {
    for (const SupervisedRanges &ranges : {kRanges, SupervisedRanges{}}) {
      SupervisedRanges before;
      const bool readable = io_port_get_supervised_ranges(port.get(), &before);
      EXPECT_EQ(readable, io_port_is_supervisable(port.get()));
      Error error;
      const bool taken = io_port_set_supervised_ranges(port.get(), ranges, error.out());
      EXPECT_FALSE(taken && error);
      EXPECT_EQ(taken || error, readable);
      SupervisedRanges after;
      EXPECT_EQ(io_port_get_supervised_ranges(port.get(), &after), readable);
      EXPECT_EQ(after, taken ? ranges : before);
    }
  }
}

TEST_P(Supervisable, TakesRangesBeforeSetUpAndWhileWatched) {
  EXPECT_TRUE(io_port_set_supervised_ranges(described().get(), kRanges, nullptr));
  EXPECT_TRUE(io_port_set_supervised_ranges(watched().get(), kRanges, nullptr));
}

TEST_P(Supervisable, KeepsTheRangesOfTheUserWhileItIsOutOfService) {
  const auto port = watched();
  EXPECT_TRUE(io_port_set_supervised_ranges(port.get(), kRanges, nullptr));
  io_port_drop(port.get());
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_EQ(ranges_of(port), kRanges);
}

// --- Readouts ---

TEST_P(Supervisable, ReadsOutOrSaysWhyNotAtEveryStage) {
  for (const auto &port : every_stage()) {
    SupervisedRangeState state = SUPERVISED_STATE_OPEN;
    std::uint32_t level = 0;
    Error error;
    const bool read = io_port_get_supervised_readout(port.get(), &state, &level, error.out());
    EXPECT_NE(read, static_cast<bool>(error));
    (void)io_port_get_supervised_readout(port.get(), &state, &level, nullptr);
  }
}

TEST_P(Supervisable, ReadsOutWhileInService) {
  for (const auto &port : {set_up(), watched()}) {
    EXPECT_EQ(readout(port).find("error"), std::string::npos) << readout(port);
  }
}

// --- Outputs ---

TEST_P(Supervisable, ServesAnOutputWithoutSupervision) {
  const auto port = output();
  for (int i = 0; i < 2; ++i) {
    EXPECT_TRUE(io_port_setup(port.get()));
    io_port_set_watch(port.get());
    EXPECT_TRUE(io_port_set_state(port.get(), true));
    EXPECT_TRUE(io_port_get_state(port.get()));
    EXPECT_FALSE(io_port_set_direction(port.get(), true));
    EXPECT_TRUE(io_port_set_state(port.get(), false));
    EXPECT_FALSE(io_port_get_state(port.get()));
    io_port_drop(port.get());
    expect_given_back();
  }
}

TEST_P(Supervisable, EnduresEveryRequestForSupervisionToAnOutput) {
  const auto port = output();
  EXPECT_TRUE(io_port_setup(port.get()));
  const bool supervisable = io_port_is_supervisable(port.get());
  for (const bool on : {true, false}) {
    EXPECT_EQ(io_port_set_supervised(port.get(), on), supervisable);
    EXPECT_FALSE(io_port_supervised_input(port.get()));
  }
  SupervisedRanges ranges;
  EXPECT_EQ(io_port_set_supervised_ranges(port.get(), kRanges, nullptr), supervisable);
  EXPECT_EQ(io_port_get_supervised_ranges(port.get(), &ranges), supervisable);
  SupervisedRangeState state = SUPERVISED_STATE_OPEN;
  std::uint32_t level = 0;
  EXPECT_EQ(io_port_get_supervised_readout(port.get(), &state, &level, nullptr), supervisable);
}

}  // namespace
