#include <sys/stat.h>
#include <unistd.h>

#include <optional>

#include "base/glib-ptr.h"
#include "fixture.h"
#include "port/port-error.h"
#include "settings/param-legacy.h"

namespace {

class ImportTest : public LegacyTest {
 protected:
  // The message of the error that reached the caller.
  std::string import(const std::string &contents) {
    Error error;
    param_import_parhand(write_file("export.conf", contents).c_str(), error.out());
    if (error) {
      EXPECT_TRUE(error.matches(io_control_error_quark(), IO_CONTROL_ERROR_GENERIC));
    }
    return error ? error.message() : "";
  }

  IOPort *input_ = add_port(0, PORT_INPUT);
  IOPort *output_ = add_port(1, PORT_OUTPUT);
  IOPort *both_ = add_port(2, PORT_CONFIGURABLE);
};

TEST_F(ImportTest, file_that_is_not_there) {
  Error error;
  param_import_parhand(path_of("none").c_str(), error.out());
  EXPECT_FALSE(error);
  EXPECT_TRUE(log().took_warning("Unable to read from parhand file"));
  EXPECT_TRUE(log().empty());
}

TEST_F(ImportTest, file_that_is_no_key_file) {
  EXPECT_EQ(import("Name=without a group\n"), "");
  EXPECT_TRUE(log().empty());
}

TEST_F(ImportTest, empty_file) {
  EXPECT_EQ(import(""), "");
}

TEST_F(ImportTest, every_parameter) {
  EXPECT_EQ(import("[IOPort.I2]\nDirection=output\n"
                   "[IOPort.I2.Input]\nName=Gate\nTrig=open\n"
                   "[IOPort.I2.Output]\nName=Lock\nActive=open\nButton=actinact\nPulseTime=1500\n"
                   "DelayTime=20\nMode=monostable\n"),
            "");
  EXPECT_FALSE(io_port_direction_input(both_));
  EXPECT_EQ(input_name(both_), "Gate");
  EXPECT_TRUE(io_port_get_activelow(both_, true));
  EXPECT_EQ(output_name(both_), "Lock");
  EXPECT_TRUE(io_port_get_activelow(both_, false));
  EXPECT_EQ(io_port_get_button(both_), BUTTON_ACTINACT);
  EXPECT_EQ(io_port_get_pulse_time(both_), 1500U);
  EXPECT_EQ(io_port_get_delay_time(both_), 20);
  EXPECT_EQ(io_port_get_mode(both_), PORT_MODE_MONOSTABLE);
}

TEST_F(ImportTest, senses_are_of_their_own_side) {
  io_port_restore_activelow(both_, true, false);
  EXPECT_EQ(import("[IOPort.I2.Input]\nTrig=open\n[IOPort.I2.Output]\nActive=closed\n"), "");
  EXPECT_TRUE(io_port_get_activelow(both_, true));
  EXPECT_FALSE(io_port_get_activelow(both_, false));
  EXPECT_EQ(import("[IOPort.I2.Input]\nTrig=closed\n[IOPort.I2.Output]\nActive=open\n"), "");
  EXPECT_FALSE(io_port_get_activelow(both_, true));
  EXPECT_TRUE(io_port_get_activelow(both_, false));
}

TEST_F(ImportTest, direction_is_put_in_place_without_the_backend) {
  ASSERT_TRUE(io_port_setup(both_));
  const auto *backend = static_cast<const CheckBackendData *>(io_port_backend_data(both_));
  const int direction = backend->direction;
  EXPECT_EQ(import("[IOPort.I2]\nDirection=output\n"), "");
  EXPECT_FALSE(io_port_direction_input(both_));
  EXPECT_EQ(backend->direction, direction);
  EXPECT_EQ(import("[IOPort.I2]\nDirection=input\n"), "");
  EXPECT_TRUE(io_port_direction_input(both_));
}

TEST_F(ImportTest, direction_only_of_configurable_ports) {
  EXPECT_EQ(import("[IOPort.I0]\nDirection=sideways\n[IOPort.I1]\nDirection=input\n"
                   "[IOPort.I9]\nDirection=input\n[IOPort.I2]\nUsage=door\nDirection=output\n"),
            "");
  EXPECT_FALSE(io_port_direction_input(output_));
  EXPECT_FALSE(io_port_direction_input(both_));
}

TEST_F(ImportTest, groups_come_in_the_order_of_the_file) {
  import("[IOPort.I2.Output]\nName=first\n[IOPort.I02.Output]\nName=second\n");
  EXPECT_EQ(output_name(both_), "second");
}

TEST_F(ImportTest, keys_come_in_the_order_of_the_file) {
  EXPECT_EQ(import("[IOPort.I0.Input]\nName=before\nUsage=door\nTrig=open\n"),
            "Failed to read Usage parameter");
  EXPECT_EQ(input_name(input_), "before");
  EXPECT_FALSE(io_port_get_activelow(input_, true)) << "the error ends the group";
}

TEST_F(ImportTest, names) {
  const std::pair<const char *, const char *> cases[] = {{"Gate", "Gate"},
                                                         {"\"Gate\"", "Gate"},
                                                         {"\"Gate", "Gat"},
                                                         {"\"", ""},
                                                         {"\"\"", ""},
                                                         {"Gate\"", "Gate\""},
                                                         {"\"Tor \xc3\xa9", "Tor "},
                                                         {"", ""},
                                                         {R"("a" "b")", R"(a" "b)"},
                                                         {"Caf\xe9", "Caf\xef\xbf\xbd"}};
  for (const auto &[value, name] : cases) {
    import("[IOPort.I0.Input]\nName=" + std::string(value) + "\n[IOPort.I1.Output]\nName=" + value +
           "\n");
    EXPECT_EQ(input_name(input_), name);
    EXPECT_EQ(output_name(output_), name);
  }
}

TEST_F(ImportTest, name_of_the_side_that_a_port_lacks) {
  EXPECT_EQ(import("[IOPort.I0.Output]\nName=x\n[IOPort.I1.Input]\nName=y\nTrig=open\n"), "");
  EXPECT_EQ(input_name(input_), "(unset)");
  EXPECT_EQ(output_name(output_), "(unset)");
  EXPECT_FALSE(io_port_get_activelow(output_, true));
}

TEST_F(ImportTest, errors_end_their_group_only) {
  EXPECT_EQ(import("[IOPort.I0.Input]\nTrig=Open\nName=lost\n[IOPort.I2.Input]\nName=kept\n"),
            "Failed to read Trig parameter");
  EXPECT_EQ(input_name(input_), "(unset)");
  EXPECT_EQ(input_name(both_), "kept");
}

TEST_F(ImportTest, each_error_has_its_words) {
  const std::pair<const char *, const char *> cases[] = {
      {"[IOPort.I0.Input]\nTrig=ajar\n", "Failed to read Trig parameter"},
      {"[IOPort.I0.Input]\nButton=none\n", "Failed to read Button parameter"},
      {"[IOPort.I1.Output]\nActive=ajar\n", "Failed to read Active parameter"},
      {"[IOPort.I1.Output]\nTrig=open\n", "Failed to read Output parameter"},
      {"[IOPort.I2]\nDirection=Input\n", "Failed to read Direction parameter"},
      {"[IOPort.Ix.Input]\nName=x\n", "Failed to parse port number"},
      {"[IOPort.I.Output]\nName=x\n", "Failed to parse port number"},
      {"[IOPort.I-1.Output]\nName=x\n", "Failed to parse port number"},
      {"[IOPort.I+1]\nDirection=input\n", "Failed to parse port number"},
      {"[IOPort.I 1.Input]\nName=x\n", "Failed to parse port number"},
      {"[IOPort.Input]\nName=x\n", "Failed to parse port number"},
      {"[XInput]\nName=x\n", "Failed to parse port number"},
      {"[MyOutput]\nName=x\n", "Failed to parse port number"},
      {"[IOPort.I]\nDirection=input\n", "Failed to parse port number"},
  };
  for (const auto &[contents, message] : cases) {
    EXPECT_EQ(import(contents), message) << contents;
  }
}

TEST_F(ImportTest, only_the_first_error_is_reported_and_the_others_logged) {
  EXPECT_EQ(import("[IOPort.Ix.Input]\nName=x\n[IOPort.I1.Output]\nActive=x\n"
                   "[IOPort.I0.Input]\nName=zero\n"),
            "Failed to parse port number");
  EXPECT_TRUE(log().took_warning("Failed to read Active parameter in group IOPort.I1.Output"));
  EXPECT_TRUE(log().empty());
  EXPECT_EQ(input_name(input_), "zero");
}

TEST_F(ImportTest, nobody_may_want_the_error) {
  param_import_parhand(write_file("export.conf", "[IOPort.Ix.Input]\nName=x\n").c_str(), nullptr);
  EXPECT_TRUE(log().took_warning("Failed to parse port number in group IOPort.Ix.Input"));
  EXPECT_TRUE(log().empty());
}

TEST_F(ImportTest, groups_without_a_port) {
  EXPECT_EQ(
      import("[Input]\nNbrOfInputs=3\n[Output]\nTrig=x\n[Network]\nName=x\n[IOPortI1]\nx=y\n"), "");
  EXPECT_TRUE(log().empty());
}

TEST_F(ImportTest, the_number_counts_and_not_the_prefix) {
  EXPECT_EQ(import("[SomePort0.Input]\nName=zero\n[12345678"
                   "2xOutput]\nName=two\n"),
            "");
  EXPECT_EQ(input_name(input_), "zero");
  EXPECT_EQ(output_name(both_), "two");
}

TEST_F(ImportTest, input_group_of_an_unknown_port_ends_the_import) {
  testing::internal::CaptureStderr();
  EXPECT_EQ(import("[IOPort.I9.Input]\nName=nine\n[IOPort.I0.Input]\nName=zero\n"), "");
  EXPECT_EQ(testing::internal::GetCapturedStderr(), "No port 9 to write parhand data to.\n");
  EXPECT_EQ(input_name(input_), "(unset)");
}

TEST_F(ImportTest, input_group_without_keys_ends_nothing) {
  EXPECT_EQ(import("[IOPort.I9.Input]\n[IOPort.I0.Input]\nName=zero\n"), "");
  EXPECT_EQ(input_name(input_), "zero");
}

TEST_F(ImportTest, output_group_of_an_unknown_port_is_skipped) {
  EXPECT_EQ(import("[IOPort.I9.Output]\nName=nine\nUsage=x\n[IOPort.I0.Input]\nName=zero\n"), "");
  EXPECT_TRUE(log().took_warning("No port for the parhand data of group IOPort.I9.Output"));
  EXPECT_EQ(input_name(input_), "zero");
}

TEST_F(ImportTest, port_numbers_too_large_are_no_other_ports) {
  for (const char *number : {"2147483648", "4294967296", "18446744073709551616"}) {
    EXPECT_EQ(import("[IOPort.I" + std::string(number) + ".Output]\nName=x\n[IOPort.I" + number +
                     "]\nDirection=output\n"),
              "");
    EXPECT_TRUE(log().took_warning("No port for the parhand data of group IOPort.I" +
                                   std::string(number) + ".Output"));
  }
  EXPECT_TRUE(io_port_direction_input(both_));
  testing::internal::CaptureStderr();
  EXPECT_EQ(import("[IOPort.I4294967296.Input]\nName=x\n[IOPort.I0.Input]\nName=zero\n"), "");
  EXPECT_EQ(testing::internal::GetCapturedStderr(),
            "No port 4294967296 to write parhand data to.\n");
  EXPECT_EQ(input_name(input_), "(unset)");
}

TEST_F(ImportTest, times) {
  const std::tuple<const char *, std::uint32_t, std::int32_t> cases[] = {
      {"250", 250, 250}, {"7 s", 7, 7},
      {"0x10", 0, 0},    {"4294967295", 4294967295U, -1},
      {"", 33, 44},      {"-1", 33, 44},
      {"soon", 33, 44},  {"4294967296", 33, 44},
      {"+5", 33, 44},    {"99999999999999999999", 33, 44}};
  for (const auto &[value, pulse, delay] : cases) {
    io_port_set_pulse_time(output_, 33);
    io_port_set_delay_time(output_, 44);
    EXPECT_EQ(import("[IOPort.I1.Output]\nPulseTime=" + std::string(value) +
                     "\nDelayTime=" + value + "\n"),
              "");
    EXPECT_EQ(io_port_get_pulse_time(output_), pulse) << value;
    EXPECT_EQ(io_port_get_delay_time(output_), delay) << value;
  }
  // Of the two that are numbers and fit nowhere.
  for (const char *key : {"PulseTime", "DelayTime"}) {
    EXPECT_EQ(log().take_all(G_LOG_LEVEL_WARNING,
                             std::string(key) + " in group IOPort.I1.Output is too large"),
              2U);
  }
}

TEST_F(ImportTest, modes) {
  const std::pair<const char *, int> cases[] = {{"bistable", PORT_MODE_BISTABLE},
                                                {"monostable", PORT_MODE_MONOSTABLE},
                                                {"Monostable", PORT_MODE_MONOSTABLE},
                                                {"bistable ", PORT_MODE_MONOSTABLE},
                                                {"", PORT_MODE_MONOSTABLE}};
  for (const auto &[value, mode] : cases) {
    io_port_set_mode(output_, PORT_MODE_BISTABLE);
    EXPECT_EQ(import("[IOPort.I1.Output]\nMode=" + std::string(value) + "\n"), "");
    EXPECT_EQ(io_port_get_mode(output_), mode) << value;
  }
}

TEST_F(ImportTest, unknown_button_words_change_nothing) {
  EXPECT_EQ(import("[IOPort.I1.Output]\nButton=pulse\n"), "");
  EXPECT_EQ(import("[IOPort.I1.Output]\nButton=toggle\nName=still read\n"), "");
  EXPECT_EQ(io_port_get_button(output_), BUTTON_PULSE);
  EXPECT_EQ(output_name(output_), "still read");
}

TEST_F(ImportTest, lines_may_end_as_elsewhere) {
  EXPECT_EQ(import("[IOPort.I1.Output]\r\nMode=bistable\r\nName=\"Lock\"\r\n"), "");
  EXPECT_EQ(io_port_get_mode(output_), PORT_MODE_BISTABLE);
  EXPECT_EQ(output_name(output_), "Lock");
}

TEST_F(ImportTest, file_that_is_no_regular_one) {
  ASSERT_EQ(mkfifo(path_of("pipe").c_str(), 0600), 0);
  EXPECT_EQ(param_read_parhand(path_of("pipe").c_str()), std::nullopt);
  EXPECT_TRUE(log().took_warning("Ignored " + path_of("pipe") + ": Not a regular file"));
  ASSERT_EQ(symlink("export.conf", path_of("link").c_str()), 0);
  EXPECT_EQ(param_read_parhand(path_of("link").c_str()), std::nullopt);
  EXPECT_TRUE(log().took_warning("Ignored " + path_of("link") + ": Is a link"));
}

TEST_F(ImportTest, file_of_the_largest_size) {
  constexpr std::size_t most = 1'048'576;
  EXPECT_EQ(param_read_parhand(write_file("large", std::string(most, 'x')).c_str())->size(), most);
  const std::string larger = write_file("larger", std::string(most + 1, 'x'));
  EXPECT_EQ(param_read_parhand(larger.c_str()), std::nullopt);
  EXPECT_TRUE(log().took_warning("Ignored " + larger + ": File too large"));
}

}  // namespace
