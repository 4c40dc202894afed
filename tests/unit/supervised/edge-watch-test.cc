// The plain pin of a port that is not supervised: its level and its edges.
#include <glib-unix.h>

#include "support/bench.h"
#include "support/fake-ioctl.h"

namespace {

using Words = std::vector<std::string>;

constexpr guint kRetry = 1000;

class EdgeWatch : public Bench {
 protected:
  EdgeWatch() {
    fake_spidev() = {};
    for (const int pin : {1, 2, 3}) {
      make_line(pin);
    }
    write("spidev", "");
    port = make_port(BACKEND_SPI, PORT_INPUT,
                     {{"input", "pin", "1"},
                      {"io_ctrl", "pin", "2"},
                      {"sio_ctrl", "pin", "3"},
                      {"device", "path", path("spidev")}});
    EXPECT_TRUE(io_port_setup(port.get()));
    io_port_set_watch(port.get());
  }

  IOPortRef port;
};

TEST_F(EdgeWatch, ReadsThePin) {
  EXPECT_FALSE(io_port_get_state(port.get()));
  set_line(1, true);
  EXPECT_TRUE(io_port_get_state(port.get()));
}

TEST_F(EdgeWatch, APinThatCannotBeReadCountsAsInactive) {
  set_line(1, true);
  break_line(1);
  EXPECT_FALSE(io_port_get_state(port.get()));
}

// A file signals no edges, so the change is found by the question of a client.
TEST_F(EdgeWatch, AChangeThatAClientFindsFirstIsReported) {
  set_line(1, true);
  EXPECT_TRUE(io_port_get_state(port.get()));
  EXPECT_EQ(reports(), Words{});
  iterate();
  EXPECT_EQ(reports(), (Words{"1 on"}));
  EXPECT_TRUE(io_port_get_state(port.get()));
  iterate();
  EXPECT_EQ(reports(), Words{});
}

TEST_F(EdgeWatch, NothingIsReportedWhileThePortIsSupervised) {
  EXPECT_FALSE(io_port_get_state(port.get()));
  io_port_set_supervised(port.get(), true);
  set_line(1, true);
  EXPECT_TRUE(io_port_get_state(port.get()));
  iterate();
  EXPECT_EQ(reports(), Words{});
}

TEST_F(EdgeWatch, APinThatBreaksBeforeItsChangeIsReportedIsLookedAtUntilItWorks) {
  set_line(1, true);
  EXPECT_TRUE(io_port_get_state(port.get()));
  break_line(1);
  iterate();
  EXPECT_EQ(reports(), Words{});
  EXPECT_EQ(timers(), (std::vector<guint>{kRetry}));
  expire(kRetry);
  EXPECT_EQ(timers(), (std::vector<guint>{kRetry}));
  mend_lines();
  expire(kRetry);
  EXPECT_EQ(timers(), std::vector<guint>{});
  EXPECT_EQ(reports(), (Words{"1 on"}));
}

}  // namespace
