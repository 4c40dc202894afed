// From a port into the settings file.
#include <sys/stat.h>

#include "settings/param-fixture.h"
#include "support/fake-supervised.h"
#include "support/file-size-limit.h"

namespace {

class WriteSettings : public Settings {};

bool has_line(const std::string &text, const std::string &line) {
  return ("\n" + text).find("\n" + line + "\n") != std::string::npos;
}

// --- What is written of a port ---

TEST_F(WriteSettings, OfAnInput) {
  const auto port = PortBuilder().input().names("Door", "unused").activelow().build();
  EXPECT_EQ(saved(port), "[port]\ninput_name=Door\ninput_activelow=true\n");
  EXPECT_EQ(errors, "");
}

TEST_F(WriteSettings, OfAnOutputInTheOrderOfTheFile) {
  const auto port = PortBuilder().output().names("unused", "Relay").build();
  io_port_set_button(port.get(), BUTTON_ACTINACT);
  io_port_set_pulse_time(port.get(), 250);
  io_port_set_mode(port.get(), PORT_MODE_MONOSTABLE);
  io_port_set_delay_time(port.get(), 40);
  EXPECT_EQ(saved(port),
            "[port]\noutput_name=Relay\noutput_activelow=false\nbutton_type=actinact\n"
            "pulse_time=250\nport_mode=monostable\ndelay_time=40\n");
}

TEST_F(WriteSettings, OfAConfigurablePortInTheOrderOfTheFile) {
  const auto port = PortBuilder().configurable_output().names("Door", "Relay").build();
  EXPECT_EQ(saved(port),
            "[port]\ninput=false\ninput_name=Door\ninput_activelow=false\noutput_name=Relay\n"
            "output_activelow=false\nbutton_type=none\npulse_time=0\nport_mode=bistable\n"
            "delay_time=0\n");
}

TEST_F(WriteSettings, OfASupervisablePort) {
  register_fake_supervised();
  const auto port = PortBuilder().backend(kFakeSupervisedKind).names("Door", "").set_up();
  fake_record(port).ranges = {{SUPERVISED_STATE_OPEN, 20, 10}, {SUPERVISED_STATE_CUT, 5, 1}};
  io_port_restore_supervised(port.get(), true);
  EXPECT_EQ(saved(port),
            "[port]\ninput_name=Door\ninput_activelow=false\n"
            "supervised_input_ranges=[('open', uint32 10, uint32 20), ('cut', 1, 5)]\n"
            "supervised_input=true\n");
  backends_register();
}

TEST_F(WriteSettings, OfASupervisablePortWithoutRanges) {
  register_fake_supervised();
  const auto port = PortBuilder().backend(kFakeSupervisedKind).set_up();
  EXPECT_TRUE(has_line(saved(port), "supervised_input_ranges=@a(suu) []"));
  EXPECT_TRUE(has_line(contents(), "supervised_input=false"));
  backends_register();
}

TEST_F(WriteSettings, WidenAPulseWithoutItsSignAndADelayWithIt) {
  const auto port = PortBuilder().output().build();
  io_port_set_pulse_time(port.get(), UINT32_MAX);
  io_port_set_delay_time(port.get(), -1);
  EXPECT_TRUE(has_line(saved(port), "pulse_time=4294967295"));
  EXPECT_TRUE(has_line(contents(), "delay_time=18446744073709551615"));
  io_port_set_delay_time(port.get(), INT32_MIN);
  EXPECT_TRUE(has_line(saved(port), "delay_time=18446744071562067968"));
}

TEST_F(WriteSettings, LeaveTheButtonOutThatHasNoWord) {
  const auto port = PortBuilder().output().build();
  for (const int button : {3, -1, INT32_MAX}) {
    io_port_set_button(port.get(), button);
    EXPECT_EQ(saved(port).find("button_type"), std::string::npos) << button;
  }
}

TEST_F(WriteSettings, WriteNamesThatAreUnsetAsEmpty) {
  EXPECT_TRUE(has_line(saved(PortBuilder().input().build()), "input_name="));
}

TEST_F(WriteSettings, CorrectAModeOfTheWrongCase) {
  const auto port = PortBuilder().output().build();
  EXPECT_TRUE(apply(port,
                    "[port]\noutput_name=a\noutput_activelow=false\nbutton_type=none\n"
                    "pulse_time=0\nport_mode=Bistable\ndelay_time=0\n"));
  param_free_configuration();
  EXPECT_TRUE(has_line(saved(port), "port_mode=monostable"));
}

TEST_F(WriteSettings, AreReadBackAsTheyWere) {
  const auto written = PortBuilder()
                           .configurable_output()
                           .names(" Door\t1\n[x]=#\\", "\xC3\xA5 ;")
                           .activelow()
                           .build();
  io_port_set_button(written.get(), BUTTON_PULSE);
  io_port_set_pulse_time(written.get(), 77);
  io_port_set_delay_time(written.get(), -5);
  (void)saved(written);
  const auto read = PortBuilder().configurable_input().build();
  ASSERT_TRUE(param_read_configuration(file));
  EXPECT_TRUE(param_get_conf_vals(read.get()));
  EXPECT_EQ(io_port_get_name(read.get()), io_port_get_name(written.get()));
  io_port_restore_direction(read.get(), true);
  EXPECT_EQ(io_port_get_name(read.get()), " Door\t1\n[x]=#\\");
  EXPECT_TRUE(io_port_get_activelow(read.get(), true));
  EXPECT_TRUE(io_port_get_activelow(read.get(), false));
  EXPECT_EQ(io_port_get_button(read.get()), BUTTON_PULSE);
  EXPECT_EQ(io_port_get_pulse_time(read.get()), 77U);
  EXPECT_EQ(io_port_get_delay_time(read.get()), -5);
}

TEST_F(WriteSettings, KeepTheWhiteSpaceThatANameBeginsWith) {
  for (const char *name : {"\f", "\fx", "\f x", " \fx", "\\fx", "\f\\fx", "\f\n", "\tx", "\v"}) {
    const auto written = PortBuilder().input().names(name, "").build();
    (void)saved(written);
    const auto read = PortBuilder().input().build();
    ASSERT_TRUE(param_read_configuration(file));
    EXPECT_TRUE(param_get_conf_vals(read.get()));
    EXPECT_EQ(io_port_get_name(read.get()), name) << contents();
    param_free_configuration();
  }
}

// --- What is left in the file ---

TEST_F(WriteSettings, CreateAMissingFileWithThatPortOnly) {
  (void)PortBuilder().id("other").registered();
  EXPECT_EQ(saved(PortBuilder().input().names("Door", "").build()),
            "[port]\ninput_name=Door\ninput_activelow=false\n");
  EXPECT_EQ(dir.names(), Lines{"portd.conf"});
}

TEST_F(WriteSettings, KeepWhatOthersWrote) {
  dir.write("portd.conf",
            "# first comment\n"
            "[other]\n"
            "key=value\n"
            "# about the port\n"
            "[port]\n"
            "# about the name\n"
            "input_name=old\n"
            "input_activelow=false\n"
            "foreign=kept\n"
            "foreign[sv]=beh\xC3\xA5llen\n"
            "input_name[sv]=D\xC3\xB6rr\n");
  const std::string text = saved(PortBuilder().input().names("Door", "").build());
  for (const char *line :
       {"# first comment", "[other]", "key=value", "# about the port", "# about the name",
        "input_name=Door", "input_activelow=false", "foreign=kept", "foreign[sv]=beh\xC3\xA5llen",
        "input_name[sv]=D\xC3\xB6rr"}) {
    EXPECT_TRUE(has_line(text, line)) << line << " in\n" << text;
  }
  EXPECT_EQ(text.find("old"), std::string::npos);
}

TEST_F(WriteSettings, KeepKeysOfASideThatThePortNoLongerHas) {
  dir.write("portd.conf", "[port]\noutput_name=Relay\n");
  EXPECT_TRUE(has_line(saved(PortBuilder().input().build()), "output_name=Relay"));
}

TEST_F(WriteSettings, KeepTheModeOfTheFile) {
  dir.write("portd.conf", "");
  ASSERT_EQ(chmod(file.c_str(), 0600), 0);
  (void)saved(PortBuilder().build());
  struct stat status {};
  ASSERT_EQ(stat(file.c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & ALLPERMS, 0600U);
}

TEST_F(WriteSettings, OfAPortWithoutAUsableNameAreNone) {
  dir.write("portd.conf", "[other]\nkey=value\n");
  EXPECT_EQ(saved(IOPortRef(io_port_new())), "[other]\nkey=value\n");
  EXPECT_EQ(errors, "Port does not have a name!\n");
  for (const char *id : {"", "a]b", "[", "a\nb", "a\x01", "\x7f"}) {
    EXPECT_EQ(saved(PortBuilder().id(id).build()), "[other]\nkey=value\n") << id;
    EXPECT_EQ(errors, "Port name \"" + std::string(id) + "\" can't name a group of settings\n");
  }
}

// --- Saving ---

TEST_F(WriteSettings, ReadTheFileAnewForEachSave) {
  (void)saved(PortBuilder().id("a").build());
  dir.write("portd.conf", "[foreign]\nkey=value\n");
  const std::string text = saved(PortBuilder().id("b").build());
  EXPECT_TRUE(has_line(text, "[foreign]"));
  EXPECT_FALSE(has_line(text, "[a]"));
  EXPECT_FALSE(param_get_conf_vals(PortBuilder().build().get()));
  EXPECT_TRUE(log.took_containing(G_LOG_LEVEL_CRITICAL, "'key_file != NULL' failed"));
}

TEST_F(WriteSettings, GoIntoTheFileInMemoryWhileOneIsHeld) {
  ASSERT_TRUE(hold("[held]\nkey=value\n"));
  dir.write("portd.conf", "[changed behind our back]\n");
  const std::string text = saved(PortBuilder().build());
  EXPECT_TRUE(has_line(text, "[held]"));
  EXPECT_TRUE(has_line(text, "[port]"));
  EXPECT_FALSE(has_line(text, "[changed behind our back]"));
  EXPECT_TRUE(param_write_configuration(file));  // still held
}

TEST_F(WriteSettings, AreSkippedWhenTheFileCanNotBeRead) {
  dir.write("portd.conf", "no key file");
  EXPECT_EQ(saved(PortBuilder().build()), "no key file");
  EXPECT_TRUE(errors.starts_with("Could not read key file: ")) << errors;
  EXPECT_TRUE(
      log.took_critical("param_save_for_port: assertion 'param_read_configuration (file)' failed"));
}

TEST_F(WriteSettings, AreSkippedWhenTheFileIsNoRegularOne) {
  ASSERT_EQ(mkfifo(file.c_str(), 0600), 0);
  OutputCapture standard_error(STDERR_FILENO);
  param_save_for_port(PortBuilder().build().get(), file);
  EXPECT_EQ(standard_error.text(), "Could not read key file: " + file + ": Not a regular file\n");
  EXPECT_TRUE(
      log.took_critical("param_save_for_port: assertion 'param_read_configuration (file)' failed"));
}

TEST_F(WriteSettings, LeaveTheOldFileWhenTheyCanNotBeStored) {
  const std::string old = "[other]\nkey=value\n";
  dir.write("portd.conf", old);
  {
    const FileSizeLimit limit(old.size());
    EXPECT_EQ(saved(PortBuilder().build()), old);
  }
  EXPECT_TRUE(errors.starts_with("Failed to store key file " + file + ": ")) << errors;
  EXPECT_EQ(dir.names(), Lines{"portd.conf"});
}

TEST_F(WriteSettings, SayWhenTheyCanNotBeStored) {
  ASSERT_TRUE(hold(""));
  OutputCapture standard_error(STDERR_FILENO);
  EXPECT_FALSE(param_write_configuration(dir.path("missing/portd.conf")));
  EXPECT_TRUE(standard_error.text().starts_with("Failed to store key file " +
                                                dir.path("missing/portd.conf") + ": "));
}

TEST_F(WriteSettings, OfAllPortsAreThoseNumberedBelowTheirCount) {
  (void)PortBuilder().id("a").number(0).registered();
  (void)PortBuilder().id("b").number(1).registered();
  (void)PortBuilder().id("hidden").number(2).flag("ioport", "false").registered();
  (void)PortBuilder().id("high").number(4).registered();
  param_save_all(file);
  EXPECT_EQ(contents(),
            "[a]\ninput_name=\ninput_activelow=false\n\n[b]\ninput_name=\ninput_activelow=false\n");
}

TEST_F(WriteSettings, OfAllPortsKeepTheFileWhenItCanNotBeRead) {
  (void)PortBuilder().number(0).registered();
  dir.write("portd.conf", "no key file");
  OutputCapture standard_error(STDERR_FILENO);
  param_save_all(file);
  EXPECT_TRUE(standard_error.text().starts_with("Could not read key file: "));
  EXPECT_EQ(contents(), "no key file");
  EXPECT_TRUE(log.took_containing(G_LOG_LEVEL_CRITICAL, "param_read_configuration (file)"));
}

TEST_F(WriteSettings, OfNoPortsMakeNoFile) {
  param_save_all(file);
  EXPECT_EQ(dir.names(), Lines{});
}

}  // namespace
