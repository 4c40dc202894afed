// Properties whose value is asked for.
#include <gtest/gtest.h>

#include <atomic>
#include <mutex>
#include <thread>

#include "bus-test.h"
#include "owners.h"
#include "watcher.h"

namespace {

struct Port {
  EventProducer *producer = nullptr;
  guint32 id = 0;
  bool state = false;
  int asked = 0;
};

struct EventProperty : testing::Test {
  Watcher watcher{bus_address(), "com.kelv.Event.Producer"};
  ProducerPtr producer{event_producer_new("some")};
  Port port;

  void SetUp() override {
    port.producer = producer.get();
    ASSERT_TRUE(watcher.wait_for(shared_name(), "some"));
  }
  void declare(EventPropertyCallback callback, gpointer user_data) {
    const DeclarationPtr declaration = port_declaration(3);
    event_declaration_set_property(declaration.get(), "state", callback, user_data);
    port.id = event_producer_declare(producer.get(), declaration.get());
  }
  bool listed_state() {
    const std::string listed = print(watcher.list(shared_name(), "some").get());
    const bool on = listed.find("'state': <true>") != std::string::npos;
    EXPECT_TRUE(on || listed.find("'state': <false>") != std::string::npos) << listed;
    return on;
  }
};

void read_state(Inspectable *values, gpointer user_data) {
  auto *port = static_cast<Port *>(user_data);
  ++port->asked;
  EXPECT_TRUE(inspectable_set_bool(values, "state", port->state));
}

TEST_F(EventProperty, IsAskedWhenDeclaredAndWhenListed) {
  port.state = true;
  declare(read_state, &port);
  EXPECT_EQ(port.asked, 1);
  EXPECT_TRUE(listed_state());
  port.state = false;
  EXPECT_FALSE(listed_state());
  EXPECT_EQ(port.asked, 3);
  EXPECT_NE(watcher.signals()[0].find("'state': <true>"), std::string::npos);
}

TEST_F(EventProperty, IsNotAskedWhenSending) {
  declare(read_state, &port);
  EXPECT_TRUE(send_state(producer.get(), port.id, true));
  const EventPtr event(event_producer_prepare_event(producer.get(), port.id));
  EXPECT_TRUE(event_producer_send_event(producer.get(), event.get(), nullptr));
  EXPECT_EQ(port.asked, 1);
  ASSERT_TRUE(wait_until([this] { return watcher.count("Sent") == 2; }));
  EXPECT_EQ(watcher.signals().back(), "Sent (1, {'port': <3>, 'state': <true>})");
}

TEST_F(EventProperty, AnswersWithoutTouchingWhatWasSent) {
  declare(read_state, &port);
  send_state(producer.get(), port.id, true);
  EXPECT_FALSE(listed_state());
  const EventPtr event(event_producer_prepare_event(producer.get(), port.id));
  event_producer_send_event(producer.get(), event.get(), nullptr);
  listed_state();
  EXPECT_EQ(watcher.signals().back(), "Sent (1, {'port': <3>, 'state': <true>})");
}

TEST_F(EventProperty, ThatSaysNothingKeepsTheLastValue) {
  declare([](Inspectable * /*values*/, gpointer /*user_data*/) {}, nullptr);
  EXPECT_FALSE(listed_state());
  send_state(producer.get(), port.id, true);
  EXPECT_TRUE(listed_state());
}

TEST_F(EventProperty, MaySetOtherKeysButNoUnknownOnes) {
  declare(
      [](Inspectable *values, gpointer /*user_data*/) {
        EXPECT_TRUE(inspectable_set_int(values, "port", 8));
        EXPECT_FALSE(inspectable_set_int(values, "state", 1));
        EXPECT_FALSE(inspectable_set_int(values, "other", 1));
        EXPECT_FALSE(inspectable_set_nice_names(values, "port", "Port", "Door"));
      },
      nullptr);
  const std::string listed = print(watcher.list(shared_name(), "some").get());
  EXPECT_NE(listed.find("'keys': <{'port': <8>, 'state': <false>}>"), std::string::npos) << listed;
}

TEST_F(EventProperty, MayCallBackIntoTheLibrary) {
  declare(
      [](Inspectable *values, gpointer user_data) {
        auto *asked = static_cast<Port *>(user_data);
        const guint32 id = event_producer_declare(asked->producer, port_declaration(5).get());
        EXPECT_TRUE(send_state(asked->producer, id, true));
        EXPECT_TRUE(event_producer_undeclare(asked->producer, id));
        inspectable_set_bool(values, "state", TRUE);
      },
      &port);
  EXPECT_TRUE(listed_state());
  EXPECT_EQ(watcher.count("Undeclared"), 2U);
}

// Of an answer and an event that overtakes it, the event is the newer.
TEST_F(EventProperty, AnEventThatIsSentMeanwhileOverridesTheAnswer) {
  declare(
      [](Inspectable *values, gpointer user_data) {
        auto *asked = static_cast<Port *>(user_data);
        inspectable_set_bool(values, "state", FALSE);
        send_state(asked->producer, asked->id, true);
      },
      &port);
  EXPECT_TRUE(listed_state());
}

TEST_F(EventProperty, MayWithdrawItsDeclaration) {
  declare(
      [](Inspectable * /*values*/, gpointer user_data) {
        auto *asked = static_cast<Port *>(user_data);
        event_producer_undeclare(asked->producer, asked->id);
      },
      &port);
  EXPECT_EQ(print(watcher.list(shared_name(), "some").get()), "[]");
}

// A sender that holds a lock which the callback wants must get through while List is under way.
TEST_F(EventProperty, AnotherThreadMaySendUnderALockThatTheCallbackTakes) {
  struct Shared {
    std::mutex registry;
    std::atomic<bool> asking = false;
  } shared;
  declare(
      [](Inspectable *values, gpointer user_data) {
        auto *held = static_cast<Shared *>(user_data);
        held->asking = true;
        held->asking.notify_all();
        const std::lock_guard guard(held->registry);
        inspectable_set_bool(values, "state", TRUE);
      },
      &shared);
  shared.asking = false;
  std::atomic<bool> locked = false;
  std::thread sender([&] {
    const std::lock_guard guard(shared.registry);
    locked = true;
    locked.notify_all();
    shared.asking.wait(false);
    EXPECT_TRUE(send_state(producer.get(), port.id, false));
  });
  locked.wait(false);
  const bool state = listed_state();
  sender.join();
  EXPECT_FALSE(state);
}

}  // namespace
