#include <gio/gio.h>
#include <gtest/gtest.h>

#include "owners.h"

namespace {

TEST(EventProducer, WantsAName) {
  EXPECT_EQ(event_producer_new(nullptr), nullptr);
  EXPECT_EQ(event_producer_new(""), nullptr);
  EXPECT_EQ(event_producer_new("\xff"), nullptr);
  event_producer_free(nullptr);
}

TEST(EventProducer, OfOneNameIsOne) {
  const ProducerPtr first(event_producer_new("some"));
  const ProducerPtr other(event_producer_new("other"));
  const guint32 id = event_producer_declare(first.get(), port_declaration(1).get());
  {
    const ProducerPtr second(event_producer_new_full("some", 0, 0));
    EXPECT_TRUE(send_state(second.get(), id, true));
  }
  EXPECT_TRUE(send_state(first.get(), id, false));
  EXPECT_FALSE(send_state(other.get(), id, true));
}

TEST(EventProducer, GivesTheNextIdToEachDeclaration) {
  const ProducerPtr producer(event_producer_new("some"));
  const DeclarationPtr declaration = port_declaration(1);
  EXPECT_EQ(event_producer_declare(producer.get(), declaration.get()), 1U);
  EXPECT_EQ(event_producer_declare(producer.get(), declaration.get()), 2U);
  EXPECT_TRUE(event_producer_undeclare(producer.get(), 2));
  EXPECT_EQ(event_producer_declare(producer.get(), declaration.get()), 3U);
}

TEST(EventProducer, UndeclaresOnce) {
  const ProducerPtr producer(event_producer_new("some"));
  const guint32 id = event_producer_declare(producer.get(), port_declaration(1).get());
  EXPECT_TRUE(event_producer_undeclare(producer.get(), id));
  EXPECT_FALSE(event_producer_undeclare(producer.get(), id));
  EXPECT_FALSE(event_producer_undeclare(producer.get(), 0));
  EXPECT_EQ(event_producer_prepare_event(producer.get(), id), nullptr);
}

TEST(EventProducer, RefusesWhatIsMissing) {
  const ProducerPtr producer(event_producer_new("some"));
  const DeclarationPtr declaration = port_declaration(1);
  EXPECT_EQ(event_producer_declare(nullptr, declaration.get()), 0U);
  EXPECT_EQ(event_producer_declare(producer.get(), nullptr), 0U);
  EXPECT_FALSE(event_producer_undeclare(nullptr, 1));
  EXPECT_EQ(event_producer_prepare_event(nullptr, 1), nullptr);
  EXPECT_EQ(event_producer_prepare_event(producer.get(), 1), nullptr);
  EXPECT_EQ(event_get_inspectable(nullptr), nullptr);
  event_free(nullptr);
  Error error;
  EXPECT_FALSE(event_producer_send_event(producer.get(), nullptr, error.out()));
  EXPECT_TRUE(error.matches(G_IO_ERROR, G_IO_ERROR_INVALID_ARGUMENT));
  EXPECT_FALSE(event_producer_send_event(nullptr, nullptr, nullptr));
}

TEST(EventProducer, SendsWithoutABus) {
  const ProducerPtr producer(event_producer_new("some"));
  const guint32 id = event_producer_declare(producer.get(), port_declaration(1).get());
  const EventPtr event(event_producer_prepare_event(producer.get(), id));
  Error error;
  EXPECT_TRUE(inspectable_set_bool(event_get_inspectable(event.get()), "state", TRUE));
  EXPECT_TRUE(event_producer_send_event(producer.get(), event.get(), error.out()));
  EXPECT_TRUE(event_producer_send_event(producer.get(), event.get(), error.out()));
  EXPECT_FALSE(error);
}

TEST(EventProducer, KeepsOnSendingWhenNobodyWaitsForTheBus) {
  const ProducerPtr producer(event_producer_new("some"));
  const guint32 id = event_producer_declare(producer.get(), port_declaration(1).get());
  for (int i = 0; i < 3000; ++i) {
    ASSERT_TRUE(send_state(producer.get(), id, i % 2 == 0));
  }
}

TEST(Event, HasTheKeysOfItsDeclarationOnly) {
  const ProducerPtr producer(event_producer_new("some"));
  const guint32 id = event_producer_declare(producer.get(), port_declaration(1).get());
  const EventPtr event(event_producer_prepare_event(producer.get(), id));
  auto *inspectable = event_get_inspectable(event.get());
  EXPECT_FALSE(inspectable_set_bool(inspectable, "other", TRUE));
  EXPECT_FALSE(inspectable_set_int(inspectable, "state", 1));
  EXPECT_TRUE(inspectable_set_value_as_string(inspectable, "state", EVENT_KEY_BOOL, "1"));
  EXPECT_FALSE(inspectable_set_nice_names(inspectable, "state", "State", "On"));
}

TEST(Event, OfADeclarationThatIsGoneIsAnError) {
  const ProducerPtr producer(event_producer_new("some"));
  const guint32 id = event_producer_declare(producer.get(), port_declaration(1).get());
  const EventPtr event(event_producer_prepare_event(producer.get(), id));
  event_producer_undeclare(producer.get(), id);
  Error error;
  EXPECT_FALSE(event_producer_send_event(producer.get(), event.get(), error.out()));
  EXPECT_TRUE(error.matches(G_IO_ERROR, G_IO_ERROR_NOT_FOUND));
}

TEST(Event, OfAnotherProducerIsAnError) {
  const ProducerPtr producer(event_producer_new("some"));
  const ProducerPtr other(event_producer_new("other"));
  const guint32 id = event_producer_declare(producer.get(), port_declaration(1).get());
  EXPECT_EQ(event_producer_declare(other.get(), port_declaration(1).get()), id);
  const EventPtr event(event_producer_prepare_event(producer.get(), id));
  Error error;
  EXPECT_FALSE(event_producer_send_event(other.get(), event.get(), error.out()));
  EXPECT_TRUE(error.matches(G_IO_ERROR, G_IO_ERROR_INVALID_ARGUMENT));
}

TEST(Event, DoesNotOutliveItsProducer) {
  EventPtr event;
  {
    const ProducerPtr producer(event_producer_new("some"));
    event.reset(event_producer_prepare_event(
        producer.get(), event_producer_declare(producer.get(), port_declaration(1).get())));
  }
  const ProducerPtr producer(event_producer_new("some"));
  EXPECT_EQ(event_producer_declare(producer.get(), port_declaration(1).get()), 1U);
  EXPECT_FALSE(event_producer_send_event(producer.get(), event.get(), nullptr));
}

TEST(Event, MayNotSendAKeyWithAnotherTypeThanBefore) {
  const ProducerPtr producer(event_producer_new("some"));
  const DeclarationPtr declaration(event_declaration_new_from_type("com.kelv.Event.Some"));
  event_declaration_set_property(declaration.get(), "state", nullptr, nullptr);
  const guint32 id = event_producer_declare(producer.get(), declaration.get());
  const EventPtr first(event_producer_prepare_event(producer.get(), id));
  const EventPtr second(event_producer_prepare_event(producer.get(), id));
  EXPECT_TRUE(inspectable_set_bool(event_get_inspectable(first.get()), "state", TRUE));
  EXPECT_TRUE(inspectable_set_string(event_get_inspectable(second.get()), "state", "open"));
  EXPECT_TRUE(event_producer_send_event(producer.get(), first.get(), nullptr));
  Error error;
  EXPECT_FALSE(event_producer_send_event(producer.get(), second.get(), error.out()));
  EXPECT_TRUE(error.matches(G_IO_ERROR, G_IO_ERROR_INVALID_ARGUMENT));
  EXPECT_TRUE(send_state(producer.get(), id, false));
}

}  // namespace
