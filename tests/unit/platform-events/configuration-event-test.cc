#include <gtest/gtest.h>

#include "bus-test.h"
#include "owners.h"
#include "watcher.h"

namespace {

constexpr const char *kInterface = "com.kelv.Some.Interface";
constexpr const char *kPath = "/com/kelv/Some/0";

TEST(ConfigurationEvent, AnnouncesTheChangeString) {
  const Watcher watcher(bus_address(), "com.kelv.Configuration.Event");
  const ProducerPtr producer(event_producer_new("some"));
  const ConfigurationEventPtr event(configuration_event_new("some", producer.get(), 0));
  configuration_event_declare(event.get(), kInterface, kPath, kInterface, nullptr);

  configuration_event_initialize_change_string(event.get());
  configuration_event_append_escaped_pair_to_change_string(event.get(), "NbrOfInputs", "4");
  Error error;
  EXPECT_TRUE(
      configuration_event_send(event.get(), kInterface, kPath, kInterface, kPath, 3, error.out()));
  configuration_event_initialize_change_string(event.get());
  configuration_event_append_escaped_pair_to_change_string(event.get(), "Name", "a=b&c d\xc3\xbc");
  configuration_event_append_escaped_pair_to_change_string(event.get(), "Empty", "");
  EXPECT_TRUE(
      configuration_event_send(event.get(), kInterface, kPath, kInterface, kPath, 3, error.out()));

  ASSERT_TRUE(wait_until([&] { return watcher.count("Changed") == 2; }));
  EXPECT_EQ(watcher.signals(),
            (std::vector<std::string>{
                "Changed ('com.kelv.Some.Interface', '/com/kelv/Some/0', 'NbrOfInputs=4')",
                "Changed ('com.kelv.Some.Interface', '/com/kelv/Some/0', "
                "'Name=a%3Db%26c%20d\xc3\xbc&Empty=')"}));
  watcher.for_each(
      [](const Heard &heard) { EXPECT_EQ(heard.path, "/com/kelv/Configuration/Event"); });
}

}  // namespace
