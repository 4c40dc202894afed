// The control pins: exactly one of them is on while a port is an input, none while it is an output.
#include <algorithm>

#include "support/bench.h"
#include "support/fake-ioctl.h"

namespace {

constexpr int kInput = 1;
constexpr int kIoCtrl = 2;
constexpr int kSioCtrl = 3;
constexpr int kOutput = 4;

class Pins : public Bench {
 protected:
  Pins() {
    fake_spidev() = {};
    for (const int pin : {kInput, kIoCtrl, kSioCtrl, kOutput}) {
      make_line(pin);
    }
    write("spidev", "");
  }

  IOPortRef make(PortType type) {
    std::vector<Property> properties = {
        {"io_ctrl", "pin", "2"}, {"sio_ctrl", "pin", "3"}, {"device", "path", path("spidev")}};
    if (type != PORT_OUTPUT) {
      properties.push_back({"input", "pin", "1"});
    }
    if (type != PORT_INPUT) {
      properties.push_back({"output", "pin", "4"});
    }
    return make_port(BACKEND_SPI, type, properties);
  }

  // The two control pins as they are, io_ctrl first.
  std::string control() const {
    return std::string(line(kIoCtrl) ? "1" : "0") + (line(kSioCtrl) ? "1" : "0");
  }
};

TEST_F(Pins, AnInputStartsOnThePlainPath) {
  const IOPortRef port = make(PORT_INPUT);
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_EQ(control(), "10");
}

TEST_F(Pins, AnInputThatIsStoredAsSupervisedStartsOnTheMeasuredPath) {
  const IOPortRef port = make(PORT_INPUT);
  io_port_restore_supervised(port.get(), true);
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_EQ(control(), "01");
}

TEST_F(Pins, SupervisionSwitchesThePaths) {
  const IOPortRef port = make(PORT_INPUT);
  EXPECT_TRUE(io_port_setup(port.get()));
  for (int round = 0; round < 3; ++round) {
    EXPECT_TRUE(io_port_set_supervised(port.get(), true));
    EXPECT_EQ(control(), "01");
    EXPECT_TRUE(io_port_set_supervised(port.get(), false));
    EXPECT_EQ(control(), "10");
  }
}

TEST_F(Pins, AConfigurablePortAsOutputUsesNeitherPath) {
  const IOPortRef port = make(PORT_CONFIGURABLE);
  io_port_restore_direction(port.get(), false);
  io_port_restore_supervised(port.get(), true);
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_EQ(control(), "00");
}

TEST_F(Pins, DirectionChangesKeepTheRule) {
  const IOPortRef port = make(PORT_CONFIGURABLE);
  EXPECT_TRUE(io_port_setup(port.get()));
  for (const bool supervised : {false, true}) {
    io_port_set_supervised(port.get(), supervised);
    EXPECT_TRUE(io_port_set_direction(port.get(), false));
    EXPECT_EQ(control(), "00");
    EXPECT_TRUE(io_port_set_direction(port.get(), true));
    EXPECT_EQ(control(), supervised ? "01" : "10");
  }
}

TEST_F(Pins, SwitchingSupervisionOnMakesAnOutputAnInput) {
  const IOPortRef port = make(PORT_CONFIGURABLE);
  io_port_restore_direction(port.get(), false);
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_TRUE(io_port_input(port.get()));
  EXPECT_EQ(control(), "01");
  EXPECT_EQ(timers().size(), 1U);
}

TEST_F(Pins, AnOutputStartsInactiveAndIsLetGoOfAsAnInput) {
  const IOPortRef port = make(PORT_CONFIGURABLE);
  io_port_restore_activelow(port.get(), true, false);
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_TRUE(io_port_set_direction(port.get(), false));
  EXPECT_TRUE(line(kOutput));
  EXPECT_TRUE(io_port_set_direction(port.get(), true));
  EXPECT_FALSE(line(kOutput));
}

TEST_F(Pins, AnInputPathThatCannotBeLeftKeepsTheOtherOff) {
  const IOPortRef port = make(PORT_INPUT);
  EXPECT_TRUE(io_port_setup(port.get()));
  break_line(kIoCtrl);
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_TRUE(was_logged("critical: Failed to set ioctrl pin"));
  EXPECT_EQ(control(), "10");
}

TEST_F(Pins, AMeasuredPathThatCannotBeEnteredLeavesThePlainOne) {
  const IOPortRef port = make(PORT_INPUT);
  EXPECT_TRUE(io_port_setup(port.get()));
  break_line(kSioCtrl);
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_TRUE(was_logged("critical: Failed to set sioctrl pin"));
  EXPECT_EQ(control(), "10");
  mend_lines();
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_EQ(control(), "01");
}

TEST_F(Pins, AMeasuredPathThatCannotBeLeftIsNotJoinedByThePlainOne) {
  const IOPortRef port = make(PORT_INPUT);
  io_port_restore_supervised(port.get(), true);
  EXPECT_TRUE(io_port_setup(port.get()));
  break_line(kSioCtrl);
  EXPECT_TRUE(io_port_set_supervised(port.get(), false));
  EXPECT_EQ(control(), "01");
}

TEST_F(Pins, AnOutputIsTakenOffThePlainPathWhateverTheOtherDoes) {
  const IOPortRef port = make(PORT_CONFIGURABLE);
  EXPECT_TRUE(io_port_setup(port.get()));
  break_line(kSioCtrl);
  EXPECT_TRUE(io_port_set_direction(port.get(), false));
  EXPECT_TRUE(was_logged("critical: Failed to set sioctrl pin"));
  EXPECT_EQ(control(), "00");
}

TEST_F(Pins, AnOutputIsNotPutOnThePlainPathBecauseTheMeasuredOneCannotBeLeft) {
  const IOPortRef port = make(PORT_CONFIGURABLE);
  io_port_restore_supervised(port.get(), true);
  EXPECT_TRUE(io_port_setup(port.get()));
  break_line(kSioCtrl);
  EXPECT_TRUE(io_port_set_direction(port.get(), false));
  EXPECT_EQ(control(), "01");
}

TEST_F(Pins, AnInputThatIsMadeOfAnOutputGetsThePlainPathWhateverTheOtherDoes) {
  for (const bool supervised : {false, true}) {
    const IOPortRef port = make(PORT_CONFIGURABLE);
    io_port_restore_supervised(port.get(), supervised);
    io_port_restore_direction(port.get(), false);
    EXPECT_TRUE(io_port_setup(port.get()));
    break_line(kSioCtrl);
    EXPECT_TRUE(io_port_set_direction(port.get(), true));
    EXPECT_EQ(control(), "10") << supervised;
    mend_lines();
  }
}

TEST_F(Pins, AConfigurablePortNeedsBothPlainPins) {
  const IOPortRef port = make_port(BACKEND_SPI, PORT_CONFIGURABLE, {{"input", "pin", "1"}});
  EXPECT_FALSE(io_port_setup(port.get()));
  EXPECT_TRUE(
      was_logged("critical: Supervised IO port should have both 'input' and 'output' pins."));
}

TEST_F(Pins, AnInputNeedsExactlyOnePlainPin) {
  const char *message =
      "critical: Limited IO port should only have either 'input' or 'output' pin.";
  IOPortRef port =
      make_port(BACKEND_SPI, PORT_INPUT, {{"input", "pin", "1"}, {"output", "pin", "4"}});
  EXPECT_FALSE(io_port_setup(port.get()));
  EXPECT_TRUE(was_logged(message));
  logged();
  port = make_port(BACKEND_SPI, PORT_INPUT, {});
  EXPECT_FALSE(io_port_setup(port.get()));
  EXPECT_TRUE(was_logged(message));
}

TEST_F(Pins, AnInputWithoutTheMeasuredPathIsRefused) {
  const IOPortRef port =
      make_port(BACKEND_SPI, PORT_INPUT, {{"input", "pin", "1"}, {"io_ctrl", "pin", "2"}});
  EXPECT_FALSE(io_port_setup(port.get()));
  EXPECT_TRUE(was_logged("critical: Port line has no sio_ctrl pin"));
}

TEST_F(Pins, AnInputWithoutThePlainPathsSwitchWorks) {
  const IOPortRef port = make_port(
      BACKEND_SPI, PORT_INPUT,
      {{"input", "pin", "1"}, {"sio_ctrl", "pin", "3"}, {"device", "path", path("spidev")}});
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_TRUE(line(kSioCtrl));
}

TEST_F(Pins, AnOutputIsJustThat) {
  const IOPortRef port = make(PORT_OUTPUT);
  io_port_restore_activelow(port.get(), true, false);
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_EQ(read("class/gpio/gpio4/direction"), "high");
  EXPECT_FALSE(io_port_is_supervisable(port.get()));
  EXPECT_FALSE(io_port_set_supervised(port.get(), true));
  EXPECT_TRUE(io_port_set_state(port.get(), true));
  EXPECT_FALSE(line(kOutput));
  EXPECT_TRUE(fake_spidev().calls().empty());
  EXPECT_EQ(control(), "00");
}

TEST_F(Pins, AnOutputWithoutAPinIsRefusedAndHarmless) {
  const IOPortRef port = make_port(BACKEND_SPI, PORT_OUTPUT, {});
  EXPECT_FALSE(io_port_setup(port.get()));
  EXPECT_FALSE(io_port_set_state(port.get(), true));
  EXPECT_FALSE(io_port_get_state(port.get()));
}

TEST_F(Pins, AnInvertedPinIsActiveLow) {
  const IOPortRef port = make_port(BACKEND_SPI, PORT_INPUT,
                                   {{"input", "pin", "1"},
                                    {"input", "inverted", "true"},
                                    {"io_ctrl", "pin", "2"},
                                    {"io_ctrl", "inverted", "TRUE"},
                                    {"sio_ctrl", "pin", "3"},
                                    {"sio_ctrl", "inverted", "true"},
                                    {"device", "path", path("spidev")}});
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_EQ(read("class/gpio/gpio1/active_low").front(), '1');
  EXPECT_EQ(read("class/gpio/gpio2/active_low").front(), '0');
  EXPECT_EQ(read("class/gpio/gpio3/active_low").front(), '1');
}

TEST_F(Pins, APlainPinThatCannotBeHadDoesNotFailTheSetUp) {
  remove("class/gpio/gpio1");
  const IOPortRef port = make(PORT_INPUT);
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_TRUE(was_logged("critical: Failed to allocate pin 1/(null)"));
  EXPECT_TRUE(was_logged("warning: Port line has to do without its input pin 1: " +
                         std::string(g_strerror(ENOENT))));
  EXPECT_EQ(io_port_fault(port.get()), "input pin 1: " + std::string(g_strerror(ENOENT)));
  EXPECT_FALSE(io_port_get_state(port.get()));
  io_port_set_watch(port.get());
}

TEST_F(Pins, SupervisionOfAPortThatWasNotSetUpIsLoggedOnceUntilItIs) {
  const std::string message =
      "warning: Port line is supervised from now on, but its line is not measured: sio_ctrl pin "
      "3: " +
      std::string(g_strerror(ENOENT));
  remove("class/gpio/gpio3");
  const IOPortRef port = make(PORT_INPUT);
  EXPECT_FALSE(io_port_setup(port.get()));
  logged();
  for (const bool on : {true, false, true}) {
    EXPECT_TRUE(io_port_set_supervised(port.get(), on));
  }
  EXPECT_EQ(logged(), std::vector<std::string>{message});
  make_line(3);
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_TRUE(io_port_in_service(port.get()));
  io_port_drop(port.get());
  remove("class/gpio/gpio3");
  EXPECT_FALSE(io_port_setup(port.get()));
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_TRUE(was_logged(message));
}

TEST_F(Pins, AControlPinThatCannotBeDrivenIsNamedOnceUntilItCan) {
  const std::string message = "warning: Port line: its io_ctrl pin 2 can't be driven: ";
  const auto named = [&] {
    const auto lines = logged();
    return std::count_if(lines.begin(), lines.end(),
                         [&](const std::string &line) { return line.starts_with(message); });
  };
  const IOPortRef port = make(PORT_INPUT);
  EXPECT_TRUE(io_port_setup(port.get()));
  for (int round = 0; round < 2; ++round) {
    break_line(2);
    EXPECT_TRUE(io_port_set_supervised(port.get(), true));
    EXPECT_TRUE(io_port_set_supervised(port.get(), false));
    EXPECT_EQ(named(), 1);
    mend_lines();
    EXPECT_TRUE(io_port_set_supervised(port.get(), true));
    EXPECT_EQ(named(), 0);
  }
}

TEST_F(Pins, WhatADocumentForgetsIsTheReason) {
  const IOPortRef both = make_port(BACKEND_SPI, PORT_CONFIGURABLE, {{"input", "pin", "1"}});
  EXPECT_FALSE(io_port_setup(both.get()));
  EXPECT_EQ(io_port_fault(both.get()), "it needs both an input and an output pin");
  const IOPortRef one = make_port(BACKEND_SPI, PORT_INPUT, {});
  EXPECT_FALSE(io_port_setup(one.get()));
  EXPECT_EQ(io_port_fault(one.get()), "it needs either an input or an output pin");
  const IOPortRef control =
      make_port(BACKEND_SPI, PORT_INPUT, {{"input", "pin", "1"}, {"io_ctrl", "pin", "2"}});
  EXPECT_FALSE(io_port_setup(control.get()));
  EXPECT_EQ(io_port_fault(control.get()), "no sio_ctrl pin is described");
}

TEST_F(Pins, AMeasuredPathThatCannotBeHadFailsTheSetUp) {
  remove("class/gpio/gpio3");
  const IOPortRef port = make(PORT_INPUT);
  EXPECT_FALSE(io_port_setup(port.get()));
  EXPECT_TRUE(was_logged("critical: Request for gpio pin (null) failed."));
}

}  // namespace
