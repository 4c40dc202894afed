// Edges, many and fast: whatever the line does, the state that is reported last is the one it is
// left in, and a line at rest costs nothing.
#include "support/device-test.h"

namespace {

constexpr int kInputs = 4;
constexpr int kIdlePercent = 5;
constexpr int kIdleTime = 1000;  // milliseconds

class GpioEdges : public DeviceTest {
 protected:
  void SetUp() override {
    std::string ports;
    for (int i = 0; i < kInputs; ++i) {
      sim_.pull(i, false);
      ports += port_element("in" + std::to_string(i), i, "input", "gpio",
                            "<input pin='" + sim_.number_text(i) + "'/>");
    }
    start(ports);
  }

  void toggle(int line) { sim_.pull(line, levels_[line] = !levels_[line]); }

  // The daemon's last word on each port that moved, and its answer, are the line's level.
  void expect_one_report() {
    for (int i = 0; i < kInputs; ++i) {
      if (client_.count_changes(i) > 0) {
        EXPECT_TRUE(reports(i, levels_[i]));
      }
      EXPECT_EQ(client_.state(i), levels_[i]) << "line " << i;
    }
  }

  GpioSim sim_{"edges", {"", "", "", ""}};
  bool levels_[kInputs] = {};
};

TEST_F(GpioEdges, EveryOneOfManySlowEdgesIsReported) {
  constexpr int edges = 200;
  for (int i = 1; i <= edges; ++i) {
    toggle(0);
    ASSERT_TRUE(wait_until([&] { return client_.count_changes(0) >= i; })) << "edge " << i;
    EXPECT_EQ(client_.last_reported(0), levels_[0] ? 1 : 0);
  }
  EXPECT_EQ(client_.count_changes(0), edges);
}

// Odd and even bursts: the line ends on the other level or on the same one.
TEST_F(GpioEdges, BurstsEndInTheLinesLevel) {
  constexpr int bursts = 60;
  for (int burst = 1; burst <= bursts; ++burst) {
    const bool before = levels_[1];
    for (int edge = 0; edge < burst % 13; ++edge) {
      toggle(1);
    }
    if (levels_[1] != before) {
      ASSERT_TRUE(reports(1, levels_[1])) << "burst " << burst;
    }
    ASSERT_EQ(client_.state(1), levels_[1]) << "burst " << burst;
  }
  EXPECT_TRUE(reports(1, levels_[1]));
}

TEST_F(GpioEdges, BurstsOnSeveralLinesAtOnce) {
  constexpr int edges = 403;  // every line ends on the other level than it began on
  for (int edge = 0; edge < edges; ++edge) {
    for (int line = 0; line < kInputs; ++line) {
      toggle(line);
    }
  }
  for (int line = 0; line < kInputs; ++line) {
    EXPECT_TRUE(reports(line, true)) << "line " << line;
  }
  expect_one_report();
}

// A client's question reads the line as well and so takes the edge away from the watch.
TEST_F(GpioEdges, AskingForTheStateHidesNoEdge) {
  constexpr int edges = 100;
  for (int i = 1; i <= edges; ++i) {
    toggle(2);
    EXPECT_EQ(client_.state(2), levels_[2]);
    ASSERT_TRUE(reports(2, levels_[2])) << "edge " << i;
  }
}

TEST_F(GpioEdges, RestCostsNothing) {
  for (int i = 0; i < 50; ++i) {
    toggle(3);
  }
  expect_one_report();
  EXPECT_LE(daemon_.load_percent(kIdleTime), kIdlePercent);
}

}  // namespace
