// Many threads at once, and a listener who must be able to make sense of what it hears.
#include <gtest/gtest.h>

#include <atomic>
#include <map>
#include <set>
#include <thread>

#include "bus-test.h"
#include "owners.h"
#include "watcher.h"

namespace {

constexpr int kThreads = 4;
constexpr int kRounds = 100;

std::atomic<int> the_last_round = 0;

void read_round(Inspectable *values, gpointer /*user_data*/) {
  inspectable_set_int(values, "round", the_last_round);
}

DeclarationPtr round_declaration() {
  DeclarationPtr declaration(event_declaration_new());
  event_declaration_add_key(declaration.get(), "thread", EVENT_KEY_INT);
  event_declaration_add_key(declaration.get(), "round", EVENT_KEY_INT);
  event_declaration_set_property(declaration.get(), "round", read_round, nullptr);
  return declaration;
}

void send_round(EventProducer *producer, guint32 id, int thread, int round) {
  const EventPtr event(event_producer_prepare_event(producer, id));
  auto *inspectable = event_get_inspectable(event.get());
  EXPECT_TRUE(inspectable_set_int(inspectable, "thread", thread));
  EXPECT_TRUE(inspectable_set_int(inspectable, "round", round));
  EXPECT_TRUE(event_producer_send_event(producer, event.get(), nullptr));
}

// Each round declares, sends on the new declaration and on the one that all threads share, and
// withdraws three declarations out of four.
void work(EventProducer *producer, guint32 shared, int thread) {
  const DeclarationPtr declaration = round_declaration();
  for (int round = 1; round <= kRounds; ++round) {
    the_last_round = round;
    const guint32 id = event_producer_declare(producer, declaration.get());
    send_round(producer, id, thread, round);
    send_round(producer, shared, thread, round);
    if (round % 4 != 0) {
      EXPECT_TRUE(event_producer_undeclare(producer, id));
    }
  }
}

// Follows the declarations as a listener would.
class Follower {
 public:
  explicit Follower(guint32 shared) : shared_(shared) {}

  void hear(const Heard &heard) {
    if (heard.what == "Reply") {
      EXPECT_EQ(ids_of(heard.value.get()), live_);
      ++lists_;
      return;
    }
    guint32 id = 0;
    g_variant_get_child(heard.value.get(), 0, "u", &id);
    if (heard.what == "Declared") {
      EXPECT_TRUE(live_.insert(id).second) << id;
    } else if (heard.what == "Undeclared") {
      EXPECT_EQ(live_.erase(id), 1U) << id;
    } else {
      hear_sent(id, heard.value.get());
    }
  }
  std::size_t live() const { return live_.size(); }
  int lists() const { return lists_; }
  const std::map<gint32, gint32> &rounds() const { return rounds_; }

 private:
  static std::set<guint32> ids_of(GVariant *reply) {
    std::set<guint32> ids;
    const GVariantPtr listed(g_variant_get_child_value(reply, 0));
    for (gsize i = 0; i < g_variant_n_children(listed.get()); ++i) {
      const GVariantPtr entry(g_variant_get_child_value(listed.get(), i));
      guint32 id = 0;
      g_variant_get_child(entry.get(), 0, "u", &id);
      ids.insert(id);
    }
    return ids;
  }

  void hear_sent(guint32 id, GVariant *value) {
    EXPECT_TRUE(live_.contains(id)) << id;
    if (id != shared_) {
      return;
    }
    const GVariantPtr keys(g_variant_get_child_value(value, 1));
    gint32 thread = 0;
    gint32 round = 0;
    EXPECT_TRUE(g_variant_lookup(keys.get(), "thread", "i", &thread));
    EXPECT_TRUE(g_variant_lookup(keys.get(), "round", "i", &round));
    EXPECT_EQ(round, rounds_[thread] + 1) << "of thread " << thread;
    rounds_[thread] = round;
  }

  guint32 shared_;
  std::set<guint32> live_;
  std::map<gint32, gint32> rounds_;
  int lists_ = 0;
};

TEST(EventStress, WhatIsHeardIsInOrderAndWhole) {
  Watcher watcher(bus_address(), "com.kelv.Event.Producer");
  const ProducerPtr producer(event_producer_new("some"));
  const guint32 shared = event_producer_declare(producer.get(), round_declaration().get());
  ASSERT_TRUE(watcher.wait_for(shared_name(), "some"));

  std::atomic<int> working = kThreads;
  std::vector<std::thread> threads;
  threads.reserve(kThreads);
  for (int thread = 0; thread < kThreads; ++thread) {
    threads.emplace_back([&, thread] {
      work(producer.get(), shared, thread);
      --working;
    });
  }
  while (working > 0) {
    EXPECT_NE(watcher.list(shared_name(), "some"), nullptr);
  }
  for (auto &thread : threads) {
    thread.join();
  }
  EXPECT_NE(watcher.list(shared_name(), "some"), nullptr);

  Follower follower(shared);
  watcher.for_each([&follower](const Heard &heard) { follower.hear(heard); });
  EXPECT_EQ(follower.live(), 1U + kThreads * (kRounds / 4));
  EXPECT_GE(follower.lists(), 2);
  ASSERT_EQ(follower.rounds().size(), static_cast<std::size_t>(kThreads));
  for (const auto &[thread, round] : follower.rounds()) {
    EXPECT_EQ(round, kRounds) << "of thread " << thread;
  }
}

TEST(EventStress, ProducersComeAndGoInManyThreads) {
  std::vector<std::thread> threads;
  threads.reserve(kThreads);
  for (int thread = 0; thread < kThreads; ++thread) {
    threads.emplace_back([thread] {
      for (int round = 0; round < kRounds; ++round) {
        const ProducerPtr producer(event_producer_new(round % 2 == 0 ? "even" : "odd"));
        const guint32 id = event_producer_declare(producer.get(), round_declaration().get());
        send_round(producer.get(), id, thread, round);
        EXPECT_TRUE(event_producer_undeclare(producer.get(), id));
      }
    });
  }
  std::atomic<bool> joined = false;
  std::thread joiner([&] {
    for (auto &thread : threads) {
      thread.join();
    }
    joined = true;
    g_main_context_wakeup(nullptr);
  });
  EXPECT_TRUE(wait_until([&joined] { return joined.load(); }));
  joiner.join();
}

}  // namespace
