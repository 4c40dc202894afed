// What a bus keeps from getting here, and what may come of files and other interfaces.
#include "legacy/properties.h"

#include "base/glib-ptr.h"
#include "fixture.h"
#include "legacy/names.h"
#include "port/port-error.h"
#include "port/port-name.h"
#include "support/port-builder.h"

namespace {

using namespace std::string_view_literals;

class PropertiesTest : public LegacyTest {
 protected:
  // The value in GVariant's text form, or the message of the error.
  static std::string get(const std::string &path, const char *interface, const char *name,
                         Error &error) {
    const GVariantPtr value(iocontrol_conf_legacy_dbus_get_property(
        nullptr, nullptr, path.c_str(), interface, name, error.out(), nullptr));
    if (!value) {
      EXPECT_TRUE(error) << name;
      return error.message();
    }
    EXPECT_FALSE(error) << name;
    return GCharPtr(g_variant_print(value.get(), FALSE)).get();
  }

  static std::string get(int number, const char *interface, const char *name) {
    Error error;
    return get(legacy_object_path(number), interface, name, error);
  }

  // "" or the message of the error. Only what is refused is tried here: nothing is to be stored.
  static std::string set(int number, const char *interface, const char *name, GVariant *value) {
    const GVariantPtr owned(g_variant_ref_sink(value));
    Error error;
    const bool done = iocontrol_conf_legacy_dbus_set_property(
        nullptr, nullptr, legacy_object_path(number).c_str(), interface, name, value, error.out(),
        nullptr);
    EXPECT_NE(done, static_cast<bool>(error));
    if (error && !error.matches(io_control_error_quark(), IO_CONTROL_ERROR_NO_PORT)) {
      EXPECT_TRUE(error.matches(G_DBUS_ERROR, G_DBUS_ERROR_INVALID_ARGS));
    }
    return error ? error.message() : "";
  }

  static GVariant *bytes(std::string_view raw) {
    return g_variant_new_fixed_array(G_VARIANT_TYPE_BYTE, raw.data(), raw.size(), 1);
  }
  static GVariant *text(const char *content) { return g_variant_new_bytestring(content); }
};

TEST_F(PropertiesTest, counts_need_no_port) {
  EXPECT_EQ(get(7, kLegacyService, "NbrOfInputs"), "0");
  EXPECT_EQ(get(7, kLegacyService, "NbrOfOutputs"), "0");
  EXPECT_EQ(get(7, kLegacyService, "NbrOfIOPorts"), "No such port.");
}

TEST_F(PropertiesTest, only_a_path_of_our_own_has_a_port) {
  add_port(0, PORT_INPUT);
  const std::string base = kLegacyBasePath;
  for (const std::string &path :
       {base, base + "/", base + "/x", base + "/0/0", base + "0", base + "/-1", base + "/ 0",
        base + "/4294967296", std::string("/"), std::string("/0")}) {
    Error error;
    EXPECT_EQ(get(path, kLegacyInputInterface, "Trig", error), "No such port.") << path;
    EXPECT_TRUE(error.matches(io_control_error_quark(), IO_CONTROL_ERROR_NO_PORT));
  }
}

TEST_F(PropertiesTest, callers_that_want_no_error_get_none) {
  EXPECT_EQ(iocontrol_conf_legacy_dbus_get_property(nullptr, nullptr, "/", kLegacyService,
                                                    "Direction", nullptr, nullptr),
            nullptr);
}

TEST_F(PropertiesTest, unset_names_say_so) {
  add_port(0, PORT_CONFIGURABLE);
  EXPECT_EQ(get(0, kLegacyInputInterface, "Name"), "'<NULL>'");
  EXPECT_EQ(get(0, kLegacyOutputInterface, "Name"), "'<NULL>'");
}

TEST_F(PropertiesTest, other_interfaces_name_the_side_in_use) {
  IOPort *port = add_port(0, PORT_CONFIGURABLE);
  io_port_restore_name(port, "in", true);
  io_port_restore_name(port, "out", false);
  EXPECT_EQ(get(0, kLegacyService, "Name"), "'in'");
  io_port_restore_direction(port, false);
  EXPECT_EQ(get(0, kLegacyService, "Name"), "'out'");
  EXPECT_EQ(set(0, kLegacyService, "Name", text("x")), "Incorrect value for Name");
}

TEST_F(PropertiesTest, names_have_a_limit) {
  IOPort *port = add_port(0, PORT_INPUT);
  io_port_restore_name(port, "kept", true);
  const std::string long_name(kPortNameMaxBytes + 1, 'x');
  EXPECT_EQ(set(0, kLegacyInputInterface, "Name", text(long_name.c_str())),
            "Incorrect value for Name");
  EXPECT_EQ(input_name(port), "kept");
}

TEST_F(PropertiesTest, ports_that_are_not_the_devices_own_lack_a_direction) {
  PortBuilder().number(0).output().flag("ioport", "false").flag("virtual").registered();
  EXPECT_EQ(get(0, kLegacyService, "Direction"), "The port has no value for 'Direction'");
  EXPECT_EQ(get(0, kLegacyService, "Configurable"), "The port has no value for 'Configurable'");
  EXPECT_EQ(get(0, kLegacyService, "NbrOfIOPorts"), "0");
  EXPECT_EQ(get(0, kLegacyService, "Anything"), "The port has no value for 'Anything'");
}

TEST_F(PropertiesTest, values_that_are_none_have_the_empty_word) {
  io_port_set_button(add_port(0, PORT_OUTPUT), 17);
  EXPECT_EQ(get(0, kLegacyOutputInterface, "Button"), "''");
}

TEST_F(PropertiesTest, writes_without_a_port) {
  EXPECT_EQ(set(0, kLegacyInputInterface, "Name", text("x")), "No such port.");
}

TEST_F(PropertiesTest, values_of_other_types_change_nothing) {
  IOPort *port = add_port(0, PORT_CONFIGURABLE);
  io_port_restore_name(port, "kept", true);
  for (const char *name : {"Name", "Trig"}) {
    EXPECT_EQ(set(0, kLegacyInputInterface, name, g_variant_new_string("open")),
              std::string("Incorrect value for ") + name);
  }
  for (const char *name : {"Name", "Active", "Button", "Mode", "PulseTime", "DelayTime"}) {
    EXPECT_EQ(set(0, kLegacyOutputInterface, name, g_variant_new_uint32(1)),
              std::string("Incorrect value for ") + name);
  }
  EXPECT_EQ(set(0, kLegacyService, "Direction", g_variant_new_boolean(TRUE)), "Bad Direction ''");
  EXPECT_TRUE(log().took_warning("Undefined input: , for property: Direction"));
  EXPECT_EQ(input_name(port), "kept");
}

TEST_F(PropertiesTest, bytes_that_are_no_text_change_nothing) {
  IOPort *port = add_port(0, PORT_INPUT);
  io_port_restore_name(port, "kept", true);
  for (const std::string_view raw : {""sv, "bare"sv, "\xff\0"sv, "a\0b"sv}) {
    EXPECT_EQ(set(0, kLegacyInputInterface, "Name", bytes(raw)), "Incorrect value for Name");
    EXPECT_EQ(set(0, kLegacyService, "Direction", bytes(raw)), "Bad Direction ''");
    EXPECT_TRUE(log().took_warning("Undefined input: , for property: Direction"));
  }
  EXPECT_EQ(input_name(port), "kept");
}

TEST_F(PropertiesTest, output_sense_of_an_input) {
  add_port(0, PORT_INPUT);
  EXPECT_EQ(set(0, kLegacyOutputInterface, "Active", text("open")), "Setting Active failed");
}

TEST_F(PropertiesTest, properties_that_cannot_be_written) {
  add_port(0, PORT_INPUT);
  for (const char *name : {"NbrOfInputs", "NbrOfIOPorts", "Configurable", "Anything"}) {
    EXPECT_EQ(set(0, kLegacyService, name, g_variant_new_int32(1)),
              "Unsupported write of property '" + std::string(name) + "'");
  }
}

}  // namespace
