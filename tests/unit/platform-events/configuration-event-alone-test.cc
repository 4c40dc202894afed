#include <gio/gio.h>
#include <gtest/gtest.h>

#include "owners.h"

namespace {

constexpr const char *kInterface = "com.kelv.Some.Interface";
constexpr const char *kPath = "/com/kelv/Some/0";

struct ConfigurationEventAlone : testing::Test {
  ProducerPtr producer{event_producer_new("some")};
  ConfigurationEventPtr handle{configuration_event_new("some", producer.get(), 0)};
  Error error;
};

TEST_F(ConfigurationEventAlone, WantsANameAndAProducer) {
  EXPECT_EQ(configuration_event_new(nullptr, producer.get(), 0), nullptr);
  EXPECT_EQ(configuration_event_new("", producer.get(), 0), nullptr);
  EXPECT_EQ(configuration_event_new("some", nullptr, 0), nullptr);
  configuration_event_free(nullptr);
}

TEST_F(ConfigurationEventAlone, DeclaresAndUndeclaresOnceWithoutABus) {
  auto *event = handle.get();
  EXPECT_TRUE(configuration_event_declare(event, kInterface, kPath, kInterface, error.out()));
  EXPECT_FALSE(configuration_event_declare(event, kInterface, kPath, kInterface, error.out()));
  EXPECT_TRUE(error.matches(G_IO_ERROR, G_IO_ERROR_EXISTS));
  EXPECT_TRUE(configuration_event_undeclare(event, kInterface, kPath, kInterface, error.out()));
  EXPECT_FALSE(configuration_event_undeclare(event, kInterface, kPath, kInterface, error.out()));
  EXPECT_TRUE(error.matches(G_IO_ERROR, G_IO_ERROR_NOT_FOUND));
}

TEST_F(ConfigurationEventAlone, RefusesWhatIsNoInterfaceOrPath) {
  auto *event = handle.get();
  EXPECT_FALSE(configuration_event_declare(event, "some", kPath, kInterface, error.out()));
  EXPECT_TRUE(error.matches(G_IO_ERROR, G_IO_ERROR_INVALID_ARGUMENT));
  EXPECT_FALSE(configuration_event_declare(event, kInterface, "some", kInterface, error.out()));
  EXPECT_FALSE(configuration_event_declare(event, kInterface, kPath, nullptr, error.out()));
  EXPECT_FALSE(configuration_event_declare(nullptr, kInterface, kPath, kInterface, error.out()));
  EXPECT_FALSE(configuration_event_undeclare(event, nullptr, kPath, kInterface, error.out()));
  EXPECT_FALSE(
      configuration_event_send(event, kInterface, kPath, kInterface, "some", 3, error.out()));
  EXPECT_TRUE(error.matches(G_IO_ERROR, G_IO_ERROR_INVALID_ARGUMENT));
}

TEST_F(ConfigurationEventAlone, RefusesPairsThatCannotBeSent) {
  auto *event = handle.get();
  EXPECT_FALSE(configuration_event_initialize_change_string(nullptr));
  EXPECT_FALSE(configuration_event_append_escaped_pair_to_change_string(nullptr, "key", "1"));
  EXPECT_FALSE(configuration_event_append_escaped_pair_to_change_string(event, nullptr, "1"));
  EXPECT_FALSE(configuration_event_append_escaped_pair_to_change_string(event, "", "1"));
  EXPECT_FALSE(configuration_event_append_escaped_pair_to_change_string(event, "key", nullptr));
  EXPECT_FALSE(configuration_event_append_escaped_pair_to_change_string(event, "key", "\xff"));
}

TEST_F(ConfigurationEventAlone, SaysThatItCouldNotSend) {
  auto *event = handle.get();
  EXPECT_FALSE(
      configuration_event_send(event, kInterface, kPath, kInterface, kPath, 3, error.out()));
  EXPECT_TRUE(error.matches(G_IO_ERROR, G_IO_ERROR_NOT_FOUND));
  configuration_event_declare(event, kInterface, kPath, kInterface, nullptr);
  EXPECT_FALSE(
      configuration_event_send(event, kInterface, kPath, kInterface, kPath, 3, error.out()));
  EXPECT_TRUE(error);
  EXPECT_FALSE(error.matches(G_IO_ERROR, G_IO_ERROR_INVALID_ARGUMENT));
}

}  // namespace
