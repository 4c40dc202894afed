// Which manual triggers exist and which of them are declared, for everything that the streamer and
// the camera control can say.
#include "events/trigger-ports.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <vector>

#include "daemon/backends.h"
#include "port/ioport-private.h"
#include "port/port-listener.h"
#include "port/port-registry.h"

namespace {

constexpr int kFirst = 20;
constexpr int kChannels = 5;
constexpr const char *kEvent = "com.kelv.Event.Pcd.ManualTrigger";

bool declare(IOPort * /*port*/, IoEvent *event) {
  event->id = 1;
  // An event library may ask about ports at once: none of the locks may be held here.
  EXPECT_TRUE(manual_triggers_enabled());
  (void)port_registry_any_port_active();
  return true;
}

void undeclare(IoEvent *event) {
  event->id = 0;
  EXPECT_TRUE(manual_triggers_enabled());
  (void)port_registry_any_port_active();
}

class TriggerPorts : public testing::Test {
 protected:
  void SetUp() override {
    backends_register();
    port_listener().declare_event = declare;
    port_listener().undeclare_event = undeclare;
    manual_trigger_configure(kFirst);
    manual_trigger_store_ptz(PtzState::kUnknown);
  }
  void TearDown() override {
    manual_trigger_clear();
    port_registry_drop_all();
    port_listener() = {};
  }

  static IOPortRef find(int channel) {
    return port_registry_get_by_id("manualtrigger" + std::to_string(channel));
  }
  static bool exists(int channel) { return find(channel) != nullptr; }
  static bool declared(int channel) {
    const IOPortRef port = find(channel);
    return port && io_port_events(port.get()).front().id != 0;
  }
  static std::vector<int> declared_channels() {
    std::vector<int> channels;
    for (int channel = 1; channel <= kChannels; ++channel) {
      if (declared(channel)) {
        channels.push_back(channel);
      }
    }
    return channels;
  }
};

using Channels = std::vector<int>;

TEST_F(TriggerPorts, MakesAVirtualOutputWithOneEvent) {
  manual_trigger_set_channel(2, true);
  const IOPortRef port = find(2);
  ASSERT_TRUE(port);
  EXPECT_EQ(io_port_get_number(port.get()), kFirst + 1);
  EXPECT_EQ(io_port_get_type(port.get()), PORT_OUTPUT);
  EXPECT_EQ(port->backend, 0);
  EXPECT_TRUE(io_port_is_set_up(port.get()));
  EXPECT_EQ(io_port_get_flags(port.get()),
            (std::vector<std::pair<std::string, bool>>{{"virtual", true}}));
  ASSERT_EQ(io_port_events(port.get()).size(), 1U);
  const IoEvent &event = io_port_events(port.get()).front();
  EXPECT_EQ(event.name, kEvent);
  EXPECT_TRUE(event.input && event.output);
  EXPECT_FALSE(event.supervised_input || event.declare_only);
}

TEST_F(TriggerPorts, NamesTheChannelAndTheStateInTheEvent) {
  manual_trigger_set_channel(3, true);
  const auto &keys = io_port_events(find(3).get()).front().keys;
  ASSERT_EQ(keys.size(), 2U);
  EXPECT_EQ(keys.front().name, "state");
  EXPECT_EQ(keys.front().value, "PORT_STATUS");
  EXPECT_EQ(keys.front().type, "bool");
  EXPECT_TRUE(keys.front().property);
  EXPECT_EQ(keys.back().name, "port");
  EXPECT_EQ(keys.back().value, "3");
  EXPECT_EQ(keys.back().type, "int");
  EXPECT_FALSE(keys.back().property);
}

TEST_F(TriggerPorts, WrapsPortNumbersBeyondTheRange) {
  manual_trigger_configure(G_MAXINT32);
  manual_trigger_set_channel(2, true);
  EXPECT_EQ(io_port_get_number(find(2).get()), G_MININT32);
}

// What set_channel() does with a channel that has no port yet, and with one whose event is declared
// or not, for each state of the camera control.
struct Decision {
  PtzState ptz;
  int channel;
  bool enabled;
  bool declared_when_new;
  bool declared_when_it_was;
  bool declared_when_it_was_not;
};

std::string describe(const Decision &decision) {
  return "ptz " + std::to_string(static_cast<int>(decision.ptz)) + " channel " +
         std::to_string(decision.channel) + (decision.enabled ? " enabled" : " disabled");
}

constexpr Decision kDecisions[] = {
    {PtzState::kDisabled, 1, true, true, true, false},
    {PtzState::kDisabled, 1, false, true, true, false},
    {PtzState::kDisabled, 2, true, false, true, false},
    {PtzState::kDisabled, 2, false, false, true, false},
    {PtzState::kEnabled, 1, true, true, true, true},
    {PtzState::kEnabled, 1, false, false, false, false},
    {PtzState::kEnabled, 2, true, true, true, true},
    {PtzState::kEnabled, 2, false, false, false, false},
    {PtzState::kUnknown, 1, true, true, true, true},
    {PtzState::kUnknown, 1, false, false, false, false},
    {PtzState::kUnknown, 2, true, true, true, true},
    {PtzState::kUnknown, 2, false, false, false, false},
};

TEST_F(TriggerPorts, DecidesForAChannelThatIsNew) {
  for (const auto &decision : kDecisions) {
    SCOPED_TRACE(describe(decision));
    manual_trigger_store_ptz(decision.ptz);
    manual_trigger_set_channel(decision.channel, decision.enabled);
    EXPECT_TRUE(exists(decision.channel));
    EXPECT_EQ(declared(decision.channel), decision.declared_when_new);
    manual_trigger_remove_channel(decision.channel);
  }
}

TEST_F(TriggerPorts, DecidesForAChannelThatHasItsPort) {
  for (const bool was_declared : {true, false}) {
    for (const auto &decision : kDecisions) {
      SCOPED_TRACE(describe(decision) + (was_declared ? ", declared" : ", not declared"));
      manual_trigger_store_ptz(PtzState::kUnknown);
      manual_trigger_set_channel(decision.channel, was_declared);
      manual_trigger_store_ptz(decision.ptz);
      manual_trigger_set_channel(decision.channel, decision.enabled);
      EXPECT_EQ(declared(decision.channel),
                was_declared ? decision.declared_when_it_was : decision.declared_when_it_was_not);
      manual_trigger_remove_channel(decision.channel);
    }
  }
}

TEST_F(TriggerPorts, MakesOnePortForAChannelHoweverOftenItIsEnabled) {
  manual_trigger_set_channel(1, true);
  manual_trigger_set_channel(1, true);
  manual_trigger_set_channel(1, false);
  manual_trigger_set_channel(1, true);
  EXPECT_EQ(port_registry_count(), 1U);
  EXPECT_EQ(declared_channels(), Channels({1}));
}

TEST_F(TriggerPorts, GivesTheFirstChannelATriggerWhenThereIsNoOther) {
  manual_trigger_set_ptz(PtzState::kEnabled);
  EXPECT_EQ(declared_channels(), Channels({1}));
  EXPECT_EQ(port_registry_count(), 1U);
}

TEST_F(TriggerPorts, DeclaresAllEnabledChannelsWhenCameraControlIsSwitchedOn) {
  manual_trigger_set_ptz(PtzState::kDisabled);
  for (const int channel : {1, 2, 3}) {
    manual_trigger_set_channel(channel, true);
  }
  EXPECT_EQ(declared_channels(), Channels({1}));
  manual_trigger_set_ptz(PtzState::kEnabled);
  EXPECT_EQ(declared_channels(), Channels({1, 2, 3}));
}

TEST_F(TriggerPorts, KeepsWhatIsDeclaredWhenCameraControlIsSwitchedOff) {
  manual_trigger_set_ptz(PtzState::kEnabled);
  manual_trigger_set_channel(2, true);
  manual_trigger_set_ptz(PtzState::kDisabled);
  EXPECT_EQ(declared_channels(), Channels({1, 2}));
}

TEST_F(TriggerPorts, LeavesDisabledChannelsOutWhenCameraControlIsSwitchedOn) {
  manual_trigger_set_ptz(PtzState::kDisabled);
  manual_trigger_set_channel(2, true);
  manual_trigger_set_channel(3, false);
  manual_trigger_set_ptz(PtzState::kEnabled);
  EXPECT_EQ(declared_channels(), Channels({1, 2}));
}

TEST_F(TriggerPorts, ForgetsAChannelThatIsGone) {
  manual_trigger_set_channel(1, true);
  manual_trigger_set_channel(2, true);
  manual_trigger_remove_channel(2);
  EXPECT_FALSE(exists(2));
  manual_trigger_set_ptz(PtzState::kEnabled);
  EXPECT_FALSE(exists(2));
  EXPECT_EQ(declared_channels(), Channels({1}));
}

TEST_F(TriggerPorts, WithdrawsTheEventOfAChannelThatIsGoneWhoeverHoldsThePort) {
  manual_trigger_set_channel(2, true);
  const IOPortRef held = find(2);
  manual_trigger_remove_channel(2);
  EXPECT_EQ(io_port_events(held.get()).front().id, 0U);
  EXPECT_FALSE(io_port_events_enabled(held.get()));
}

TEST_F(TriggerPorts, RemovesAChannelThatWasNeverMade) {
  manual_trigger_remove_channel(4);
  EXPECT_EQ(port_registry_count(), 0U);
}

TEST_F(TriggerPorts, MakesTheSamePortsAgainManyTimes) {
  manual_trigger_store_ptz(PtzState::kEnabled);
  for (int round = 0; round < 100; ++round) {
    manual_trigger_set_channel(1, true);
    manual_trigger_set_channel(2, false);
    manual_trigger_set_channel(3, true);
    ASSERT_EQ(declared_channels(), Channels({1, 3}));
    ASSERT_EQ(port_registry_count(), 3U);
    for (const int channel : {3, 2, 1}) {
      manual_trigger_remove_channel(channel);
    }
    ASSERT_EQ(port_registry_count(), 0U);
  }
}

TEST_F(TriggerPorts, WithdrawsAllEventsWhenCleared) {
  manual_trigger_set_ptz(PtzState::kEnabled);
  manual_trigger_set_channel(2, true);
  manual_trigger_clear();
  EXPECT_EQ(declared_channels(), Channels({}));
  EXPECT_TRUE(exists(2));
}

}  // namespace
