// What each word of the hardware description does.
#include "hwdesc/hwdesc-fixture.h"
#include "port/ioport-private.h"

namespace {

class Vocabulary : public HardwareDescription {
 protected:
  std::list<CheckProperty> properties_of(std::string_view elements) {
    EXPECT_TRUE(load_port(elements));
    return check_record(port()).properties;
  }
};

// --- port ---

TEST_F(Vocabulary, MakesAPortWithTheDefaults) {
  ASSERT_TRUE(load_port(""));
  EXPECT_EQ(io_port_get_id(port().get()), "p");
  EXPECT_EQ(io_port_get_number(port().get()), -1);
  EXPECT_EQ(io_port_get_type(port().get()), PORT_INPUT);
  EXPECT_FALSE(io_port_is_optional(port().get()));
  EXPECT_FALSE(io_port_has_backend(port().get()));
}

TEST_F(Vocabulary, MakesAPortWithoutANameToo) {
  ASSERT_TRUE(load("<ports><port/><port optional='true'/></ports>"));
  EXPECT_EQ(ids(), (Lines{"(without name)", "(without name)"}));
}

TEST_F(Vocabulary, MakesAPortOptionalByTheExactWord) {
  ASSERT_TRUE(
      load("<ports><port name='a' optional='true'/><port name='b' optional='TRUE'/>"
           "<port name='c' optional='false'/><port optional='true' name='d'/></ports>"));
  EXPECT_TRUE(io_port_is_optional(port("a").get()));
  EXPECT_FALSE(io_port_is_optional(port("b").get()));
  EXPECT_FALSE(io_port_is_optional(port("c").get()));
  EXPECT_TRUE(io_port_is_optional(port("d").get()));
}

// --- port_type ---

TEST_F(Vocabulary, GivesThePortItsType) {
  ASSERT_TRUE(load_port("<port_type type='output'/>"));
  EXPECT_EQ(io_port_get_type(port().get()), PORT_OUTPUT);
  ASSERT_TRUE(load_port("<port_type type='input'/>"));
  EXPECT_EQ(io_port_get_type(port().get()), PORT_INPUT);
}

TEST_F(Vocabulary, LetsAConfigurablePortActAsAnInput) {
  ASSERT_TRUE(load_port("<port_type type='io_ctrl'/>"));
  EXPECT_TRUE(is_configurable_input(port()));
}

TEST_F(Vocabulary, KeepsTheDirectionThatAnEarlierTypeGave) {
  ASSERT_TRUE(load_port("<port_type type='output'/><port_type type='io_ctrl'/>"));
  EXPECT_EQ(io_port_get_type(port().get()), PORT_CONFIGURABLE);
  EXPECT_FALSE(io_port_direction_input(port().get()));
  ASSERT_TRUE(
      load_port("<port_type type='output'/><port_type type='input'/>"
                "<port_type type='io_ctrl'/>"));
  EXPECT_TRUE(is_configurable_input(port()));
}

TEST_F(Vocabulary, IsCriticalOfTypesThatItDoesNotKnow) {
  ASSERT_TRUE(load_port("<port_type type='output'/><port_type type='Input'/>"));
  EXPECT_EQ(io_port_get_type(port().get()), PORT_OUTPUT);
  EXPECT_TRUE(log.took_critical("Unsupported port type Input\n"));
  ASSERT_TRUE(load_port("<port_type type=''/>"));
  EXPECT_EQ(io_port_get_type(port().get()), PORT_INPUT);
  EXPECT_TRUE(log.took_critical("Unsupported port type \n"));
}

TEST_F(Vocabulary, KeepsAConfigurablePortThroughATypeThatItDoesNotKnow) {
  ASSERT_TRUE(load_port("<port_type type='io_ctrl'/><port_type type='bidir'/>"));
  EXPECT_TRUE(is_configurable_input(port()));
  EXPECT_TRUE(log.took_critical("Unsupported port type bidir\n"));
}

// --- properties, port_no, param_default_name ---

TEST_F(Vocabulary, GivesThePortFlags) {
  ASSERT_TRUE(load_port("<properties ioport='TRUE' hidden='false' made_up='true'/>"));
  const std::vector<std::pair<std::string, bool>> expected = {
      {"hidden", false}, {"ioport", true}, {"made_up", true}};
  EXPECT_EQ(io_port_get_flags(port().get()), expected);
}

TEST_F(Vocabulary, GivesThePortItsNumber) {
  const std::pair<const char *, int> numbers[] = {{"4", 4},    {"0", 0},     {"-3", -3},  {"07", 7},
                                                  {"0x10", 0}, {"12th", 12}, {"none", 0}, {"", 0}};
  for (const auto &[text, number] : numbers) {
    ASSERT_TRUE(load_port("<port_no nbr='" + std::string(text) + "'/>"));
    EXPECT_EQ(io_port_get_number(port().get()), number) << text;
  }
}

TEST_F(Vocabulary, SurvivesNumbersBeyondThirtyTwoBits) {
  for (const char *text : {"99999999999999999999", "-99999999999999999999", "4294967297"}) {
    ASSERT_TRUE(load_port("<port_no nbr='" + std::string(text) + "'/>"));
  }
  EXPECT_EQ(io_port_get_number(port().get()), 1);
}

TEST_F(Vocabulary, WarnsWhenAHighNumberIsGivenAway) {
  ASSERT_TRUE(load_port("<port_no nbr='7'/>"));
  ASSERT_TRUE(load_port("<port_no nbr='5'/><port_no nbr='8'/>"));
  ASSERT_TRUE(load_port("<port_no nbr='7'/><port_no nbr='1'/>"));
  EXPECT_EQ(io_port_get_number(port().get()), 1);
  EXPECT_TRUE(
      log.took_warning("You have a port with higher number than FIRST_VIRTUAL_PORT this might lead "
                       "to unexpected behaviour"));
  ASSERT_TRUE(load_port("<port_no nbr='6'/><port_no nbr='6'/>"));
  EXPECT_TRUE(log.took_containing(G_LOG_LEVEL_WARNING, "FIRST_VIRTUAL_PORT"));
}

TEST_F(Vocabulary, GivesThePortDefaultNames) {
  ASSERT_TRUE(
      load_port("<port_type type='io_ctrl'/>"
                "<param_default_name input='Door &amp; gate' output='Relay' other='x'/>"));
  std::optional<std::string> input;
  std::optional<std::string> output;
  io_port_get_names(port().get(), &input, &output);
  EXPECT_EQ(input, "Door & gate");
  EXPECT_EQ(output, "Relay");
}

// --- backend ---

TEST_F(Vocabulary, ChoosesTheBackend) {
  const std::pair<const char *, int> words[] = {
      {"virtual", 0},       {"gpio", 1},  {"spiadc", 2}, {"spi", 3},  {"iio", 4},
      {"iio-interrupt", 5}, {"sysfs", 6}, {"iobox", 7},  {"null", 8}, {"check", 9}};
  for (const auto &[word, kind] : words) {
    ASSERT_TRUE(load_port("<backend name='" + std::string(word) + "'/>"));
    EXPECT_EQ(port()->backend, kind) << word;
  }
}

TEST_F(Vocabulary, LeavesAPortWithoutABackendThatItDoesNotKnow) {
  ASSERT_TRUE(load_port("<backend name='GPIO'><input pin='3'/></backend>"));
  EXPECT_FALSE(io_port_has_backend(port().get()));
  EXPECT_EQ(port()->backend, 0);
  EXPECT_TRUE(log.took_warning("Port p: no backend is called GPIO"));
  EXPECT_TRUE(log.took_warning("Port p has no backend: input pin is ignored"));
}

TEST_F(Vocabulary, HandsTheElementsInsideToTheBackend) {
  const std::list<CheckProperty> newest_first = {
      {"output", "alias", "relay"}, {"input", "inverted", "true"}, {"input", "pin", "3"}};
  EXPECT_EQ(properties_of("<backend name='check'><input pin='3' inverted='true'/>"
                          "<output alias='relay'/></backend>"),
            newest_first);
}

TEST_F(Vocabulary, HandsNothingToTheBackendOutsideOfIt) {
  EXPECT_TRUE(properties_of("<input pin='1'/><backend name='check'/><input pin='2'/>"
                            "<properties ioport='true'/>")
                  .empty());
}

TEST_F(Vocabulary, HandsTheOtherAttributesOfTheTagToTheBackend) {
  EXPECT_EQ(properties_of("<backend name='check' speed='9'/>"),
            (std::list<CheckProperty>{{"backend", "speed", "9"}}));
}

TEST_F(Vocabulary, LosesAttributesThatStandBeforeTheNameOfTheBackend) {
  EXPECT_TRUE(properties_of("<backend speed='9' name='check'/>").empty());
}

TEST_F(Vocabulary, GivesElementsInsideABackendTheirOwnMeaningToo) {
  EXPECT_EQ(properties_of("<backend name='check'><port_no nbr='4'/></backend>"),
            (std::list<CheckProperty>{{"port_no", "nbr", "4"}}));
  EXPECT_EQ(io_port_get_number(port().get()), 4);
}

TEST_F(Vocabulary, LetsASecondBackendReplaceTheFirst) {
  EXPECT_TRUE(properties_of("<backend name='sysfs'><device path='/dev/null'/></backend>"
                            "<backend name='check'/>")
                  .empty());
  EXPECT_EQ(port()->backend, BACKEND_CHECK);
}

// --- event and keyvalue ---

TEST_F(Vocabulary, PutsNewEventsInFrontWithTheirDefaults) {
  ASSERT_TRUE(load_port("<event declaration='IOPort'/><event/>"));
  const IoEvents &events = io_port_events(port().get());
  ASSERT_EQ(events.size(), 2U);
  EXPECT_EQ(events.front().name, std::nullopt);
  EXPECT_EQ(events.back().name, "IOPort");
  EXPECT_TRUE(events.back().input);
  EXPECT_TRUE(events.back().output);
  EXPECT_FALSE(events.back().supervised_input);
  EXPECT_FALSE(events.back().declare_only);
  EXPECT_TRUE(events.back().keys.empty());
}

TEST_F(Vocabulary, GivesEventsTheirFlagsInAnyCase) {
  ASSERT_TRUE(
      load_port("<event input='FALSE' output='False' supervised_input='TRUE' "
                "declare_only='True'/>"));
  const IoEvent &event = io_port_events(port().get()).front();
  EXPECT_FALSE(event.input);
  EXPECT_FALSE(event.output);
  EXPECT_TRUE(event.supervised_input);
  EXPECT_TRUE(event.declare_only);
}

TEST_F(Vocabulary, LeavesEventFlagsAsTheyAreForOtherWords) {
  ASSERT_TRUE(load_port("<event input='no' output='0' supervised_input='yes' declare_only=''/>"));
  const IoEvent &event = io_port_events(port().get()).front();
  EXPECT_TRUE(event.input);
  EXPECT_TRUE(event.output);
  EXPECT_FALSE(event.supervised_input);
  EXPECT_FALSE(event.declare_only);
}

TEST_F(Vocabulary, PutsKeysInFrontOnTheNewestEvent) {
  ASSERT_TRUE(
      load_port("<event declaration='old'><keyvalue key='a'/></event>"
                "<event declaration='new'/>"
                "<keyvalue key='b' value='1' type='int' key-nice-name='B' "
                "value-nice-name='One' property='TRUE'/><keyvalue/>"));
  const IoEvents &events = io_port_events(port().get());
  EXPECT_EQ(events.back().keys.size(), 1U);
  ASSERT_EQ(events.front().keys.size(), 2U);
  const IoEventKey &empty = events.front().keys.front();
  EXPECT_FALSE(empty.name || empty.value || empty.type || empty.key_nice_name ||
               empty.value_nice_name || empty.property);
  const IoEventKey &full = events.front().keys.back();
  EXPECT_EQ(full.name, "b");
  EXPECT_EQ(full.value, "1");
  EXPECT_EQ(full.type, "int");
  EXPECT_EQ(full.key_nice_name, "B");
  EXPECT_EQ(full.value_nice_name, "One");
  EXPECT_TRUE(full.property);
}

TEST_F(Vocabulary, LeavesThePropertyOfAKeyAsItIsForOtherWords) {
  ASSERT_TRUE(load_port("<event/><keyvalue property='1'/>"));
  EXPECT_FALSE(io_port_events(port().get()).front().keys.front().property);
  ASSERT_TRUE(load_port("<event/><keyvalue property='false'/>"));
  EXPECT_FALSE(io_port_events(port().get()).front().keys.front().property);
}

TEST_F(Vocabulary, WarnsOfAKeyBeforeAnyEvent) {
  ASSERT_TRUE(load_port("<keyvalue key='a' value='1'/><port_no nbr='2'/>"));
  EXPECT_TRUE(log.took_warning("Port p: a keyvalue element comes before any event"));
  EXPECT_EQ(io_port_get_number(port().get()), 2);
}

// --- first_virtual_input ---

TEST_F(Vocabulary, KnowsTheFirstVirtualInput) {
  ASSERT_TRUE(load("<ports><first_virtual_input nbr='9'/></ports>"));
  EXPECT_EQ(hwdesc_first_virtual_input(), 9);
  ASSERT_TRUE(load_port("<first_virtual_input other='3' nbr='12'/>"));
  EXPECT_EQ(hwdesc_first_virtual_input(), 12);
  ASSERT_TRUE(load_port("<first_virtual_input nbr='many'/>"));
  EXPECT_EQ(hwdesc_first_virtual_input(), 0);
}

// --- The rest ---

TEST_F(Vocabulary, IgnoresWordsThatItDoesNotKnow) {
  ASSERT_TRUE(
      load_port("<colour name='red'/><port_no number='3'/><Port_No nbr='4'/>"
                "<param_default_name both='x'/><event colour='red'/><!-- x --><?x y?>text"));
  EXPECT_EQ(io_port_get_number(port().get()), -1);
}

}  // namespace
