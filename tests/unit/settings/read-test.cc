// From the settings file into a port.
#include "settings/param-fixture.h"
#include "support/fake-supervised.h"

namespace {

class ReadSettings : public Settings {};

class ReadSupervision : public Settings {
 protected:
  ReadSupervision() {
    register_fake_supervised();
    port = PortBuilder().backend(kFakeSupervisedKind).input().set_up();
  }
  ~ReadSupervision() override { backends_register(); }

  IOPortRef port;

  static std::string group(std::string_view lines) {
    return "[port]\ninput_name=Door\ninput_activelow=false\n" + std::string(lines);
  }
};

constexpr const char *kOutputGroup =
    "[port]\n"
    "output_name=Relay 1\n"
    "output_activelow=true\n"
    "button_type=pulse\n"
    "pulse_time=250\n"
    "port_mode=monostable\n"
    "delay_time=40\n";

std::string with(std::string text, std::string_view line, std::string_view replacement) {
  const std::size_t at = text.find(line);
  EXPECT_NE(at, std::string::npos) << line;
  return text.replace(at, line.size(), replacement);
}

TEST_F(ReadSettings, OfAnInput) {
  const auto port = PortBuilder().input().build();
  EXPECT_TRUE(apply(port, "[port]\ninput_name=Front door\ninput_activelow=true\n"));
  EXPECT_EQ(io_port_get_name(port.get()), "Front door");
  EXPECT_TRUE(io_port_get_activelow(port.get(), true));
  EXPECT_EQ(errors, "");
  EXPECT_EQ(output, "");
}

TEST_F(ReadSettings, OfAnOutput) {
  const auto port = PortBuilder().output().build();
  EXPECT_TRUE(apply(port, kOutputGroup));
  EXPECT_EQ(io_port_get_name(port.get()), "Relay 1");
  EXPECT_TRUE(io_port_get_activelow(port.get(), false));
  EXPECT_EQ(io_port_get_button(port.get()), BUTTON_PULSE);
  EXPECT_EQ(io_port_get_pulse_time(port.get()), 250U);
  EXPECT_EQ(io_port_get_mode(port.get()), PORT_MODE_MONOSTABLE);
  EXPECT_EQ(io_port_get_delay_time(port.get()), 40);
  EXPECT_EQ(errors, "");
}

TEST_F(ReadSettings, OfAConfigurablePort) {
  const auto port = PortBuilder().configurable_input().build();
  EXPECT_TRUE(apply(
      port, std::string(kOutputGroup) + "input=false\ninput_name=Door\ninput_activelow=true\n"));
  EXPECT_FALSE(io_port_direction_input(port.get()));
  std::optional<std::string> input_name;
  std::optional<std::string> output_name;
  io_port_get_names(port.get(), &input_name, &output_name);
  EXPECT_EQ(input_name, "Door");
  EXPECT_EQ(output_name, "Relay 1");
  EXPECT_TRUE(io_port_get_activelow(port.get(), true));
  EXPECT_TRUE(io_port_get_activelow(port.get(), false));
}

TEST_F(ReadSettings, LeavesTheOtherSidesAlone) {
  const auto input = PortBuilder().input().build();
  EXPECT_TRUE(apply(
      input, std::string(kOutputGroup) + "input=false\ninput_name=Door\ninput_activelow=false\n"));
  EXPECT_TRUE(io_port_direction_input(input.get()));
  EXPECT_FALSE(io_port_get_activelow(input.get(), false));
  EXPECT_EQ(io_port_get_button(input.get()), BUTTON_NONE);
}

TEST_F(ReadSettings, TellsNobodyAndTouchesNoHardware) {
  const auto port = PortBuilder().configurable_output().event(event_for_outputs("siren")).set_up();
  EXPECT_TRUE(apply(
      port, std::string(kOutputGroup) + "input=true\ninput_name=Door\ninput_activelow=true\n"));
  EXPECT_EQ(listener.heard(), Lines{});
  EXPECT_EQ(check_record(port).state, 0);
  EXPECT_EQ(check_record(port).direction, 0);
}

TEST_F(ReadSettings, OfAPortWithoutAGroupAreNone) {
  const auto port = PortBuilder().input().names("Door", "").build();
  EXPECT_FALSE(apply(port, "[other]\ninput_name=Window\n"));
  EXPECT_EQ(io_port_get_name(port.get()), "Door");
  EXPECT_EQ(errors, "");
}

TEST_F(ReadSettings, OfAPortWithoutANameAreNone) {
  const IOPortRef port(io_port_new());
  EXPECT_FALSE(apply(port, "[port]\n"));
  EXPECT_EQ(errors, "Port does not have a name!\n");
}

TEST_F(ReadSettings, OfAPortWhoseNameIsNoGroupAreNone) {
  for (const char *id : {"", "a]b", "[", "a\nb", "a\x01", "\x7f"}) {
    const auto port = PortBuilder().id(id).build();
    EXPECT_FALSE(apply(port, "[port]\n")) << id;
    EXPECT_NE(errors, "");
  }
}

TEST_F(ReadSettings, FindOddNamesThatCanBeGroups) {
  for (const char *id : {"a b", " a ", "a=b", "#a", "\xC3\xA5", "a;b"}) {
    const auto port = PortBuilder().id(id).build();
    EXPECT_TRUE(apply(port, "[" + std::string(id) + "]\ninput_name=Door\ninput_activelow=false\n"))
        << id;
    EXPECT_EQ(io_port_get_name(port.get()), "Door");
  }
}

// --- Keys that are missing or malformed ---

TEST_F(ReadSettings, WithoutAnInputNameLoseTheNameAndStop) {
  const auto port = PortBuilder().input().number(3).names("Door", "").build();
  EXPECT_FALSE(apply(port, "[port]\ninput_activelow=true\n"));
  EXPECT_EQ(io_port_get_name(port.get()), std::nullopt);
  EXPECT_FALSE(io_port_get_activelow(port.get(), true));
  EXPECT_EQ(output, "No input name for port port:3\n");
  EXPECT_TRUE(errors.starts_with("Error parsing param file: ")) << errors;
}

TEST_F(ReadSettings, WithoutAnOutputNameLoseTheNameAndStop) {
  const auto port = PortBuilder().output().number(4).names("", "Relay").build();
  EXPECT_FALSE(apply(port, "[port]\noutput_activelow=true\n"));
  EXPECT_EQ(io_port_get_name(port.get()), std::nullopt);
  EXPECT_EQ(output, "No output name for port port:4\n");
  EXPECT_TRUE(errors.starts_with("Error parsing param file: ")) << errors;
}

TEST_F(ReadSettings, StopAtTheFirstKeyOfAnOutputThatIsMissing) {
  const char *keys[] = {"output_name=Relay 1\n", "output_activelow=true\n", "button_type=pulse\n",
                        "pulse_time=250\n",      "port_mode=monostable\n",  "delay_time=40\n"};
  for (std::size_t missing = 0; missing < std::size(keys); ++missing) {
    const auto port = PortBuilder().output().build();
    EXPECT_FALSE(apply(port, with(kOutputGroup, keys[missing], ""))) << keys[missing];
    EXPECT_TRUE(errors.starts_with("Error parsing param file: ")) << errors;
    EXPECT_EQ(io_port_get_name(port.get()).has_value(), missing > 0);
    EXPECT_EQ(io_port_get_activelow(port.get(), false), missing > 1);
    EXPECT_EQ(io_port_get_button(port.get()) == BUTTON_PULSE, missing > 2);
    EXPECT_EQ(io_port_get_pulse_time(port.get()) == 250, missing > 3);
    EXPECT_EQ(io_port_get_mode(port.get()) == PORT_MODE_MONOSTABLE, missing > 4);
    EXPECT_EQ(io_port_get_delay_time(port.get()), 0);
  }
}

TEST_F(ReadSettings, StopAtADirectionThatIsMissingOrNone) {
  for (const char *direction : {"", "input=maybe\n", "input=\n"}) {
    const auto port = PortBuilder().configurable_output().build();
    EXPECT_FALSE(
        apply(port, "[port]\n" + std::string(direction) + "input_name=Door\ninput_activelow=1\n"));
    EXPECT_FALSE(io_port_direction_input(port.get()));
    EXPECT_TRUE(errors.starts_with("Error parsing param file: ")) << errors;
  }
}

TEST_F(ReadSettings, StopAtAValueOfTheWrongType) {
  const std::pair<const char *, const char *> wrong[] = {
      {"output_activelow=true", "output_activelow=TRUE"},
      {"output_activelow=true", "output_activelow=yes"},
      {"pulse_time=250", "pulse_time=long"},
      {"pulse_time=250", "pulse_time=250ms"},
      {"pulse_time=250", "pulse_time="},
      {"delay_time=40", "delay_time=4.5"}};
  for (const auto &[line, replacement] : wrong) {
    const auto port = PortBuilder().output().build();
    EXPECT_FALSE(apply(port, with(kOutputGroup, line, replacement))) << replacement;
    EXPECT_EQ(io_port_get_name(port.get()), "Relay 1");
    EXPECT_TRUE(errors.starts_with("Error parsing param file: ")) << errors;
  }
}

TEST_F(ReadSettings, StopAtANameThatCanNotBeInterpreted) {
  const auto port = PortBuilder().input().number(3).names("Door", "").build();
  EXPECT_FALSE(apply(port, "[port]\ninput_name=C:\\quarry\ninput_activelow=true\n"));
  EXPECT_EQ(io_port_get_name(port.get()), std::nullopt);
  EXPECT_FALSE(io_port_get_activelow(port.get(), true));
  EXPECT_TRUE(errors.starts_with("Error parsing param file: ")) << errors;
  EXPECT_TRUE(errors.ends_with("\nIn file " + file + ", group port (port 3), key input_name\n"))
      << errors;
}

TEST_F(ReadSettings, StopAtWordsThatCanNotBeInterpreted) {
  const std::pair<const char *, const char *> wrong[] = {
      {"button_type=pulse", "button_type=pulse\\"}, {"monostable", "bistable\\q"}};
  for (const auto &[line, replacement] : wrong) {
    const auto port = PortBuilder().output().build();
    EXPECT_FALSE(apply(port, with(kOutputGroup, line, replacement))) << replacement;
    EXPECT_EQ(io_port_get_mode(port.get()), PORT_MODE_BISTABLE);
    EXPECT_EQ(io_port_get_delay_time(port.get()), 0);
    EXPECT_TRUE(errors.starts_with("Error parsing param file: ")) << errors;
  }
}

// --- Words and numbers ---

TEST_F(ReadSettings, KnowTheThreeButtons) {
  const std::pair<const char *, int> words[] = {
      {"none", BUTTON_NONE}, {"pulse", BUTTON_PULSE}, {"actinact", BUTTON_ACTINACT}};
  for (const auto &[word, button] : words) {
    const auto port = PortBuilder().output().build();
    io_port_set_button(port.get(), BUTTON_ACTINACT);
    EXPECT_TRUE(
        apply(port, with(kOutputGroup, "button_type=pulse", "button_type=" + std::string(word))));
    EXPECT_EQ(io_port_get_button(port.get()), button) << word;
  }
}

TEST_F(ReadSettings, EndWithoutAnErrorAtAnUnknownButton) {
  for (const char *word : {"toggle", "Pulse", ""}) {
    const auto port = PortBuilder().output().build();
    EXPECT_TRUE(
        apply(port, with(kOutputGroup, "button_type=pulse", "button_type=" + std::string(word))));
    EXPECT_EQ(errors, "");
    EXPECT_TRUE(io_port_get_activelow(port.get(), false));
    EXPECT_EQ(io_port_get_button(port.get()), BUTTON_NONE);
    EXPECT_EQ(io_port_get_pulse_time(port.get()), 0U);
    EXPECT_EQ(io_port_get_mode(port.get()), PORT_MODE_BISTABLE);
    EXPECT_EQ(io_port_get_delay_time(port.get()), 0);
  }
}

TEST_F(ReadSettings, TakeEveryModeButTheExactWordForMonostable) {
  const std::pair<const char *, int> words[] = {
      {"bistable", 2}, {"Bistable", 1}, {"monostable", 1}, {"", 1}, {"other", 1}};
  for (const auto &[word, mode] : words) {
    const auto port = PortBuilder().output().build();
    EXPECT_TRUE(apply(port, with(kOutputGroup, "monostable", word)));
    EXPECT_EQ(io_port_get_mode(port.get()), mode) << word;
  }
}

TEST_F(ReadSettings, TakeTheLowerHalfOfLongTimes) {
  const auto port = PortBuilder().output().build();
  EXPECT_TRUE(apply(port, with(with(kOutputGroup, "=250", "=4294967297"), "delay_time=40",
                               "delay_time=18446744073709551615")));
  EXPECT_EQ(io_port_get_pulse_time(port.get()), 1U);
  EXPECT_EQ(io_port_get_delay_time(port.get()), -1);
}

TEST_F(ReadSettings, TakeNamesWithEscapes) {
  const auto port = PortBuilder().input().build();
  EXPECT_TRUE(apply(port, "[port]\ninput_name=\\s a\\tb\\nc \xC3\xA5\ninput_activelow=false\n"));
  EXPECT_EQ(io_port_get_name(port.get()), "  a\tb\nc \xC3\xA5");
}

TEST_F(ReadSettings, TakeAnEmptyName) {
  const auto port = PortBuilder().input().build();
  EXPECT_TRUE(apply(port, "[port]\ninput_name=\ninput_activelow=false\n"));
  EXPECT_EQ(io_port_get_name(port.get()), "");
}

// --- Supervision ---

TEST_F(ReadSupervision, TakesRangesAndFlag) {
  EXPECT_TRUE(apply(port, group("supervised_input_ranges=[('open', uint32 10, uint32 20), "
                                "('cut', 1, 5)]\nsupervised_input=true\n")));
  const SupervisedRanges by_lower_limit = {{SUPERVISED_STATE_CUT, 5, 1},
                                           {SUPERVISED_STATE_OPEN, 20, 10}};
  EXPECT_EQ(fake_record(port).ranges, by_lower_limit);
  EXPECT_TRUE(io_port_is_supervised(port.get()));
}

TEST_F(ReadSupervision, PutsTheFlagInPlaceWithoutSwitchingTheBackend) {
  fake_record(port).calls.clear();
  EXPECT_TRUE(apply(port, group("supervised_input_ranges=@a(suu) []\nsupervised_input=true\n")));
  EXPECT_EQ(fake_record(port).calls, Lines{"set_ranges"});
  EXPECT_EQ(fake_record(port).ranges, SupervisedRanges{});
}

TEST_F(ReadSupervision, StopsWithoutRanges) {
  io_port_restore_supervised(port.get(), true);
  EXPECT_FALSE(apply(port, group("supervised_input=false\n")));
  EXPECT_TRUE(io_port_is_supervised(port.get()));
  EXPECT_TRUE(errors.starts_with("Error parsing param file: ")) << errors;
}

TEST_F(ReadSupervision, StopsAtRangesThatAreNone) {
  const SupervisedRanges held = {{SUPERVISED_STATE_OPEN, 2, 1}};
  for (const char *ranges : {"", "nothing", "[('open', 1)]", "[('open', -1, 2)]", "[1, 2]",
                             "[('open', uint32 1, uint32 2)", "@as ['x']"}) {
    fake_record(port).ranges = held;
    EXPECT_FALSE(apply(port, group("supervised_input_ranges=" + std::string(ranges) +
                                   "\nsupervised_input=true\n")))
        << ranges;
    EXPECT_TRUE(errors.starts_with("Error parsing param file: ")) << errors;
    EXPECT_EQ(fake_record(port).ranges, held);
    EXPECT_FALSE(io_port_is_supervised(port.get()));
  }
}

TEST_F(ReadSupervision, StopsAtRangesThatAreRefused) {
  fake_record(port).refuses_ranges = true;
  EXPECT_FALSE(apply(port, group("supervised_input_ranges=@a(suu) []\nsupervised_input=true\n")));
  EXPECT_EQ(errors, "Error parsing param file: The fake refuses.\nIn file " + file +
                        ", group port (port 1), key supervised_input_ranges\n");
  EXPECT_FALSE(io_port_is_supervised(port.get()));
}

TEST_F(ReadSupervision, StopsWithoutTheFlag) {
  EXPECT_FALSE(apply(port, group("supervised_input_ranges=[('open', 1, 2)]\n")));
  EXPECT_EQ(fake_record(port).ranges.size(), 1U);
  EXPECT_FALSE(io_port_is_supervised(port.get()));
}

TEST_F(ReadSupervision, IsOnlyForPortsThatOfferIt) {
  fake_record(port).supervisable = false;
  EXPECT_TRUE(apply(port, group("supervised_input_ranges=x\nsupervised_input=x\n")));
  EXPECT_EQ(errors, "");
}

TEST_F(ReadSupervision, IsNotReachedAfterAnUnknownButton) {
  const auto relay = PortBuilder().backend(kFakeSupervisedKind).configurable_output().set_up();
  EXPECT_TRUE(apply(relay,
                    "[port]\ninput=false\ninput_name=a\ninput_activelow=false\n"
                    "output_name=b\noutput_activelow=false\nbutton_type=toggle\n"
                    "supervised_input_ranges=@a(suu) []\nsupervised_input=true\n"));
  EXPECT_FALSE(io_port_is_supervised(relay.get()));
}

// --- The file in memory ---

TEST_F(ReadSettings, OfAMissingFileAreEmpty) {
  EXPECT_TRUE(param_read_configuration(dir.path("missing")));
  EXPECT_FALSE(param_get_conf_vals(PortBuilder().build().get()));
  EXPECT_EQ(dir.names(), Lines{});
}

TEST_F(ReadSettings, OfAnEmptyFileAreEmpty) {
  EXPECT_TRUE(hold(""));
  EXPECT_FALSE(param_get_conf_vals(PortBuilder().build().get()));
}

TEST_F(ReadSettings, OfAFileThatCanNotBeReadAreNotHeld) {
  for (const char *text : {"stray line\n", "[port\n", "key=value\n", "[port]\nno value\n"}) {
    ASSERT_TRUE(hold("[port]\n"));
    OutputCapture standard_error(STDERR_FILENO);
    EXPECT_FALSE(hold(text)) << text;
    EXPECT_TRUE(standard_error.text().starts_with("Could not read key file: ")) << text;
    EXPECT_FALSE(param_get_conf_vals(PortBuilder().build().get()));
    EXPECT_TRUE(log.took_containing(G_LOG_LEVEL_CRITICAL, "'key_file != NULL' failed"));
  }
}

TEST_F(ReadSettings, OfADirectoryAreNotHeld) {
  OutputCapture standard_error(STDERR_FILENO);
  EXPECT_FALSE(param_read_configuration(dir.path()));
  EXPECT_TRUE(standard_error.text().starts_with("Could not read key file: "));
}

TEST_F(ReadSettings, ReplaceTheFileHeldBefore) {
  const auto port = PortBuilder().build();
  EXPECT_TRUE(hold("[port]\ninput_name=a\ninput_activelow=false\n"));
  EXPECT_TRUE(param_read_configuration(dir.path("missing")));
  EXPECT_FALSE(param_get_conf_vals(port.get()));
}

TEST_F(ReadSettings, NeedAFileInMemory) {
  const auto port = PortBuilder().build();
  EXPECT_FALSE(param_get_conf_vals(port.get()));
  EXPECT_TRUE(log.took_containing(G_LOG_LEVEL_CRITICAL, "param_get_conf_vals"));
  param_set_conf_vals(port.get());
  EXPECT_TRUE(log.took_containing(G_LOG_LEVEL_CRITICAL, "param_set_conf_vals"));
  EXPECT_FALSE(param_write_configuration(file));
  EXPECT_TRUE(log.took_containing(G_LOG_LEVEL_CRITICAL, "param_write_configuration"));
  param_free_configuration();
  param_free_configuration();
  EXPECT_EQ(dir.names(), Lines{});
}

}  // namespace
