// The converter on the SPI bus: its set-up, its readouts, and what is left of it afterwards.
#include <filesystem>

#include "base/glib-ptr.h"
#include "port/ioport-private.h"
#include "port/port-error.h"
#include "support/bench.h"
#include "support/fake-ioctl.h"

namespace {

using Words = std::vector<std::string>;

class Spi : public Bench {
 protected:
  Spi() {
    fake_spidev() = {};
    for (const int pin : {1, 2, 3, 4}) {
      make_line(pin);
    }
    write("spidev", "");
  }

  IOPortRef make(const std::vector<Property> &more = {}) {
    std::vector<Property> properties = {{"input", "pin", "1"},
                                        {"io_ctrl", "pin", "2"},
                                        {"sio_ctrl", "pin", "3"},
                                        {"device", "path", path("spidev")}};
    properties.insert(properties.end(), more.begin(), more.end());
    return make_port(BACKEND_SPI, PORT_INPUT, properties);
  }

  // Descriptors of the process that lead to the converter.
  std::size_t open_devices() const {
    std::size_t count = 0;
    for (const auto &entry : std::filesystem::directory_iterator("/proc/self/fd")) {
      std::error_code error;
      if (std::filesystem::read_symlink(entry, error) == path("spidev")) {
        ++count;
      }
    }
    return count;
  }
};

TEST_F(Spi, WithoutASpeedOnlyTheWordSizeIsSet) {
  EXPECT_TRUE(io_port_setup(make().get()));
  EXPECT_EQ(fake_spidev().calls(), (Words{"bits 8"}));
  fake_spidev() = {};
  EXPECT_TRUE(io_port_setup(make({{"speed", "value", "0"}}).get()));
  EXPECT_EQ(fake_spidev().calls(), (Words{"bits 8"}));
}

TEST_F(Spi, ASpeedMayBeDecimalHexadecimalOrOctal) {
  for (const auto &[text, call] : {std::pair{"1000000", "speed 1000000"},
                                   std::pair{"0x10", "speed 16"}, std::pair{"010", "speed 8"}}) {
    fake_spidev() = {};
    EXPECT_TRUE(io_port_setup(make({{"speed", "value", text}}).get()));
    EXPECT_EQ(fake_spidev().calls(), (Words{"bits 8", call}));
  }
}

TEST_F(Spi, AReadoutSendsTheAddressAndReadsTwelveBits) {
  const IOPortRef port = make({{"address", "value", "1f"},
                               {"range", "state", "cut"},
                               {"range", "lower", "2748"},
                               {"range", "upper", "2749"}});
  EXPECT_TRUE(io_port_setup(port.get()));
  fake_spidev() = {};
  fake_spidev().answer[0] = 0xAB;
  fake_spidev().answer[1] = 0xCD;
  EXPECT_EQ(readout(port), "cut 2748");
  EXPECT_EQ(fake_spidev().calls(), (Words{"send 1f 0, receive 2"}));
}

TEST_F(Spi, AnAddressMayHaveAnyKey) {
  const IOPortRef port = make({{"address", "whatever", "2a"}});
  EXPECT_TRUE(io_port_setup(port.get()));
  fake_spidev() = {};
  EXPECT_EQ(readout(port), "undefined 0");
  EXPECT_EQ(fake_spidev().calls(), (Words{"send 2a 0, receive 2"}));
}

TEST_F(Spi, OneFailedTransferCostsTheDevice) {
  const IOPortRef port = make();
  EXPECT_TRUE(io_port_setup(port.get()));
  fake_spidev().error = EIO;
  EXPECT_EQ(readout(port), "error 0: Input/output error");
  EXPECT_TRUE(was_logged("critical: Error: Input/output error"));
  EXPECT_EQ(open_devices(), 0U);
  fake_spidev().error = 0;
  EXPECT_EQ(readout(port), "error 0: Bad file descriptor");
  EXPECT_EQ(io_port_get_supervised_state(port.get()), SUPERVISED_STATE_UNDEFINED);
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_EQ(readout(port), "undefined 0");
}

TEST_F(Spi, ADeviceThatCannotBeOpenedFailsTheSetUp) {
  remove("spidev");
  EXPECT_FALSE(io_port_setup(make().get()));
  EXPECT_TRUE(was_logged("critical: Failed to open SPI device."));
  EXPECT_TRUE(was_logged("critical: Failed to open spi device."));
}

TEST_F(Spi, ADeviceThatRefusesItsSettingsFailsTheSetUp) {
  fake_spidev().bits_error = EINVAL;
  EXPECT_FALSE(io_port_setup(make().get()));
  EXPECT_TRUE(was_logged("critical: Failed to set bits per word."));
  fake_spidev() = {};
  fake_spidev().speed_error = EINVAL;
  EXPECT_FALSE(io_port_setup(make({{"speed", "value", "5"}}).get()));
  EXPECT_TRUE(was_logged("critical: Failed to set max speed."));
  EXPECT_TRUE(was_logged("critical: Failed to open spi device."));
}

TEST_F(Spi, APortWithoutADeviceIsRefused) {
  const IOPortRef port =
      make_port(BACKEND_SPI, PORT_INPUT, {{"input", "pin", "1"}, {"sio_ctrl", "pin", "3"}});
  EXPECT_FALSE(io_port_setup(port.get()));
  EXPECT_EQ(readout(port), "error 0: Bad file descriptor");
  EXPECT_TRUE(io_port_set_supervised(port.get(), true));
  EXPECT_EQ(timers(), std::vector<guint>{});
}

TEST_F(Spi, TheUpperLimitCompletesARange) {
  EXPECT_EQ(ranges_of(make(
                {{"range", "lower", "7"}, {"range", "state", "short"}, {"range", "upper", "9"}})),
            (SupervisedRanges{{SUPERVISED_STATE_SHORT, 9, 7}}));
}

TEST_F(Spi, AnUpperLimitBeforeTheStateIsARangeWithoutOne) {
  const IOPortRef port = make({{"range", "upper", "9"}});
  EXPECT_TRUE(was_logged("critical: Failed to configure port: State is undefined.\n"));
  EXPECT_TRUE(ranges_of(port).empty());
  io_port_set_backend_property(port.get(), "range", "state", "open");
  io_port_set_backend_property(port.get(), "range", "upper", "3");
  EXPECT_EQ(ranges_of(port), (SupervisedRanges{{SUPERVISED_STATE_OPEN, 3, 0}}));
}

TEST_F(Spi, UnknownAttributesAreIgnored) {
  const IOPortRef port = make({{"device", "paths", "/nowhere"},
                               {"backend", "colour", "red"},
                               {"address", "value", "no number"},
                               {"range", "middle", "5"}});
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_TRUE(ranges_of(port).empty());
}

TEST_F(Spi, ADroppedPortClosesItsDeviceAndComesBackAgainAndAgain) {
  const IOPortRef port =
      make({{"range", "state", "open"}, {"range", "lower", "1"}, {"range", "upper", "9"}});
  EXPECT_TRUE(io_port_set_supervised_range(port.get(), "open", 20, 30, nullptr));
  io_port_restore_supervised(port.get(), true);
  fake_spidev().answer[1] = 0x80;
  for (int round = 0; round < 50; ++round) {
    ASSERT_TRUE(io_port_setup(port.get()));
    ASSERT_EQ(open_devices(), 1U);
    ASSERT_EQ(readout(port), "undefined 8");
    io_port_set_watch(port.get());
    ASSERT_EQ(timers().size(), 1U);
    io_port_drop(port.get());
    ASSERT_EQ(timers().size(), 0U);
    ASSERT_EQ(open_devices(), 0U);
  }
  EXPECT_EQ(io_port_range_list(port.get()), (SupervisedRanges{{SUPERVISED_STATE_OPEN, 30, 20}}));
}

TEST_F(Spi, TheControlPinsOfAnOutputAreAProgrammingError) {
  expect_control_pins_die_for_an_output(make(), "supervised-spi-backend.*spi_set_control_pins");
}

}  // namespace
