#include "dbus/error-domain.h"

#include <gtest/gtest.h>

#include <string>

#include "base/glib-ptr.h"
#include "port/port-error.h"

namespace {

// The name that an error of the code travels under.
std::string name_of(GQuark domain, int code) {
  const std::unique_ptr<GError, GlibDeleter<g_error_free>> error(
      g_error_new_literal(domain, code, "text"));
  const GCharPtr name(g_dbus_error_encode_gerror(error.get()));
  return name.get();
}

class ErrorDomains : public testing::Test {
 protected:
  ErrorDomains() { io_error_domains_register(); }
};

TEST_F(ErrorDomains, ControlErrorsTravelUnderTheirNames) {
  const GQuark control = io_control_error_quark();
  EXPECT_EQ(name_of(control, 0), "com.kelv.IOControl.Error.Generic");
  EXPECT_EQ(name_of(control, 1), "com.kelv.IOControl.Error.No_port");
  EXPECT_EQ(name_of(control, 2), "com.kelv.IOControl.Error.Busy");
  EXPECT_EQ(name_of(control, 3), "com.kelv.IOControl.Error.Not_output");
  EXPECT_EQ(name_of(control, 4), "com.kelv.IOControl.Error.Not_input");
  EXPECT_EQ(name_of(control, 5), "com.kelv.IOControl.Error.Not_configurable");
  EXPECT_EQ(name_of(control, 6), "com.kelv.IOControl.Error.Incorrect_Port_Type");
}

TEST_F(ErrorDomains, SupervisedErrorsTravelUnderTheirNames) {
  const GQuark supervised = io_supervised_error_quark();
  EXPECT_EQ(name_of(supervised, 0), "com.kelv.IOSupervised.Error.Generic");
  EXPECT_EQ(name_of(supervised, 1), "com.kelv.IOSupervised.Error.No_port");
  EXPECT_EQ(name_of(supervised, 2), "com.kelv.IOSupervised.Not_supervisable");
  EXPECT_EQ(name_of(supervised, 3), "com.kelv.IOSupervised.Not_supervised");
  EXPECT_EQ(name_of(supervised, 4), "com.kelv.IOSupervised.Bad_supervised_range");
}

TEST_F(ErrorDomains, KeepTheirQuarkNames) {
  EXPECT_STREQ(g_quark_to_string(io_control_error_quark()), "io-control-error-quark");
  EXPECT_STREQ(g_quark_to_string(io_supervised_error_quark()), "io-supervised-error-quark");
}

TEST_F(ErrorDomains, AreReadBackByAClientThatKnowsThem) {
  const std::unique_ptr<GError, GlibDeleter<g_error_free>> error(
      g_dbus_error_new_for_dbus_error("com.kelv.IOControl.Error.Busy", "The port is busy."));
  EXPECT_TRUE(g_error_matches(error.get(), io_control_error_quark(), IO_CONTROL_ERROR_BUSY));
}

TEST_F(ErrorDomains, MayBeRegisteredAgain) {
  io_error_domains_register();
  EXPECT_EQ(name_of(io_control_error_quark(), 2), "com.kelv.IOControl.Error.Busy");
}

}  // namespace
