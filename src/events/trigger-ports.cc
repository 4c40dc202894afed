#include "events/trigger-ports.h"

#include <algorithm>
#include <cstdint>
#include <string>
#include <utility>
#include <vector>

#include "port/ioport.h"
#include "port/port-registry.h"

namespace {

constexpr int kFirstChannel = 1;
constexpr const char *kEventName = "com.kelv.Event.Pcd.ManualTrigger";

struct Triggers {
  bool enabled = false;
  int first_virtual_port = 0;
  std::vector<int> enabled_channels;  // in the order added
  PtzState ptz_state = PtzState::kUnknown;
};

Triggers &triggers() {
  static Triggers instance;
  return instance;
}

std::string port_id(int channel) {
  return "manualtrigger" + std::to_string(channel);
}

// Numbers wrap as those of the hardware description do.
int port_number(int channel) {
  const auto first = static_cast<std::uint32_t>(triggers().first_virtual_port);
  return static_cast<int>(first + static_cast<std::uint32_t>(channel) - 1U);
}

IoEventKey event_key(const char *name, std::string value, const char *type) {
  IoEventKey key;
  key.name = name;
  key.value = std::move(value);
  key.type = type;
  return key;
}

IoEvent trigger_event(int channel) {
  IoEvent event;
  event.name = kEventName;
  event.keys.push_front(event_key("port", std::to_string(channel), "int"));
  event.keys.push_front(event_key("state", "PORT_STATUS", "bool"));
  event.keys.front().property = true;
  return event;
}

IOPortRef manual_trigger_port_new(int channel) {
  IOPortRef port(io_port_new());
  io_port_set_type(port.get(), PORT_OUTPUT);
  io_port_set_number(port.get(), port_number(channel));
  io_port_set_id(port.get(), port_id(channel));
  io_port_set_events_enabled(port.get(), false);
  io_port_set_backend(port.get(), BACKEND_VIRTUAL);
  io_port_set_flag(port.get(), "virtual", "true");
  io_port_events(port.get()).push_front(trigger_event(channel));
  io_port_setup(port.get());
  return port;
}

// Without camera control, what a trigger was when it was made is what it stays.
void manual_trigger_apply(int channel, bool on, PtzState ptz_state) {
  if (const IOPortRef found = port_registry_get_by_id(port_id(channel))) {
    if (ptz_state != PtzState::kDisabled) {
      io_port_set_events_enabled(found.get(), on);
    }
    return;
  }
  const IOPortRef made = manual_trigger_port_new(channel);
  io_port_set_events_enabled(made.get(), on);
  port_registry_add(made.get());
}

void mark_channel(std::vector<int> &channels, int channel, bool enabled) {
  const auto place = std::find(channels.begin(), channels.end(), channel);
  if (enabled && place == channels.end()) {
    channels.push_back(channel);
  } else if (!enabled && place != channels.end()) {
    channels.erase(place);
  }
}

}  // namespace

void manual_trigger_configure(int first_virtual_port) {
  triggers().enabled = true;
  triggers().first_virtual_port = first_virtual_port;
}

bool manual_triggers_enabled() {
  return triggers().enabled;
}

void manual_trigger_set_channel(int channel, bool enabled) {
  mark_channel(triggers().enabled_channels, channel, enabled);
  const PtzState ptz_state = triggers().ptz_state;
  const bool on = ptz_state == PtzState::kDisabled ? channel == kFirstChannel : enabled;
  manual_trigger_apply(channel, on, ptz_state);
}

void manual_trigger_set_ptz(PtzState state) {
  triggers().ptz_state = state;
  const std::vector<int> channels = triggers().enabled_channels;
  if (state == PtzState::kDisabled || channels.empty()) {
    manual_trigger_set_channel(kFirstChannel, true);
    return;
  }
  for (const int channel : channels) {
    manual_trigger_apply(channel, true, state);
  }
}

void manual_trigger_store_ptz(PtzState state) {
  triggers().ptz_state = state;
}

void manual_trigger_remove_channel(int channel) {
  mark_channel(triggers().enabled_channels, channel, false);
  const IOPortRef port = port_registry_get_by_id(port_id(channel));
  if (!port) {
    return;
  }
  port_registry_remove_by_id(port_id(channel));
  io_port_drop(port.get());  // its sequence ends now, not when the last step has passed
  io_port_set_events_enabled(port.get(), false);
}

void manual_trigger_clear() {
  const std::vector<int> channels = std::exchange(triggers().enabled_channels, {});
  const PtzState ptz_state = triggers().ptz_state;
  for (const int channel : channels) {
    manual_trigger_apply(channel, false, ptz_state);
  }
}
