// Supervision of a port: what is asked of the backend, what is refused before.
#include "base/glib-ptr.h"
#include "port/port-error.h"
#include "support/fake-supervised.h"
#include "support/port-fixture.h"

namespace {

constexpr std::uint32_t kLevelLimit = 65536;

class Supervision : public PortFixture {
 protected:
  Supervision() { register_fake_supervised(); }
  ~Supervision() override { backends_register(); }

  static PortBuilder supervisable() {
    PortBuilder builder;
    builder.backend(kFakeSupervisedKind).input();
    return builder;
  }
  static IOPortRef not_supervisable() {
    auto port = supervisable().set_up();
    fake_record(port).supervisable = false;
    return port;
  }
  static bool set_range(const IOPortRef &port, const char *state, std::uint32_t lower,
                        std::uint32_t upper, Error &error) {
    return io_port_set_supervised_range(port.get(), state, lower, upper, error.out());
  }
};

class SupervisedRangeOfAPort : public Supervision {
 protected:
  IOPortRef port = supervisable().set_up();
  Error error;

  bool set(const char *state, std::uint32_t lower, std::uint32_t upper) {
    return set_range(port, state, lower, upper, error);
  }
  void expect_refused(const char *message) const {
    EXPECT_TRUE(error.matches(io_supervised_error_quark(), IO_SUPERVISED_ERROR_BAD_RANGE));
    EXPECT_STREQ(error.message(), message);
    EXPECT_EQ(fake_record(port).ranges, SupervisedRanges{});
  }
};

// --- Switching supervision ---

TEST_F(Supervision, IsOfferedByTheBackend) {
  EXPECT_TRUE(io_port_is_supervisable(supervisable().set_up().get()));
  EXPECT_FALSE(io_port_is_supervisable(not_supervisable().get()));
  EXPECT_FALSE(io_port_is_supervisable(PortBuilder().set_up().get()));
}

TEST_F(Supervision, IsSwitchedInPortAndBackend) {
  const auto port = supervisable().set_up();
  fake_record(port).calls.clear();
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_TRUE(io_port_is_supervised(port.get()));
  EXPECT_TRUE(io_port_supervised_input(port.get()));
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_FALSE(io_port_supervised_input(port.get()));
  EXPECT_EQ(fake_record(port).calls, (Lines{"set_supervised on", "set_supervised off"}));
}

TEST_F(Supervision, CanNotBeSwitchedOnAPortThatDoesNotOfferIt) {
  const auto port = not_supervisable();
  EXPECT_FALSE(io_port_set_supervised(port.get(), true));
  EXPECT_FALSE(io_port_is_supervised(port.get()));
  EXPECT_FALSE(io_port_set_supervised(PortBuilder().set_up().get(), true));
}

TEST_F(Supervision, OfAConfigurableInputMakesItsEventsKnownForTheRole) {
  const auto port =
      supervisable().configurable_input().event(event_for_supervised_inputs("tamper")).set_up();
  fake_record(port).calls.clear();
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_EQ(fake_record(port).calls,
            (Lines{"set_supervised on", "set_direction input", "start_watch"}));
  EXPECT_EQ(listener.heard(), (Lines{"declare tamper", "send tamper 0", "changed 1 off"}));
}

TEST_F(Supervision, OfAConfigurableOutputIsStoredForLater) {
  const auto port = supervisable().configurable_output().set_up();
  fake_record(port).calls.clear();
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_EQ(fake_record(port).calls, Lines{"set_supervised on"});
  EXPECT_FALSE(io_port_supervised_input(port.get()));
  EXPECT_TRUE(io_port_is_supervised(port.get()));
}

TEST_F(Supervision, IsSwitchedInThePortWhereTheBackendNeedNotKnow) {
  register_fake_supervised(FakeSlots::kOnlyIsSupervisable);
  const auto port = supervisable().set_up();
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_TRUE(io_port_is_supervised(port.get()));
}

// --- Reading the line ---

TEST_F(Supervision, GivesTheStateOfTheLine) {
  const auto port = supervisable().set_up();
  fake_record(port).line = SUPERVISED_STATE_SHORT;
  EXPECT_EQ(io_port_get_supervised_state(port.get()), SUPERVISED_STATE_SHORT);
}

TEST_F(Supervision, GivesNoStateBeforeSetUpAndWhereItIsNotOffered) {
  const auto early = supervisable().build();
  fake_record(early).line = SUPERVISED_STATE_CUT;
  EXPECT_EQ(io_port_get_supervised_state(early.get()), SUPERVISED_STATE_OPEN);
  const auto without = not_supervisable();
  fake_record(without).line = SUPERVISED_STATE_CUT;
  EXPECT_EQ(io_port_get_supervised_state(without.get()), SUPERVISED_STATE_OPEN);
}

TEST_F(Supervision, GivesAnUndefinedStateWhenTheLineCanNotBeRead) {
  const auto port = supervisable().set_up();
  fake_record(port).readout_fails = true;
  EXPECT_EQ(io_port_get_supervised_state(port.get()), SUPERVISED_STATE_UNDEFINED);
  EXPECT_TRUE(log.took_warning("Failed to read supervised state: The fake reads nothing."));
}

struct Readout {
  SupervisedRangeState state = SUPERVISED_STATE_UNDEFINED;
  std::uint32_t level = 0;
  Error error;
  bool ok = false;

  explicit Readout(const IOPortRef &port) {
    ok = io_port_get_supervised_readout(port.get(), &state, &level, error.out());
  }
};

TEST_F(Supervision, ReadsOutStateAndLevel) {
  const auto port = supervisable().set_up();
  fake_record(port).line = SUPERVISED_STATE_CLOSED;
  fake_record(port).line_level = 1234;
  const Readout readout(port);
  EXPECT_TRUE(readout.ok);
  EXPECT_EQ(readout.state, SUPERVISED_STATE_CLOSED);
  EXPECT_EQ(readout.level, 1234U);
}

TEST_F(Supervision, PassesOnWhyTheLineCanNotBeRead) {
  const auto port = supervisable().set_up();
  fake_record(port).readout_fails = true;
  const Readout readout(port);
  EXPECT_FALSE(readout.ok);
  EXPECT_STREQ(readout.error.message(), "The fake reads nothing");
}

TEST_F(Supervision, RefusesAReadoutOfABackendWithoutOne) {
  const Readout readout(PortBuilder().set_up());
  EXPECT_FALSE(readout.ok);
  EXPECT_TRUE(readout.error.matches(io_control_error_quark(), IO_CONTROL_ERROR_GENERIC));
  EXPECT_STREQ(readout.error.message(), "Not applicable for port.");
}

TEST_F(Supervision, RefusesAReadoutOfAPortThatDoesNotOfferIt) {
  const Readout readout(not_supervisable());
  EXPECT_FALSE(readout.ok);
  EXPECT_TRUE(
      readout.error.matches(io_supervised_error_quark(), IO_SUPERVISED_ERROR_NOT_SUPERVISED));
  EXPECT_STREQ(readout.error.message(), "Port is non-supervised");
}

// --- Range lists ---

TEST_F(Supervision, HandsOutACopyOfTheRanges) {
  const auto port = supervisable().set_up();
  const SupervisedRanges held = {{SUPERVISED_STATE_OPEN, 2, 1}};
  fake_record(port).ranges = held;
  SupervisedRanges ranges;
  EXPECT_TRUE(io_port_get_supervised_ranges(port.get(), &ranges));
  ranges.clear();
  EXPECT_EQ(fake_record(port).ranges, held);
}

TEST_F(Supervision, HasNoRangesWhereTheBackendServesNone) {
  SupervisedRanges ranges;
  EXPECT_FALSE(io_port_get_supervised_ranges(not_supervisable().get(), &ranges));
  EXPECT_FALSE(io_port_get_supervised_ranges(PortBuilder().set_up().get(), &ranges));
  EXPECT_FALSE(io_port_set_supervised_ranges(not_supervisable().get(), {}, nullptr));
  EXPECT_FALSE(io_port_set_supervised_ranges(PortBuilder().set_up().get(), {}, nullptr));
  register_fake_supervised(FakeSlots::kNoRanges);
  const auto port = supervisable().set_up();
  EXPECT_FALSE(io_port_get_supervised_ranges(port.get(), &ranges));
  EXPECT_FALSE(io_port_set_supervised_ranges(port.get(), {}, nullptr));
}

// --- One range ---

TEST_F(SupervisedRangeOfAPort, IsAddedAtTheEnd) {
  EXPECT_TRUE(set("open", 100, 200));
  EXPECT_TRUE(set("cut", 1, 2));
  const SupervisedRanges expected = {{SUPERVISED_STATE_OPEN, 200, 100},
                                     {SUPERVISED_STATE_CUT, 2, 1}};
  EXPECT_EQ(fake_record(port).ranges, expected);
  EXPECT_FALSE(error);
}

TEST_F(SupervisedRangeOfAPort, ReplacesTheOneOfItsStateAndMovesToTheEnd) {
  EXPECT_TRUE(set("closed", 1, 2));
  EXPECT_TRUE(set("open", 3, 4));
  EXPECT_TRUE(set("closed", 5, 6));
  const SupervisedRanges expected = {{SUPERVISED_STATE_OPEN, 4, 3},
                                     {SUPERVISED_STATE_CLOSED, 6, 5}};
  EXPECT_EQ(fake_record(port).ranges, expected);
}

TEST_F(SupervisedRangeOfAPort, MustHoldMoreThanOneLevel) {
  EXPECT_FALSE(set("open", 100, 100));
  expect_refused("Invalid range.");
  EXPECT_FALSE(set("open", 10, 5));
  expect_refused("Invalid range.");
  EXPECT_TRUE(set("open", 100, 101));
}

TEST_F(SupervisedRangeOfAPort, EndsBelowTheLimit) {
  EXPECT_FALSE(set("open", 0, kLevelLimit));
  expect_refused("Invalid range.");
  EXPECT_FALSE(set("open", kLevelLimit, kLevelLimit + 1));
  expect_refused("Invalid range.");
  EXPECT_TRUE(set("open", 0, kLevelLimit - 1));
}

TEST_F(SupervisedRangeOfAPort, CountsLimitsOfTwoToTheThirtyFirstAndMoreAsNegative) {
  EXPECT_TRUE(set("open", UINT32_MAX, 5));
  EXPECT_TRUE(set("cut", 0x80000000U, UINT32_MAX));
  EXPECT_FALSE(set("short", 5, UINT32_MAX));
  const SupervisedRanges expected = {{SUPERVISED_STATE_OPEN, 5, UINT32_MAX},
                                     {SUPERVISED_STATE_CUT, UINT32_MAX, 0x80000000U}};
  EXPECT_EQ(fake_record(port).ranges, expected);
}

TEST_F(SupervisedRangeOfAPort, NeedsAStateThatIsKnown) {
  for (const char *word : {"Open", "undefined", "", "ajar"}) {
    EXPECT_FALSE(set(word, 1, 2)) << word;
    expect_refused("State is undefined.");
  }
}

TEST_F(SupervisedRangeOfAPort, IsJudgedBeforeItsState) {
  EXPECT_FALSE(set("ajar", 2, 1));
  expect_refused("Invalid range.");
}

TEST_F(SupervisedRangeOfAPort, NeedsAPortThatHasRanges) {
  fake_record(port).supervisable = false;
  EXPECT_FALSE(set("open", 1, 2));
  EXPECT_TRUE(error.matches(io_supervised_error_quark(), IO_SUPERVISED_ERROR_GENERIC));
  EXPECT_STREQ(error.message(), "Failed to get ranges from port.");
}

TEST_F(SupervisedRangeOfAPort, IsRefusedWithTheReasonOfTheBackend) {
  fake_record(port).refuses_ranges = true;
  EXPECT_FALSE(set("open", 1, 2));
  EXPECT_STREQ(error.message(), "The fake refuses.");
  EXPECT_EQ(fake_record(port).ranges, SupervisedRanges{});
}

TEST_F(SupervisedRangeOfAPort, MayBeRefusedToACallerThatDoesNotAskWhy) {
  EXPECT_FALSE(io_port_set_supervised_range(port.get(), "open", 2, 1, nullptr));
  EXPECT_FALSE(io_port_set_supervised_range(port.get(), "ajar", 1, 2, nullptr));
  EXPECT_FALSE(io_port_set_supervised_range(port.get(), nullptr, 1, 2, nullptr));
}

}  // namespace
