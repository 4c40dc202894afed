// Ports on GPIO lines: each type of port, lines by number and by name, inverted or not.
#include "support/device-test.h"

namespace {

using Entries = std::vector<std::string>;

enum Line {
  LINE_INPUT,
  LINE_INVERTED,
  LINE_OUTPUT,
  LINE_INVERTED_OUTPUT,
  LINE_TERMINAL_IN,
  LINE_TERMINAL_OUT,
  LINE_TERMINAL_CTRL
};

class Gpio : public DeviceTest {
 protected:
  static std::string pin(const std::string &section, const std::string &attributes) {
    return "<" + section + " " + attributes + "/>";
  }
  std::string numbered(const std::string &section, int line, bool inverted = false) const {
    return pin(section,
               "pin='" + sim_.number_text(line) + "'" + (inverted ? " inverted='true'" : ""));
  }

  // Ports 0 and 1 are inputs, 2 and 3 outputs, the second of each inverted; 4 is configurable.
  std::string all_ports() const {
    return port_element("in", 0, "input", "gpio", numbered("input", LINE_INPUT)) +
           port_element("in-inverted", 1, "input", "gpio", numbered("input", LINE_INVERTED, true)) +
           port_element("out", 2, "output", "gpio", numbered("output", LINE_OUTPUT)) +
           port_element("out-inverted", 3, "output", "gpio",
                        numbered("output", LINE_INVERTED_OUTPUT, true)) +
           port_element("terminal", 4, "io_ctrl", "gpio",
                        numbered("input", LINE_TERMINAL_IN) +
                            numbered("output", LINE_TERMINAL_OUT) +
                            numbered("io_ctrl", LINE_TERMINAL_CTRL));
  }
  Entries terminal_history() const {
    return LineHistory::together(
        {{sim_.number(LINE_TERMINAL_OUT), "output"}, {sim_.number(LINE_TERMINAL_CTRL), "control"}});
  }

  GpioSim sim_{"lines", {"", "", "", "", "term-in", "term-out", "term-ctrl"}};
};

TEST_F(Gpio, AnInputFollowsItsLine) {
  sim_.pull(LINE_INPUT, false);
  start(all_ports());
  EXPECT_FALSE(client_.state(0));
  sim_.pull(LINE_INPUT, true);
  EXPECT_TRUE(reports(0, true));
  EXPECT_TRUE(client_.state(0));
  sim_.pull(LINE_INPUT, false);
  EXPECT_TRUE(reports(0, false));
  EXPECT_EQ(client_.count_changes(0), 2);
}

TEST_F(Gpio, AnInvertedInputIsActiveWhileTheLineIsLow) {
  sim_.pull(LINE_INVERTED, false);
  start(all_ports());
  EXPECT_TRUE(client_.state(1));
  sim_.pull(LINE_INVERTED, true);
  EXPECT_TRUE(reports(1, false));
  sim_.pull(LINE_INVERTED, false);
  EXPECT_TRUE(reports(1, true));
}

TEST_F(Gpio, TheUsersActiveLevelComesOnTopOfTheLines) {
  sim_.pull(LINE_INVERTED, false);
  start(all_ports());
  EXPECT_EQ(client_.set_activelow(1, true, true), "");
  EXPECT_TRUE(reports(1, false));
  sim_.pull(LINE_INVERTED, true);
  EXPECT_TRUE(reports(1, true));
}

TEST_F(Gpio, AnOutputDrivesItsLine) {
  start(all_ports());
  EXPECT_FALSE(sim_.level(LINE_OUTPUT));
  EXPECT_EQ(client_.set_state(2, true), "");
  EXPECT_TRUE(sim_.level(LINE_OUTPUT));
  EXPECT_TRUE(reports(2, true));
  EXPECT_EQ(client_.set_state(2, false), "");
  EXPECT_FALSE(sim_.level(LINE_OUTPUT));
  EXPECT_TRUE(reports(2, false));
}

TEST_F(Gpio, AnInvertedOutputIsActiveLow) {
  start(all_ports());
  EXPECT_TRUE(sim_.level(LINE_INVERTED_OUTPUT));
  EXPECT_EQ(client_.set_state(3, true), "");
  EXPECT_FALSE(sim_.level(LINE_INVERTED_OUTPUT));
  EXPECT_TRUE(client_.state(3));
}

TEST_F(Gpio, LinesAreFoundByTheirNames) {
  // The numbers are those of other lines, and must not count.
  const std::string wrong = "' pin='" + sim_.number_text(LINE_INPUT) + "'";
  sim_.pull(LINE_TERMINAL_IN, true);
  start(port_element("in", 0, "input", "gpio", pin("input", "alias='term-in" + wrong)) +
        port_element("out", 1, "output", "gpio", pin("output", "alias='term-out" + wrong)));
  EXPECT_TRUE(client_.state(0));
  sim_.pull(LINE_TERMINAL_IN, false);
  EXPECT_TRUE(reports(0, false));
  EXPECT_EQ(client_.set_state(1, true), "");
  EXPECT_TRUE(sim_.level(LINE_TERMINAL_OUT));
}

TEST_F(Gpio, AConfigurablePortSwitchesItsTerminal) {
  sim_.pull(LINE_TERMINAL_IN, true);
  start(all_ports());
  EXPECT_FALSE(sim_.level(LINE_TERMINAL_CTRL));
  EXPECT_TRUE(client_.state(4));

  EXPECT_EQ(client_.set_direction(4, "output"), "");
  EXPECT_TRUE(sim_.level(LINE_TERMINAL_CTRL));
  EXPECT_FALSE(sim_.level(LINE_TERMINAL_OUT));
  EXPECT_EQ(client_.set_state(4, true), "");
  EXPECT_TRUE(sim_.level(LINE_TERMINAL_OUT));

  EXPECT_EQ(client_.set_direction(4, "input"), "");
  EXPECT_FALSE(sim_.level(LINE_TERMINAL_CTRL));
  EXPECT_FALSE(sim_.level(LINE_TERMINAL_OUT));
  client_.forget_changes();
  sim_.pull(LINE_TERMINAL_IN, false);
  EXPECT_TRUE(reports(4, false));
}

// The terminal must never be driven while the port is an input, not for a moment.
TEST_F(Gpio, ATerminalThatBecomesAnInputIsLetGoOfFirst) {
  start(all_ports());
  EXPECT_EQ(client_.set_direction(4, "output"), "");
  EXPECT_EQ(client_.set_state(4, true), "");
  const LineHistory history;
  EXPECT_EQ(client_.set_direction(4, "input"), "");
  EXPECT_EQ(terminal_history(), (Entries{"output set 0", "control set 0"}));
}

TEST_F(Gpio, ATerminalThatBecomesAnOutputIsSwitchedBeforeItIsDriven) {
  start(all_ports());
  const LineHistory history;
  EXPECT_EQ(client_.set_direction(4, "output"), "");
  EXPECT_EQ(client_.set_state(4, true), "");
  EXPECT_EQ(terminal_history(), (Entries{"control set 1", "output set 0", "output set 1"}));
}

TEST_F(Gpio, ADirectionSurvivesARestart) {
  start(all_ports());
  EXPECT_EQ(client_.set_direction(4, "output"), "");
  restart();
  EXPECT_TRUE(sim_.level(LINE_TERMINAL_CTRL));
  EXPECT_EQ(client_.set_state(4, true), "");
  EXPECT_TRUE(sim_.level(LINE_TERMINAL_OUT));
}

TEST_F(Gpio, AnActionSequenceShowsOnTheLine) {
  start(all_ports());
  const LineHistory history;
  EXPECT_EQ(client_.start_sequence(2, {{true, 50}, {false, 50}, {true, 50}, {false, 0}}), "");
  EXPECT_TRUE(wait_until([&] { return client_.sequences_done() == 1; }));
  EXPECT_EQ(LineHistory::of(sim_.number(LINE_OUTPUT)),
            (Entries{"set 1", "set 0", "set 1", "set 0"}));
}

// --- What a lock or a siren on an output would feel ---

TEST_F(Gpio, SettingUpAnOutputDoesNotGlitch) {
  const LineHistory history;
  start(all_ports());
  EXPECT_EQ(LineHistory::of(sim_.number(LINE_OUTPUT)), (Entries{"set 0", "out"}));
}

TEST_F(Gpio, SettingUpAnInvertedOutputDoesNotGlitch) {
  const LineHistory history;
  start(all_ports());
  EXPECT_EQ(LineHistory::of(sim_.number(LINE_INVERTED_OUTPUT)), (Entries{"set 1", "out"}));
}

TEST_F(Gpio, SettingUpAnOutputThatTheUserMadeActiveLowDoesNotGlitch) {
  start(all_ports());
  EXPECT_EQ(client_.set_activelow(2, false, true), "");
  EXPECT_TRUE(sim_.level(LINE_OUTPUT));
  const LineHistory history;
  restart();
  EXPECT_FALSE(client_.state(2));
  EXPECT_EQ(LineHistory::of(sim_.number(LINE_OUTPUT)), (Entries{"set 1", "out"}));
}

TEST_F(Gpio, AKilledDaemonLeavesAnOutputOnAndTheNextTurnsItOffOnce) {
  start(all_ports());
  EXPECT_EQ(client_.set_state(2, true), "");
  EXPECT_EQ(client_.set_state(3, true), "");
  daemon_.kill_hard();
  EXPECT_TRUE(sim_.level(LINE_OUTPUT));
  EXPECT_FALSE(sim_.level(LINE_INVERTED_OUTPUT));

  const LineHistory history;
  daemon_.start();
  EXPECT_EQ(LineHistory::of(sim_.number(LINE_OUTPUT)), (Entries{"set 0", "out"}));
  EXPECT_EQ(LineHistory::of(sim_.number(LINE_INVERTED_OUTPUT)), (Entries{"set 1", "out"}));
  EXPECT_EQ(client_.set_state(2, true), "");
  EXPECT_TRUE(sim_.level(LINE_OUTPUT));
}

TEST_F(Gpio, ARestartTurnsOutputsOff) {
  start(all_ports());
  EXPECT_EQ(client_.set_state(2, true), "");
  restart();
  EXPECT_FALSE(client_.state(2));
  EXPECT_FALSE(sim_.level(LINE_OUTPUT));
}

}  // namespace
