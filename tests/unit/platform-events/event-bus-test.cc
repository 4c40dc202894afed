// What can be seen of a producer from outside.
#include <gtest/gtest.h>

#include "bus-test.h"
#include "owners.h"
#include "watcher.h"

namespace {

using Texts = std::vector<std::string>;

struct EventBus : testing::Test {
  Watcher watcher{bus_address(), "com.kelv.Event.Producer"};
  ProducerPtr producer{event_producer_new("some")};

  void SetUp() override { ASSERT_TRUE(watcher.wait_for(shared_name(), "some")); }
  std::string list() { return print(watcher.list(shared_name(), "some").get()); }
};

DeclarationPtr described_declaration() {
  DeclarationPtr declaration = port_declaration(3);
  auto *decl = declaration.get();
  event_declaration_add_key(decl, "topic0", EVENT_KEY_STRING);
  event_declaration_add_key(decl, "level", EVENT_KEY_DOUBLE);
  inspectable_set_string(event_declaration_get_inspectable(decl), "topic0", "Device");
  inspectable_set_double(event_declaration_get_inspectable(decl), "level", 0.5);
  event_declaration_set_nice_names(decl, "port", "Port", "Door");
  event_declaration_set_nice_names(decl, "state", "Active", nullptr);
  event_declaration_set_nice_names(decl, "topic0", nullptr, "Input ports");
  event_declaration_set_namespace(decl, "topic0", "tns1");
  event_declaration_set_key_tag(decl, "port", "onvif-source");
  event_declaration_set_key_tag(decl, "state", "onvif-data");
  event_declaration_set_property(decl, "state", nullptr, nullptr);
  return declaration;
}

constexpr const char *kDescribed =
    "(1, {'type': <''>, "
    "'keys': <{'port': <3>, 'state': <false>, 'topic0': <'Device'>, 'level': <0.5>}>, "
    "'namespaces': <{'topic0': 'tns1'}>, "
    "'tags': <{'port': 'onvif-source', 'state': 'onvif-data'}>, "
    "'nice_names': <{'port': ('Port', 'Door'), 'state': ('Active', ''), "
    "'topic0': ('', 'Input ports')}>, "
    "'property': <'state'>})";

TEST_F(EventBus, ListsNothingBeforeTheFirstDeclaration) {
  EXPECT_EQ(list(), "[]");
  EXPECT_EQ(watcher.signals(), Texts{});
}

TEST_F(EventBus, ShowsADeclarationInFull) {
  EXPECT_EQ(event_producer_declare(producer.get(), described_declaration().get()), 1U);
  EXPECT_EQ(list(), std::string("[") + kDescribed + "]");
  EXPECT_EQ(watcher.signals(), Texts{std::string("Declared ") + kDescribed});
}

TEST_F(EventBus, SaysTypesAsTheyAre) {
  event_producer_declare(producer.get(), described_declaration().get());
  const GVariantPtr listed = watcher.list(shared_name(), "some");
  const GVariantPtr entry(g_variant_get_child_value(listed.get(), 0));
  const GVariantPtr described(g_variant_get_child_value(entry.get(), 1));
  const std::pair<const char *, const char *> types[] = {
      {"type", "s"},     {"keys", "a{sv}"},          {"namespaces", "a{ss}"},
      {"tags", "a{ss}"}, {"nice_names", "a{s(ss)}"}, {"property", "s"}};
  for (const auto &[name, type] : types) {
    const GVariantPtr value(g_variant_lookup_value(described.get(), name, G_VARIANT_TYPE(type)));
    EXPECT_TRUE(value) << name;
  }
  const GVariantPtr keys(g_variant_lookup_value(described.get(), "keys", G_VARIANT_TYPE_VARDICT));
  gint32 port = 0;
  EXPECT_TRUE(g_variant_lookup(keys.get(), "port", "i", &port));
}

TEST_F(EventBus, SaysWhatIsSentAndWhatIsGone) {
  const guint32 id = event_producer_declare(producer.get(), port_declaration(3).get());
  EXPECT_TRUE(send_state(producer.get(), id, true));
  EXPECT_TRUE(event_producer_undeclare(producer.get(), id));
  EXPECT_EQ(list(), "[]");
  const Texts heard = watcher.signals();
  ASSERT_EQ(heard.size(), 3U);
  EXPECT_EQ(heard[1], "Sent (1, {'port': <3>, 'state': <true>})");
  EXPECT_EQ(heard[2], "Undeclared (1,)");
}

TEST_F(EventBus, KeepsWhatWasLastSentAsTheCurrentValue) {
  const guint32 id = event_producer_declare(producer.get(), port_declaration(3).get());
  send_state(producer.get(), id, true);
  EXPECT_NE(list().find("'keys': <{'port': <3>, 'state': <true>}>"), std::string::npos) << list();
  const EventPtr event(event_producer_prepare_event(producer.get(), id));
  inspectable_set_int(event_get_inspectable(event.get()), "port", -1);
  EXPECT_TRUE(event_producer_send_event(producer.get(), event.get(), nullptr));
  EXPECT_NE(list().find("'keys': <{'port': <-1>, 'state': <true>}>"), std::string::npos) << list();
  EXPECT_EQ(watcher.signals().back(), "Sent (1, {'port': <-1>, 'state': <true>})");
}

TEST_F(EventBus, ADeclarationIsACopy) {
  const DeclarationPtr declaration = port_declaration(3);
  event_producer_declare(producer.get(), declaration.get());
  inspectable_set_int(event_declaration_get_inspectable(declaration.get()), "port", 4);
  event_producer_declare(producer.get(), declaration.get());
  const std::string listed = list();
  EXPECT_NE(listed.find("(1, {'type': <''>, 'keys': <{'port': <3>"), std::string::npos) << listed;
  EXPECT_NE(listed.find("(2, {'type': <''>, 'keys': <{'port': <4>"), std::string::npos) << listed;
}

TEST_F(EventBus, DeclaresByTypeAndSendsTheFirstState) {
  const DeclarationPtr declaration(event_declaration_new_from_type("com.kelv.Event.Some"));
  auto *inspectable = event_declaration_get_inspectable(declaration.get());
  inspectable_set_nice_names(inspectable, "state", "State", nullptr);
  inspectable_set_value_as_string(inspectable, "port", EVENT_KEY_INT, "7");
  event_declaration_set_property(declaration.get(), "state", nullptr, nullptr);
  const guint32 id = event_producer_declare(producer.get(), declaration.get());
  const EventPtr event(event_producer_prepare_event(producer.get(), id));
  EXPECT_TRUE(inspectable_set_value_as_string(event_get_inspectable(event.get()), "state",
                                              EVENT_KEY_BOOL, "1"));
  EXPECT_TRUE(event_producer_send_event(producer.get(), event.get(), nullptr));
  EXPECT_EQ(list(),
            "[(1, {'type': <'com.kelv.Event.Some'>, 'keys': <{'state': <true>, 'port': <7>}>, "
            "'namespaces': <@a{ss} {}>, 'tags': <@a{ss} {}>, 'nice_names': <{'state': ('State', "
            "'')}>, 'property': <'state'>})]");
  EXPECT_EQ(watcher.signals(),
            (Texts{"Declared (1, {'type': <'com.kelv.Event.Some'>, 'keys': <{'port': <7>}>, "
                   "'namespaces': <@a{ss} {}>, 'tags': <@a{ss} {}>, 'nice_names': <{'state': "
                   "('State', '')}>, 'property': <'state'>})",
                   "Sent (1, {'state': <true>, 'port': <7>})"}));
}

TEST_F(EventBus, EachProducerHasItsObject) {
  const ProducerPtr other(event_producer_new("my-other"));
  event_producer_declare(other.get(), port_declaration(9).get());
  ASSERT_TRUE(watcher.wait_for(shared_name(), "my_2dother"));
  EXPECT_EQ(list(), "[]");
  EXPECT_EQ(watcher.count("Declared"), 1U);
  watcher.for_each([](const Heard &heard) {
    if (heard.what == "Declared") {
      EXPECT_EQ(heard.path, "/com/kelv/Event/my_2dother");
    }
  });
}

TEST_F(EventBus, AProducerThatGoesTakesItsDeclarationsAlong) {
  const ProducerPtr other(event_producer_new("other"));
  ASSERT_TRUE(watcher.wait_for(shared_name(), "other"));
  event_producer_declare(producer.get(), port_declaration(3).get());
  producer.reset();
  EXPECT_EQ(watcher.list(shared_name(), "some"), nullptr);
  EXPECT_EQ(watcher.signals().back(), "Undeclared (1,)");
  EXPECT_NE(watcher.list(shared_name(), "other"), nullptr);
}

// The connection arrives in the main loop, which a start-up reaches last.
TEST_F(EventBus, WhatIsSentBeforeTheObjectIsThereIsHeardInOrder) {
  const ProducerPtr early(event_producer_new("early"));
  const guint32 id = event_producer_declare(early.get(), port_declaration(1).get());
  send_state(early.get(), id, true);
  event_producer_undeclare(early.get(), id);
  ASSERT_TRUE(wait_until([this] { return watcher.count("Undeclared") == 1; }));
  const Texts heard = watcher.signals();
  ASSERT_EQ(heard.size(), 3U);
  EXPECT_EQ(heard[0].substr(0, 9), "Declared ");
  EXPECT_EQ(heard[1], "Sent (1, {'port': <1>, 'state': <true>})");
}

TEST_F(EventBus, WhenTooMuchWaitsTheDeclarationsAreAnnouncedInstead) {
  const ProducerPtr early(event_producer_new("early"));
  const guint32 id = event_producer_declare(early.get(), port_declaration(1).get());
  for (int i = 0; i < 2001; ++i) {
    ASSERT_TRUE(send_state(early.get(), id, i % 2 == 0));
  }
  ASSERT_TRUE(watcher.wait_for(shared_name(), "early"));
  const Texts heard = watcher.signals();
  ASSERT_EQ(heard.size(), 1U);
  EXPECT_NE(heard[0].find("'keys': <{'port': <1>, 'state': <true>}>"), std::string::npos);
}

}  // namespace
