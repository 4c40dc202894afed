#include "base/signal-handler.h"

#include <gtest/gtest.h>

namespace {

void count(GObject * /*object*/, GParamSpec * /*property*/, gpointer user_data) {
  ++*static_cast<int *>(user_data);
}

class SignalHandlerTest : public testing::Test {
 protected:
  void touch() { g_object_notify(G_OBJECT(action_.get()), "enabled"); }
  SignalHandler connect() { return {action_.get(), "notify::enabled", G_CALLBACK(count), &calls_}; }

  GObjectPtr<GSimpleAction> action_{g_simple_action_new("any", nullptr)};
  int calls_ = 0;
};

TEST_F(SignalHandlerTest, IsCalledUntilItIsDestroyed) {
  {
    const SignalHandler handler = connect();
    EXPECT_TRUE(handler);
    touch();
  }
  touch();
  EXPECT_EQ(calls_, 1);
}

TEST_F(SignalHandlerTest, IsConnectedOnceAfterAMove) {
  SignalHandler first = connect();
  SignalHandler second = std::move(first);
  touch();
  EXPECT_EQ(calls_, 1);
  second.reset();
  touch();
  EXPECT_EQ(calls_, 1);
}

TEST_F(SignalHandlerTest, DisconnectsWhatItHeldWhenItIsAssignedTo) {
  SignalHandler handler = connect();
  handler = connect();
  touch();
  EXPECT_EQ(calls_, 1);
}

TEST_F(SignalHandlerTest, KeepsItsObjectAlive) {
  SignalHandler handler = connect();
  GSimpleAction *action = action_.get();
  action_.reset();
  g_object_notify(G_OBJECT(action), "enabled");
  EXPECT_EQ(calls_, 1);
}

TEST(SignalHandler, HoldsNothingUntilConnected) {
  SignalHandler handler;
  EXPECT_FALSE(handler);
  handler.reset();
}

}  // namespace
