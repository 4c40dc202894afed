// Lines that can't be had, and lines that go away.
#include <fcntl.h>
#include <linux/gpio.h>
#include <sys/ioctl.h>
#include <sys/stat.h>

#include <cerrno>

#include "base/unique-fd.h"
#include "support/device-test.h"

namespace {

constexpr int kBusyPercent = 10;
constexpr mode_t kAnybodyMayWrite = 0222;
constexpr mode_t kRootMayWrite = 0200;
constexpr int kIdleTime = 1000;  // milliseconds

enum Line { LINE_LOST, LINE_HELD };
enum Kept { KEPT_LINE };

// The line is somebody else's while this lives, as a driver's would be.
class HeldLine {
 public:
  HeldLine(const std::string &chip, unsigned int offset) {
    const UniqueFd device(open(("/dev/" + chip).c_str(), O_RDWR | O_CLOEXEC));
    gpio_v2_line_request request{};
    request.num_lines = 1;
    request.offsets[0] = offset;
    request.config.flags = GPIO_V2_LINE_FLAG_INPUT;
    EXPECT_EQ(ioctl(device.get(), GPIO_V2_GET_LINE_IOCTL, &request), 0) << chip;
    line_.reset(request.fd);
  }

 private:
  UniqueFd line_;
};

class GpioLost : public DeviceTest {
 protected:
  std::string lost_and_kept(bool optional) const {
    return port_element("lost", 0, "input", "gpio", "<input alias='lost'/>", optional) +
           port_element("kept", 1, "input", "gpio",
                        "<input pin='" + kept_.number_text(KEPT_LINE) + "'/>");
  }
  void expect_kept_works() {
    const bool level = !kept_.level(KEPT_LINE);
    kept_.pull(KEPT_LINE, level);
    EXPECT_TRUE(reports(1, level));
  }

  GpioSim sim_{"going", {"lost", "held"}};
  GpioSim kept_{"staying", {"kept"}};
};

TEST_F(GpioLost, ALineThatIsInUseIsLoggedAndTheOtherPortsWork) {
  const HeldLine held(sim_.chip(), LINE_HELD);
  start(port_element("busy", 0, "output", "gpio",
                     "<output pin='" + sim_.number_text(LINE_HELD) + "'/>") +
        port_element("kept", 1, "input", "gpio",
                     "<input pin='" + kept_.number_text(KEPT_LINE) + "'/>"));
  EXPECT_TRUE(Daemon::logged("Failed to allocate pin " + sim_.number_text(LINE_HELD) + "/(null)"));
  // Answered like any other, logged, and not a crash.
  EXPECT_EQ(client_.set_state(0, true), "");
  EXPECT_TRUE(Daemon::logged("Failed to set state on port!"));
  expect_kept_works();
}

TEST_F(GpioLost, ALineThatDoesNotExistIsLoggedAndTheOtherPortsWork) {
  start(port_element("none", 0, "input", "gpio", "<input alias='no-such-line'/>") +
        port_element("kept", 1, "input", "gpio",
                     "<input pin='" + kept_.number_text(KEPT_LINE) + "'/>"));
  EXPECT_TRUE(Daemon::logged("Failed to allocate pin 0/no-such-line"));
  EXPECT_TRUE(client_.state(0));  // a line that can't be read counts as active
  expect_kept_works();
}

TEST_F(GpioLost, ALineRemovedWhileWatchedCostsNothing) {
  sim_.pull(LINE_LOST, false);
  start(lost_and_kept(false));
  EXPECT_FALSE(client_.state(0));
  sim_.unplug();
  EXPECT_TRUE(wait_until([&] { return client_.state(0); }));
  EXPECT_LE(daemon_.load_percent(kIdleTime), kBusyPercent);
  expect_kept_works();
}

TEST_F(GpioLost, AnOutputRemovedWhileOnAnswersOn) {
  start(port_element("out", 0, "output", "gpio", "<output alias='lost'/>") +
        port_element("kept", 1, "input", "gpio",
                     "<input pin='" + kept_.number_text(KEPT_LINE) + "'/>"));
  EXPECT_EQ(client_.set_state(0, true), "");
  sim_.unplug();
  EXPECT_EQ(client_.set_state(0, false), "");
  EXPECT_TRUE(Daemon::logged("Failed to set state on port!"));
  expect_kept_works();
}

// To give a line back takes a right that the service account has only where the device grants it.
TEST_F(GpioLost, ADroppedPortGivesItsLineBackIfItMay) {
  start(lost_and_kept(true));
  EXPECT_EQ(chmod("/sys/class/gpio/unexport", kAnybodyMayWrite), 0);
  EXPECT_EQ(client_.drop("lost"), std::vector<std::string>{"lost"});
  EXPECT_EQ(chmod("/sys/class/gpio/unexport", kRootMayWrite), 0);
  const HeldLine held(sim_.chip(), LINE_LOST);
  expect_kept_works();
}

TEST_F(GpioLost, ADroppedPortThatMayNotGiveItsLineBackSaysSo) {
  start(lost_and_kept(true));
  EXPECT_EQ(client_.drop("lost"), std::vector<std::string>{"lost"});
  EXPECT_TRUE(Daemon::logged("Can't give GPIO " + sim_.number_text(LINE_LOST) +
                             " back with /sys/class/gpio/unexport: " + g_strerror(EACCES)));
  expect_kept_works();
}

}  // namespace
