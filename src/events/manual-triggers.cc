#include "events/manual-triggers.h"

#include <forward_list>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>

#include "base/bus-watch.h"
#include "base/glib-ptr.h"
#include "base/log.h"
#include "base/main-queue.h"
#include "base/worker.h"
#include "events/trigger-ports.h"

namespace {

constexpr const char *kStreamer = "com.kelv.Streamer";
constexpr const char *kChannelRoot = "/com/kelv/Streamer/Video/Channel";
constexpr const char *kChannelInterface = "com.kelv.Streamer.Video.Channel";
constexpr const char *kCoordinator = "com.kelv.PTZ.Coordinator";
constexpr const char *kCoordinatorObject = "/com/kelv/PTZ/Coordinator/1";

// A streamer that has an answer for every path must not be searched for good.
constexpr int kMaxChannels = 1024;
// A service that has said nothing by then does not answer.
constexpr gint64 kCallLimitUs = 25'000'000;
constexpr unsigned kDecimal = 10;

struct Channel {
  int number;
  bool followed;  // it has said whether it is enabled, so it will say when that changes
};

// One of the two services. An answer, or its absence, counts for the owner that was asked.
struct Service {
  explicit Service(const char *thread) : worker(thread) {}

  Worker worker;
  std::unique_ptr<OwnerWatch> watch;
  SignalSubscription signals;
  unsigned owner = 0;  // counts them
};

// The coordinator's word is needed to judge the first channel, so the streamer is looked at after
// it, and the word is acted on when all channels are known.
enum class Phase { kWaitsForCoordinator, kWaitsForStreamer, kFollowsBoth };

struct Monitors {
  Phase phase = Phase::kWaitsForCoordinator;
  Service coordinator{"PTZ coordinator"};
  bool ptz_heard = false;  // of this owner, by signal: newer than its answer
  PtzState ptz_state = PTZ_UNKNOWN;
  Service streamer{"Streamer"};
  std::forward_list<Channel> channels;
  std::map<int, bool> heard;  // by signal, of channels that are not known yet
};

// None before the start and after the stop.
std::unique_ptr<Monitors> monitors;

// --- Asking a service, on its worker's thread ---

// Making it asks for all properties. Null, with a message, when there is no bus.
GObjectPtr<GDBusProxy> make_proxy(const char *service, const char *object, const char *interface,
                                  GCancellable *cancellable) {
  Error error;
  GObjectPtr<GDBusProxy> proxy(
      g_dbus_proxy_new_for_bus_sync(G_BUS_TYPE_SYSTEM, G_DBUS_PROXY_FLAGS_NONE, nullptr, service,
                                    object, interface, cancellable, error.out()));
  if (!proxy && !g_cancellable_is_cancelled(cancellable)) {
    log_warning("Error creating proxy: %s\n", error.message());
  }
  return proxy;
}

// Unset when the property is missing or not a boolean.
std::optional<bool> cached_boolean(GDBusProxy *proxy, const char *property) {
  const GVariantPtr value(g_dbus_proxy_get_cached_property(proxy, property));
  if (!value) {
    return std::nullopt;
  }
  if (!g_variant_is_of_type(value.get(), G_VARIANT_TYPE_BOOLEAN)) {
    log_warning("%s has a property %s that is not a boolean", g_dbus_proxy_get_object_path(proxy),
                property);
    return std::nullopt;
  }
  return g_variant_get_boolean(value.get());
}

// What it was asked, and what it says by signal, no longer counts.
void forget_owner(Service &service) {
  service.worker.cancel();
  service.signals.reset();
  ++service.owner;
}

// Hands an answer to the main loop, which takes it if it comes from the present owner.
void answer(Service Monitors::*service, unsigned owner, GCancellable *cancellable,
            std::function<void()> take) {
  if (g_cancellable_is_cancelled(cancellable)) {
    return;
  }
  post_to_main_loop([=, take = std::move(take)] {
    if (monitors && ((*monitors).*service).owner == owner) {
      take();
    }
  });
}

void warn_without_bus(GDBusConnection *connection) {
  if (!connection) {
    log_warning("Error creating proxy: %s\n", "there is no system bus");
  }
}

// --- The streamer and its channels ---

Channel *find_channel(int number) {
  for (auto &channel : monitors->channels) {
    if (channel.number == number) {
      return &channel;
    }
  }
  return nullptr;
}

// 0: not the path of a channel.
int channel_number(const char *object_path) {
  const std::string prefix = std::string(kChannelRoot) + '/';
  guint64 number = 0;
  if (!g_str_has_prefix(object_path, prefix.c_str()) ||
      !g_ascii_string_to_unsigned(object_path + prefix.size(), kDecimal, 1, kMaxChannels, &number,
                                  nullptr)) {
    return 0;
  }
  return static_cast<int>(number);
}

void on_enabled_changed(const char *object_path, GVariant *parameters) {
  const int number = channel_number(object_path);
  if (number == 0 || !g_variant_is_of_type(parameters, G_VARIANT_TYPE("(b)"))) {
    return;
  }
  gboolean enabled = FALSE;
  g_variant_get(parameters, "(b)", &enabled);
  if (const Channel *channel = find_channel(number)) {
    if (channel->followed) {
      manual_trigger_set_channel(number, enabled);
    }
  } else {
    monitors->heard[number] = enabled;
  }
}

// A signal that came before the answer was not older than it, or says the same.
void adopt_channel(int number, std::optional<bool> enabled) {
  const auto heard = monitors->heard.extract(number);
  monitors->channels.push_front({number, enabled.has_value()});
  if (enabled && !heard.empty()) {
    enabled = heard.mapped();
  }
  manual_trigger_set_channel(number, enabled.value_or(true));
}

void drop_channels() {
  for (const auto &channel : monitors->channels) {
    manual_trigger_remove_channel(channel.number);
  }
  monitors->channels.clear();
  monitors->heard.clear();
}

void streamer_is_known() {
  if (monitors->phase == Phase::kWaitsForStreamer) {
    monitors->phase = Phase::kFollowsBoth;
    manual_trigger_set_ptz(monitors->ptz_state);
  }
}

// False: there is no such channel.
bool ask_channel(int number, unsigned owner, GCancellable *cancellable) {
  const std::string object = std::string(kChannelRoot) + '/' + std::to_string(number);
  const gint64 begun = g_get_monotonic_time();
  const auto proxy = make_proxy(kStreamer, object.c_str(), kChannelInterface, cancellable);
  if (!proxy) {
    return false;
  }
  if (!GStrvPtr(g_dbus_proxy_get_cached_property_names(proxy.get()))) {
    if (g_get_monotonic_time() - begun >= kCallLimitUs) {
      log_warning("The streamer does not answer; its channels wait until it is started anew");
    }
    return false;
  }
  const auto enabled = cached_boolean(proxy.get(), "Enabled");
  answer(&Monitors::streamer, owner, cancellable, [=] { adopt_channel(number, enabled); });
  return true;
}

void scan_channels(unsigned owner, GCancellable *cancellable) {
  int number = 1;
  while (number <= kMaxChannels && ask_channel(number, owner, cancellable)) {
    ++number;
  }
  if (number > kMaxChannels) {
    log_warning("The streamer has too many channels; stopping after channel %d", kMaxChannels);
  }
  answer(&Monitors::streamer, owner, cancellable, streamer_is_known);
}

void on_streamer_owner(GDBusConnection *connection, const std::string &owner) {
  Service &streamer = monitors->streamer;
  forget_owner(streamer);
  if (!monitors->channels.empty()) {
    streamer_is_known();  // as far as it was searched
  }
  drop_channels();
  if (owner.empty()) {
    warn_without_bus(connection);
    streamer_is_known();
    return;
  }
  streamer.signals = SignalSubscription(connection, owner, kChannelInterface, "EnabledChanged",
                                        on_enabled_changed);
  streamer.worker.queue(
      [count = streamer.owner](GCancellable *cancellable) { scan_channels(count, cancellable); });
}

// --- The camera-control coordinator ---

PtzState state_for(bool enabled) {
  return enabled ? PTZ_ENABLED : PTZ_DISABLED;
}

void take_ptz(PtzState state) {
  monitors->ptz_state = state;
  if (monitors->phase == Phase::kFollowsBoth) {
    manual_trigger_set_ptz(state);
    return;
  }
  manual_trigger_expect_ptz(state);
  if (monitors->phase == Phase::kWaitsForCoordinator) {
    monitors->phase = Phase::kWaitsForStreamer;
    monitors->streamer.watch = std::make_unique<OwnerWatch>(kStreamer, on_streamer_owner);
  }
}

void on_ptz_enabled_changed(const char *object_path, GVariant *parameters) {
  if (!g_str_equal(object_path, kCoordinatorObject) ||
      !g_variant_is_of_type(parameters, G_VARIANT_TYPE("(ib)"))) {
    return;
  }
  gint32 unused = 0;
  gboolean enabled = FALSE;
  g_variant_get(parameters, "(ib)", &unused, &enabled);
  monitors->ptz_heard = true;
  take_ptz(state_for(enabled));
}

void ask_ptz(unsigned owner, GCancellable *cancellable) {
  const auto proxy = make_proxy(kCoordinator, kCoordinatorObject, kCoordinator, cancellable);
  const auto enabled = proxy ? cached_boolean(proxy.get(), "PTZEnabled") : std::nullopt;
  answer(&Monitors::coordinator, owner, cancellable, [=] {
    if (!monitors->ptz_heard) {
      take_ptz(enabled ? state_for(*enabled) : PTZ_UNKNOWN);
    }
  });
}

void on_coordinator_owner(GDBusConnection *connection, const std::string &owner) {
  Service &coordinator = monitors->coordinator;
  forget_owner(coordinator);
  monitors->ptz_heard = false;
  if (owner.empty()) {
    warn_without_bus(connection);
    take_ptz(PTZ_UNKNOWN);
    return;
  }
  coordinator.signals = SignalSubscription(connection, owner, kCoordinator, "PtzEnabledChanged",
                                           on_ptz_enabled_changed);
  coordinator.worker.queue(
      [count = coordinator.owner](GCancellable *cancellable) { ask_ptz(count, cancellable); });
}

}  // namespace

void manual_trigger_start() {
  if (manual_triggers_enabled()) {
    monitors = std::make_unique<Monitors>();
    monitors->coordinator.watch = std::make_unique<OwnerWatch>(kCoordinator, on_coordinator_owner);
  }
}

void manual_trigger_stop() {
  monitors.reset();
}
