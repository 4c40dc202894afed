#include <gtest/gtest.h>

#include <cerrno>

#include "backends/libugpio-utils.h"
#include "fake-ugpio.h"
#include "support/log-capture.h"

namespace {

using Calls = std::vector<std::string>;

class GpioPinTest : public testing::Test {
 protected:
  GpioPinTest() { fake_ugpio().reset(); }
  ~GpioPinTest() override {
    pin.reset();
    EXPECT_EQ(fake_ugpio().requested, 0) << "lines were not given back";
  }

  void set(const char *key, const char *value) const {
    libugpio_set_gpio_pin_property(pin.get(), key, value);
  }

  LogCapture log;
  GpioPinPtr pin{new GpioPin};
};

TEST_F(GpioPinTest, APinIsRequestedByItsNumber) {
  set("pin", "12");
  EXPECT_TRUE(libugpio_request_gpio_pin(pin.get(), true, false));
  EXPECT_EQ(fake_ugpio().calls, (Calls{"request_one pin 12 0x14D", "activelow 12 0"}));
}

TEST_F(GpioPinTest, APinWithNumberAndAliasIsRequestedByTheAlias) {
  set("pin", "12");
  set("alias", "siren");
  EXPECT_TRUE(libugpio_request_gpio_pin(pin.get(), false, false));
  EXPECT_EQ(fake_ugpio().calls, (Calls{"request_one_named siren 0x40", "activelow siren 0"}));
}

TEST_F(GpioPinTest, TheFailureMessageHasNumberAndAlias) {
  set("pin", "12");
  set("alias", "siren");
  fake_ugpio().line("siren").request_error = EBUSY;
  EXPECT_FALSE(libugpio_request_gpio_pin(pin.get(), true, false));
  EXPECT_EQ(log.take_warnings(), Calls{"Failed to allocate pin 12/siren"});
  EXPECT_EQ(pin->handle, nullptr);
}

TEST_F(GpioPinTest, TheFailureMessageOfAPinWithoutAliasNamesNone) {
  set("pin", "12");
  fake_ugpio().line("12").request_error = EBUSY;
  EXPECT_FALSE(libugpio_request_gpio_pin(pin.get(), true, false));
  EXPECT_EQ(log.take_warnings(), Calls{"Failed to allocate pin 12/(null)"});
}

TEST_F(GpioPinTest, ARepeatedAliasReplacesTheEarlierOne) {
  set("alias", "siren");
  set("alias", "door");
  EXPECT_EQ(pin->alias, "door");
}

TEST_F(GpioPinTest, OnlyTrueInLowerCaseInverts) {
  for (const char *value : {"TRUE", "True", "yes", "1", "", " true", "false"}) {
    pin->inverted = 1;
    set("inverted", value);
    EXPECT_EQ(pin->inverted, 0) << value;
  }
  set("inverted", "true");
  EXPECT_EQ(pin->inverted, 1);
}

TEST_F(GpioPinTest, WhatIsNoNumberIsNumberZero) {
  pin->pin = 7;
  set("pin", "siren");
  EXPECT_EQ(pin->pin, 0);
}

TEST_F(GpioPinTest, NumbersAreDecimal) {
  set("pin", "010");
  EXPECT_EQ(pin->pin, 10);
  set("pin", "0x10");
  EXPECT_EQ(pin->pin, 0);
}

TEST_F(GpioPinTest, OtherKeysAreIgnored) {
  set("pins", "12");
  EXPECT_EQ(pin->pin, 0);
  EXPECT_TRUE(log.empty());
}

struct InitialLevel {
  const char *inverted;
  bool value;
  const char *request;
};

class GpioPinInitialLevelTest : public GpioPinTest,
                                public testing::WithParamInterface<InitialLevel> {};

TEST_P(GpioPinInitialLevelTest, AnOutputStartsAtThePhysicalLevelOfTheValue) {
  set("pin", "3");
  set("inverted", GetParam().inverted);
  EXPECT_TRUE(libugpio_request_gpio_pin(pin.get(), false, GetParam().value));
  EXPECT_EQ(fake_ugpio().calls.front(), GetParam().request);
}

INSTANTIATE_TEST_SUITE_P(All, GpioPinInitialLevelTest,
                         testing::Values(InitialLevel{"false", false, "request_one pin 3 0x40"},
                                         InitialLevel{"false", true, "request_one pin 3 0x42"},
                                         InitialLevel{"true", false, "request_one pin 3 0x42"},
                                         InitialLevel{"true", true, "request_one pin 3 0x40"}));

TEST_F(GpioPinTest, AnInvertedPinIsActiveLow) {
  set("pin", "3");
  set("inverted", "true");
  EXPECT_TRUE(libugpio_request_gpio_pin(pin.get(), true, false));
  EXPECT_EQ(fake_ugpio().calls.back(), "activelow 3 1");
}

TEST_F(GpioPinTest, ALineThatDoesNotOpenFailsTheRequest) {
  fake_ugpio().line("0").open_error = EACCES;
  EXPECT_FALSE(libugpio_request_gpio_pin(pin.get(), true, false));
  EXPECT_EQ(log.take_warnings(), Calls{"Failed to open pin fd!"});
  EXPECT_EQ(fake_ugpio().calls, Calls{"request_one pin 0 0x14D"});
}

TEST_F(GpioPinTest, ALineWhoseSenseCannotBeSetFailsTheRequest) {
  fake_ugpio().line("0").activelow_error = EPERM;
  EXPECT_FALSE(libugpio_request_gpio_pin(pin.get(), true, false));
  EXPECT_EQ(log.take_warnings(), Calls{"Failed set active low!"});
}

TEST_F(GpioPinTest, ASecondRequestGivesTheFirstLineBack) {
  EXPECT_TRUE(libugpio_request_gpio_pin(pin.get(), true, false));
  EXPECT_TRUE(libugpio_request_gpio_pin(pin.get(), true, false));
  EXPECT_EQ(fake_ugpio().requested, 1);
}

TEST_F(GpioPinTest, AClosedPinStaysAndCanBeRequestedAgain) {
  set("pin", "5");
  EXPECT_TRUE(libugpio_request_gpio_pin(pin.get(), false, false));
  libugpio_close_gpio_pin(pin.get());
  EXPECT_EQ(pin->handle, nullptr);
  EXPECT_EQ(fake_ugpio().requested, 0);
  EXPECT_TRUE(libugpio_request_gpio_pin(pin.get(), false, false));
}

TEST_F(GpioPinTest, ClosingAndFreeingNothingDoesNothing) {
  libugpio_close_gpio_pin(nullptr);
  libugpio_free_gpio_pin(nullptr);
  libugpio_close_gpio_pin(pin.get());
  EXPECT_TRUE(fake_ugpio().calls.empty());
}

TEST_F(GpioPinTest, SettingALineSaysNothing) {
  EXPECT_TRUE(libugpio_request_gpio_pin(pin.get(), false, false));
  EXPECT_TRUE(libugpio_set_gpio_pin(pin.get(), 1));
  EXPECT_EQ(fake_ugpio().line("0").value, 1);
  EXPECT_TRUE(log.empty());
}

TEST_F(GpioPinTest, AFailedSetNamesTheAliasAndTheReason) {
  set("alias", "door");
  EXPECT_TRUE(libugpio_request_gpio_pin(pin.get(), false, false));
  fake_ugpio().line("door").write_error = EIO;
  EXPECT_FALSE(libugpio_set_gpio_pin(pin.get(), 1));
  EXPECT_EQ(log.take_warnings(), Calls{"Failed to set gpio pin door: Input/output error"});
}

TEST_F(GpioPinTest, APinWithoutHandleFailsQuietlyInEveryOperation) {
  EXPECT_EQ(libugpio_get_gpio_pin(pin.get()), -1);
  EXPECT_EQ(errno, EINVAL);
  EXPECT_EQ(libugpio_write_gpio_pin(pin.get(), 1), -1);
  EXPECT_EQ(libugpio_gpio_pin_fd(pin.get()), -1);
  EXPECT_TRUE(log.empty());
  EXPECT_FALSE(libugpio_set_gpio_pin(pin.get(), 1));
  EXPECT_EQ(log.take_warnings(), Calls{"Failed to set gpio pin (null): Invalid argument"});
}

TEST_F(GpioPinTest, NoPinReadsAndWritesLikeOneWithoutHandle) {
  EXPECT_EQ(libugpio_get_gpio_pin(nullptr), -1);
  EXPECT_EQ(libugpio_write_gpio_pin(nullptr, 1), -1);
  EXPECT_EQ(libugpio_gpio_pin_fd(nullptr), -1);
}

TEST_F(GpioPinTest, SettingNoPinIsAProgrammingError) {
  EXPECT_DEATH(libugpio_set_gpio_pin(nullptr, 1), "assertion failed: \\(pin\\)");
}

TEST_F(GpioPinTest, PinsAreOrderedByNumber) {
  GpioPin low;
  low.pin = 3;
  GpioPin high;
  high.pin = 10;
  EXPECT_EQ(libugpio_compare_gpio_pin(&low, &high), -7);
  EXPECT_EQ(libugpio_compare_gpio_pin(&high, &low), 7);
  EXPECT_EQ(libugpio_compare_gpio_pin(&low, &low), 0);
}

}  // namespace
