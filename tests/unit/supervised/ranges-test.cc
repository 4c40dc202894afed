// The states of a line, the ranges that tell them apart, and the poll that reports them.
#include <limits>
#include <optional>

#include "base/glib-ptr.h"
#include "port/port-error.h"
#include "supervised/supervised.h"
#include "support/bench.h"
#include "support/fake-ioctl.h"

namespace {

constexpr guint kPoll = 250;

using Words = std::vector<std::string>;

class Ranges : public Bench {
 protected:
  Ranges() : port(make_port(BACKEND_SPI, PORT_INPUT, {})) { fake_spidev() = {}; }

  // The message of the refusal, or nothing when the range was taken.
  std::string set(const char *state, std::uint32_t lower, std::uint32_t upper,
                  int *code = nullptr) {
    Error error;
    if (io_port_set_supervised_range(port.get(), state, lower, upper, error.out())) {
      EXPECT_FALSE(error);
      return "";
    }
    EXPECT_TRUE(error);
    EXPECT_EQ(error.get()->domain, io_supervised_error_quark());
    if (code) {
      *code = error.get()->code;
    }
    return error.message();
  }

  IOPortRef port;
};

TEST_F(Ranges, AnEmptyRangeIsRefused) {
  int code = -1;
  EXPECT_EQ(set("open", 100, 100, &code), "Invalid range.");
  EXPECT_EQ(code, IO_SUPERVISED_ERROR_BAD_RANGE);
  EXPECT_EQ(set("open", 10, 5), "Invalid range.");
  EXPECT_TRUE(ranges_of(port).empty());
}

TEST_F(Ranges, ALevelOfAPortWithoutRangesCannotBeClassified) {
  const IOPortRef output = make_port(BACKEND_SPI, PORT_OUTPUT, {});
  io_port_restore_name(output.get(), "Siren", false);
  SupervisedRangeState state = SUPERVISED_STATE_OPEN;
  Error error;
  EXPECT_FALSE(supervised_classify_for_port(output.get(), 5, &state, error.out()));
  EXPECT_EQ(state, SUPERVISED_STATE_UNDEFINED);
  ASSERT_TRUE(error);
  EXPECT_EQ(error.get()->domain, io_supervised_error_quark());
  EXPECT_EQ(error.get()->code, IO_SUPERVISED_ERROR_NOT_SUPERVISED);
  EXPECT_STREQ(error.message(), "Failed to get ranges from port Siren");
}

TEST_F(Ranges, LimitsEndBelow65536) {
  EXPECT_EQ(set("open", 0, 65536), "Invalid range.");
  EXPECT_EQ(set("open", 65536, 70000), "Invalid range.");
  EXPECT_EQ(set("open", 0, 65535), "");
  EXPECT_EQ(ranges_of(port), (SupervisedRanges{{SUPERVISED_STATE_OPEN, 65535, 0}}));
}

TEST_F(Ranges, LimitsAreReadAsSignedNumbers) {
  constexpr auto minus_one = std::numeric_limits<std::uint32_t>::max();
  EXPECT_EQ(set("cut", minus_one, 5), "");
  EXPECT_EQ(ranges_of(port), (SupervisedRanges{{SUPERVISED_STATE_CUT, 5, minus_one}}));
  EXPECT_EQ(set("open", 5, minus_one), "Invalid range.");
}

TEST_F(Ranges, OnlyTheFourWordsNameAState) {
  int code = -1;
  for (const char *word : {"Open", "undefined", "", " open"}) {
    EXPECT_EQ(set(word, 1, 2, &code), "State is undefined.") << word;
    EXPECT_EQ(code, IO_SUPERVISED_ERROR_BAD_RANGE);
  }
  EXPECT_EQ(set(nullptr, 1, 2), "State is undefined.");
  EXPECT_TRUE(ranges_of(port).empty());
}

TEST_F(Ranges, TheLimitsAreJudgedBeforeTheState) {
  EXPECT_EQ(set("nothing", 2, 1), "Invalid range.");
}

TEST_F(Ranges, ANewRangeOfAStateTakesTheOldOnesPlaceAtTheEnd) {
  EXPECT_EQ(set("closed", 1, 2), "");
  EXPECT_EQ(set("open", 3, 4), "");
  EXPECT_EQ(set("closed", 5, 6), "");
  EXPECT_EQ(ranges_of(port),
            (SupervisedRanges{{SUPERVISED_STATE_OPEN, 4, 3}, {SUPERVISED_STATE_CLOSED, 6, 5}}));
}

TEST_F(Ranges, AnOutputHasNoRanges) {
  port = make_port(BACKEND_SPI, PORT_OUTPUT, {});
  int code = -1;
  EXPECT_EQ(set("open", 1, 2, &code), "Failed to get ranges from port.");
  EXPECT_EQ(code, IO_SUPERVISED_ERROR_GENERIC);
}

TEST_F(Ranges, NoRangesAreRefused) {
  EXPECT_EQ(set("open", 1, 2), "");
  Error error;
  EXPECT_FALSE(io_port_set_supervised_ranges(port.get(), {}, error.out()));
  EXPECT_TRUE(error.matches(io_supervised_error_quark(), IO_SUPERVISED_ERROR_BAD_RANGE));
  EXPECT_STREQ(error.message(), "Ranges is null.");
  EXPECT_EQ(ranges_of(port).size(), 1U);
}

TEST_F(Ranges, LimitsBelongToTheirRange) {
  const SupervisedRanges ranges = {{SUPERVISED_STATE_CLOSED, 200, 100}};
  EXPECT_EQ(supervised_classify(ranges, 99), SUPERVISED_STATE_UNDEFINED);
  EXPECT_EQ(supervised_classify(ranges, 100), SUPERVISED_STATE_CLOSED);
  EXPECT_EQ(supervised_classify(ranges, 200), SUPERVISED_STATE_CLOSED);
  EXPECT_EQ(supervised_classify(ranges, 201), SUPERVISED_STATE_UNDEFINED);
}

TEST_F(Ranges, TheLastOfOverlappingRangesDecides) {
  EXPECT_EQ(
      supervised_classify({{SUPERVISED_STATE_CUT, 200, 0}, {SUPERVISED_STATE_OPEN, 150, 50}}, 100),
      SUPERVISED_STATE_OPEN);
  EXPECT_EQ(
      supervised_classify({{SUPERVISED_STATE_OPEN, 150, 50}, {SUPERVISED_STATE_CUT, 200, 0}}, 100),
      SUPERVISED_STATE_CUT);
}

TEST_F(Ranges, StatesAreOfferedInTheOrderThatClientsKnow) {
  std::vector<const char *> states;
  EXPECT_TRUE(supervised_supported_states(port.get(), &states));
  EXPECT_EQ(Words(states.begin(), states.end()), (Words{"closed", "open", "short", "cut"}));
}

// Supervised inputs on a converter whose level the test sets: 0x100 is closed, 0x200 is short.
class Poll : public Ranges {
 protected:
  explicit Poll(int number = 1) {
    for (const int pin : {1, 2, 3}) {
      make_line(pin);
    }
    write("spidev", "");
    port = make_line_port(number);
    reports();
  }

  IOPortRef make_line_port(int number) {
    IOPortRef made = make_port(BACKEND_SPI, PORT_INPUT,
                               {{"input", "pin", "1"},
                                {"io_ctrl", "pin", "2"},
                                {"sio_ctrl", "pin", "3"},
                                {"device", "path", path("spidev")},
                                {"range", "state", "closed"},
                                {"range", "lower", "200"},
                                {"range", "upper", "300"},
                                {"range", "state", "short"},
                                {"range", "lower", "500"},
                                {"range", "upper", "600"}});
    io_port_set_number(made.get(), number);
    EXPECT_TRUE(io_port_setup(made.get()));
    return made;
  }

  static void set_level(unsigned int level) {
    fake_spidev().answer_sample(static_cast<int>(level));
  }

  void supervise() {
    io_port_restore_supervised(port.get(), true);
    io_port_set_watch(port.get());
  }
};

TEST_F(Poll, TheFirstTickReportsTheStateThatTheLineHasAlready) {
  set_level(0x100);
  supervise();
  EXPECT_EQ(timers(), (std::vector<guint>{kPoll}));
  expire(kPoll);
  EXPECT_EQ(reports(), (Words{"1 on"}));
}

TEST_F(Poll, OnlyChangesAreReported) {
  set_level(0x100);
  supervise();
  expire(kPoll);
  expire(kPoll);
  EXPECT_EQ(reports().size(), 1U);
  set_level(0x200);
  expire(kPoll);
  EXPECT_EQ(reports().size(), 1U);
}

TEST_F(Poll, ALevelInNoRangeIsNoNewsAtFirstAndAChangeLater) {
  set_level(0);
  supervise();
  expire(kPoll);
  EXPECT_EQ(reports(), Words{});
  set_level(0x100);
  expire(kPoll);
  set_level(0);
  expire(kPoll);
  EXPECT_EQ(reports().size(), 2U);
}

TEST_F(Poll, SwitchingItOnTwiceMakesOneTimer) {
  set_level(0x100);
  supervise();
  expire(kPoll);
  io_port_set_watch(port.get());
  expire(kPoll);
  EXPECT_EQ(timers().size(), 1U);
  EXPECT_EQ(reports().size(), 1U);
}

TEST_F(Poll, SwitchedOffAndOnTheStateIsReportedAnew) {
  set_level(0x100);
  supervise();
  expire(kPoll);
  reports();
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_EQ(timers(), std::vector<guint>{});
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  expire(kPoll);
  EXPECT_EQ(reports(), (Words{"1 on"}));
}

TEST_F(Poll, AFailedReadoutIsLoggedAndTheTimerStays) {
  set_level(0x100);
  supervise();
  expire(kPoll);
  reports();
  logged();
  fake_spidev().error = EIO;
  expire(kPoll);
  EXPECT_TRUE(was_logged("critical: Readout failed: Input/output error"));
  EXPECT_EQ(timers().size(), 1U);
  EXPECT_EQ(reports(), Words{});
}

TEST_F(Poll, APortThatIsFreedIsNoLongerPolled) {
  supervise();
  port.reset();
  EXPECT_EQ(timers(), std::vector<guint>{});
}

TEST_F(Poll, APortThatIsNotSetUpIsNotPolled) {
  port = make_port(BACKEND_SPI, PORT_INPUT, {{"input", "pin", "1"}});
  supervise();
  EXPECT_EQ(timers(), std::vector<guint>{});
}

// Numbers that a document can give. None may be taken for a place in a table.
class PollByNumber : public Poll, public testing::WithParamInterface<int> {
 protected:
  PollByNumber() : Poll(GetParam()) {}
};

TEST_P(PollByNumber, EveryPortIsPolledForItself) {
  set_level(0x100);
  supervise();
  const std::string changed = std::to_string(GetParam()) + " on";
  expire(kPoll);
  EXPECT_EQ(reports(), (Words{changed}));
  const IOPortRef namesake = make_line_port(GetParam());
  io_port_restore_supervised(namesake.get(), true);
  io_port_set_watch(namesake.get());
  expire(kPoll);
  expire(kPoll);
  EXPECT_EQ(reports(), (Words{changed}));
}

INSTANTIATE_TEST_SUITE_P(Numbers, PollByNumber,
                         testing::Values(0, 5, 6, 1000, -1, std::numeric_limits<int>::max(),
                                         std::numeric_limits<int>::min()));

}  // namespace
