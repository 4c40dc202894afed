// Whole documents: good ones, broken ones, several of them.
#include <sys/stat.h>

#include <algorithm>
#include <cstdlib>

#include "base/glib-ptr.h"
#include "hwdesc/hwdesc-fixture.h"

namespace {

class Documents : public HardwareDescription {
 protected:
  bool took_load_failure(const std::string &path) {
    return log.took_critical("Couldn't load XML (" + path + ")\n");
  }
};

using FirstVirtualInputDeathTest = Documents;

constexpr int kLevelUser = 256;

constexpr const char *kExample = R"(
<ports>
  <port name="relay1" optional="true">
    <port_type type="io_ctrl"/>
    <port_no nbr="1"/>
    <properties ioport="true" hidden="false"/>
    <param_default_name input="Input 2" output="Relay 1"/>
    <backend name="check">
      <input pin="12" inverted="true"/>
      <output alias="relay1-out"/>
    </backend>
    <event declaration="IOPort" input="true" output="true"/>
    <event declaration="PortAny" input="true" output="false"/>
  </port>
  <first_virtual_input nbr="9"/>
</ports>
)";

TEST_F(Documents, DescribeAWholePort) {
  ASSERT_TRUE(load(kExample));
  const auto relay = port("relay1");
  ASSERT_NE(relay, nullptr);
  EXPECT_TRUE(is_configurable_input(relay));
  EXPECT_TRUE(io_port_is_optional(relay.get()));
  EXPECT_TRUE(io_port_is_ioport(relay.get()));
  EXPECT_EQ(io_port_get_number(relay.get()), 1);
  EXPECT_EQ(io_port_get_name(relay.get()), "Input 2");
  EXPECT_EQ(check_record(relay).properties.size(), 3U);
  EXPECT_EQ(io_port_events(relay.get()).size(), 2U);
  EXPECT_TRUE(io_port_got_port_any(relay.get()));
  EXPECT_EQ(hwdesc_first_virtual_input(), 9);
}

TEST_F(Documents, AreReadWithoutRegardToNesting) {
  ASSERT_TRUE(load("<x><port name='a'/><port_no nbr='4'/><port name='b'/></x>"));
  EXPECT_EQ(io_port_get_number(port("a").get()), 4);
  EXPECT_EQ(io_port_get_number(port("b").get()), -1);
  EXPECT_EQ(ids(), (Lines{"b", "a"}));
}

TEST_F(Documents, MayHoldAThousandPorts) {
  std::string document = "<ports>";
  for (int i = 0; i < 1000; ++i) {
    const std::string number = std::to_string(i);
    document.append("<port name='port").append(number).append("'><port_no nbr='").append(number);
    document.append("'/><backend name='check'><device path='x'/></backend></port>");
  }
  ASSERT_TRUE(load(document + "</ports>"));
  EXPECT_EQ(port_registry_count(), 1000U);
  EXPECT_EQ(io_port_get_number(port("port0").get()), 0);
  EXPECT_EQ(io_port_get_number(port("port999").get()), 999);
  EXPECT_EQ(check_record(port("port500")).properties.size(), 1U);
}

// --- Broken documents ---

TEST_F(Documents, ThatAreMissingAreCritical) {
  EXPECT_FALSE(hwdesc_load_file("/nonexistent/conf.xml"));
  EXPECT_TRUE(took_load_failure("/nonexistent/conf.xml"));
  EXPECT_FALSE(hwdesc_load_file(dir.path()));
  EXPECT_TRUE(took_load_failure(dir.path()));
}

TEST_F(Documents, ThatHoldNothingSayNothing) {
  for (const char *text : {"", "   \n"}) {
    EXPECT_TRUE(load(text)) << text;
  }
  EXPECT_EQ(port_registry_count(), 0U);
}

TEST_F(Documents, ThatAreNoMarkupAreCritical) {
  EXPECT_FALSE(load("no markup"));
  EXPECT_TRUE(took_parse_failure());
  EXPECT_EQ(port_registry_count(), 0U);
}

TEST_F(Documents, ThatAreMalformedAreToldWithPlaceAndReason) {
  EXPECT_FALSE(load("<ports>\n <port name='a'/>\n</port>\n"));
  EXPECT_TRUE(log.took_critical("Couldn't parse markup file (" + dir.path("conf.xml") + ")\n"));
  const auto told = log.take_warnings();
  ASSERT_EQ(told.size(), 1U);
  EXPECT_EQ(told.front().find(dir.path("conf.xml") + ":3:"), 0U) << told.front();
  EXPECT_EQ(told.front().find("Error on line"), std::string::npos) << told.front();
}

TEST_F(Documents, ThatAreMalformedKeepWhatStoodBefore) {
  EXPECT_FALSE(load("<ports><port name='a'/><port name='b'></ports><port name='c'/>"));
  EXPECT_TRUE(took_parse_failure());
  EXPECT_EQ(ids(), (Lines{"b", "a"}));
}

TEST_F(Documents, ThatEndTooEarlyKeepWhatStoodBefore) {
  EXPECT_FALSE(load("<ports><port name='a'><port_no nbr='3'/>"));
  EXPECT_TRUE(took_parse_failure());
  EXPECT_EQ(io_port_get_number(port("a").get()), 3);
}

TEST_F(Documents, MayBeCutAnywhere) {
  const std::string whole(kExample);
  for (std::size_t length = 0; length < whole.size(); ++length) {
    (void)load(whole.substr(0, length));
  }
  log.forget();
  EXPECT_TRUE(load(whole));
  EXPECT_EQ(port_registry_count(), 1U);
}

TEST_F(Documents, ThatHoldBytesOfNoTextAreCritical) {
  EXPECT_FALSE(load("<ports><port name='\xFF\xFE'/></ports>"));
  EXPECT_TRUE(took_parse_failure());
  EXPECT_FALSE(load(std::string_view("<ports><port\0name='a'/></ports>", 31)));
  EXPECT_TRUE(took_parse_failure());
}

TEST_F(Documents, ThatBreakInsideABackendDoNotReachIntoTheNext) {
  EXPECT_FALSE(load("<ports><port name='a'><backend name='check'>"));
  EXPECT_TRUE(took_parse_failure());
  ASSERT_TRUE(load("<ports><input pin='3'/></ports>"));
  EXPECT_TRUE(check_record(port("a")).properties.empty());
}

// --- Elements before any port ---

TEST_F(Documents, WarnOfElementsBeforeAnyPort) {
  ASSERT_TRUE(
      load("<ports><port_type type='output'/><properties ioport='true'/><port_no nbr='1'/>"
           "<param_default_name input='x'/><backend name='check'><input pin='3'/></backend>"
           "<event declaration='e'/><keyvalue key='k'/><port name='a'/></ports>"));
  for (const char *element : {"port_type", "properties", "port_no", "param_default_name", "backend",
                              "event", "keyvalue"}) {
    EXPECT_TRUE(log.took_warning("Element " + std::string(element) + " comes before any port"));
  }
  EXPECT_EQ(ids(), Lines{"a"});
  EXPECT_TRUE(io_port_events(port("a").get()).empty());
}

TEST_F(Documents, TellTheFirstVirtualInputBeforeAnyPort) {
  ASSERT_TRUE(load("<first_virtual_input nbr='21'/>"));
  EXPECT_EQ(hwdesc_first_virtual_input(), 21);
}

// A process of its own, since no document takes the number back.
TEST_F(FirstVirtualInputDeathTest, IsUnknownUntilADocumentGivesIt) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  EXPECT_EXIT(
      {
        const bool known_before = hwdesc_first_virtual_input().has_value();
        (void)load("<ports><first_virtual_input/><port name='a'/></ports>");
        const bool known_after = hwdesc_first_virtual_input().has_value();
        _exit(known_before || known_after ? EXIT_FAILURE : EXIT_SUCCESS);
      },
      testing::ExitedWithCode(EXIT_SUCCESS), "");
}

// --- Replacement ---

TEST_F(Documents, ReplaceAPortOfTheSameName) {
  ASSERT_TRUE(load("<ports><port name='a'/><port_no nbr='1'/><port name='b'/></ports>"));
  ASSERT_TRUE(load("<ports><port name='a' optional='true'/><port_no nbr='2'/></ports>"));
  EXPECT_EQ(ids(), (Lines{"a", "b"}));
  EXPECT_EQ(io_port_get_number(port("a").get()), 2);
  EXPECT_TRUE(io_port_is_optional(port("a").get()));
}

TEST_F(Documents, AddASecondPortWhenTheNameDoesNotStandFirst) {
  ASSERT_TRUE(load("<ports><port name='a'/></ports>"));
  ASSERT_TRUE(load("<ports><port optional='true' name='a'/></ports>"));
  EXPECT_EQ(ids(), (Lines{"a", "a"}));
}

TEST_F(Documents, ReplaceOnePortOfSeveral) {
  ASSERT_TRUE(load("<ports><port name='a'/><port optional='true' name='a'/></ports>"));
  ASSERT_TRUE(load("<ports><port name='a'/></ports>"));
  EXPECT_EQ(ids(), (Lines{"a", "a"}));
}

TEST_F(Documents, KeepAReplacedPortAliveForWhoeverHoldsIt) {
  ASSERT_TRUE(load("<ports><port name='a'/><port_no nbr='1'/></ports>"));
  const auto old = port("a");
  ASSERT_TRUE(load("<ports><port name='a'/><port_no nbr='2'/></ports>"));
  EXPECT_EQ(io_port_get_number(old.get()), 1);
}

// --- The hardware filter, on a machine where nobody can be asked ---

TEST_F(Documents, KeepAPortWhoseFilterCanNotBeJudged) {
  ASSERT_TRUE(load("<ports><port hwid='A1:B2' name='a'/><port_no nbr='3'/></ports>"));
  EXPECT_EQ(io_port_get_number(port("a").get()), 3);
  EXPECT_TRUE(log.took_warning("Could not get the hardware id"));
}

TEST_F(Documents, KeepAPortWithAnEmptyFilter) {
  ASSERT_TRUE(load("<ports><port hwid='' name='a'/></ports>"));
  EXPECT_EQ(ids(), Lines{"a"});
  EXPECT_TRUE(log.took_warning("Could not get the hardware id"));
}

TEST_F(Documents, AskForTheHardwareUntilThereIsAnAnswer) {
  ASSERT_TRUE(load("<ports><port hwid='A1' name='a'/><port hwid='B2' name='b'/></ports>"));
  EXPECT_EQ(log.take_all(G_LOG_LEVEL_WARNING, "Could not get the hardware id"), 2U);
  EXPECT_TRUE(log.took_containing(kLevelUser, "Failed to setup proxy: "));
  EXPECT_TRUE(log.took_containing(kLevelUser, "Failed to setup proxy: "));
  EXPECT_FALSE(log.took_containing(kLevelUser, "Failed to setup proxy: "));
}

TEST_F(Documents, ReplaceAPortByANameRightAfterTheFilter) {
  ASSERT_TRUE(load("<ports><port name='a'/><port hwid='A1' name='a'/></ports>"));
  EXPECT_EQ(ids(), Lines{"a"});
  EXPECT_TRUE(log.took_warning("Could not get the hardware id"));
}

TEST_F(Documents, HaveNoFilterThatDoesNotStandFirst) {
  ASSERT_TRUE(load("<ports><port name='a' hwid='A1'/></ports>"));
  EXPECT_EQ(ids(), Lines{"a"});
}

// --- Directories ---

TEST_F(Documents, OfADirectoryAreAllRead) {
  const TempDir fragments;
  fragments.write("10.xml", "<ports><port name='a'/></ports>");
  fragments.write("20", "<ports><port name='b'/></ports>");
  fragments.write(".hidden", "<ports><port name='c'/></ports>");
  hwdesc_load_directory(fragments.path());
  Lines sorted = ids();
  std::sort(sorted.begin(), sorted.end());
  EXPECT_EQ(sorted, (Lines{"a", "b", "c"}));
}

TEST_F(Documents, OfADirectoryAreReadAsListedUpToTheFirstThatFails) {
  const TempDir fragments;
  for (const char *name : {"a", "b", "c", "d", "e"}) {
    fragments.write(name, "<ports><port name='" + std::string(name) + "'/></ports>");
  }
  Lines listed;
  const GDirPtr directory(g_dir_open(fragments.path().c_str(), 0, nullptr));
  while (const char *name = g_dir_read_name(directory.get())) {
    listed.emplace_back(name);
  }
  ASSERT_EQ(listed.size(), 5U);
  fragments.write(listed[2], "<ports>");
  hwdesc_load_directory(fragments.path());
  EXPECT_EQ(ids(), (Lines{listed[1], listed[0]}));
  EXPECT_TRUE(took_parse_failure(fragments.path(listed[2])));
}

TEST_F(Documents, OfADirectoryEndAtADirectoryInIt) {
  const TempDir fragments;
  const std::string inner = fragments.make_directory("inner");
  hwdesc_load_directory(fragments.path());
  EXPECT_TRUE(took_load_failure(inner));
}

TEST_F(Documents, OfADirectoryThatIsMissingOrNoneAreNone) {
  hwdesc_load_directory("/nonexistent/portd.d");
  hwdesc_load_directory(dir.write("file", "<ports><port name='a'/></ports>"));
  EXPECT_EQ(port_registry_count(), 0U);
}

}  // namespace
