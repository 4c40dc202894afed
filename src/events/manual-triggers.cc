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

// Limits the search in a streamer that answers for every path.
constexpr int kMaxChannels = 1024;
// After this time a service counts as not answering.
constexpr gint64 kCallLimitUs = 25'000'000;
constexpr unsigned kDecimal = 10;

struct Channel {
  int number;
  bool followed;  // has the property "Enabled", so it signals its changes
};

// One of the two services. An answer, or its absence, counts for the owner that was asked.
struct Service {
  explicit Service(const char *thread) : worker(thread) {}

  Worker worker;
  std::unique_ptr<OwnerWatch> watch;
  SignalSubscription signals;
  unsigned owner = 0;  // counts them
};

// The coordinator's state is needed for the first channel, so the streamer is queried after it, and
// the state is applied when all channels are known.
enum class Phase { kWaitsForCoordinator, kWaitsForStreamer, kFollowsBoth };

struct Monitors {
  Phase phase = Phase::kWaitsForCoordinator;
  Service coordinator{"PTZ coordinator"};
  bool ptz_signalled = false;  // of this owner, by signal: newer than its answer
  PtzState ptz_state = PtzState::kUnknown;
  Service streamer{"Streamer"};
  std::forward_list<Channel> channels;
  std::map<int, bool> signalled;  // by signal, of channels that are not known yet
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

// Pending queries and signals of the earlier owner no longer count.
void reset_owner(Service &service) {
  service.worker.cancel();
  service.signals.reset();
  ++service.owner;
}

// Posts an answer to the main loop, where it counts if it comes from the present owner.
void post_answer(Service Monitors::*service, unsigned owner, GCancellable *cancellable,
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
    monitors->signalled[number] = enabled;
  }
}

// A signal that came before the answer is newer, or says the same.
void add_channel(int number, std::optional<bool> enabled) {
  const auto signalled = monitors->signalled.extract(number);
  monitors->channels.push_front({number, enabled.has_value()});
  if (enabled && !signalled.empty()) {
    enabled = signalled.mapped();
  }
  manual_trigger_set_channel(number, enabled.value_or(true));
}

void drop_channels() {
  for (const auto &channel : monitors->channels) {
    manual_trigger_remove_channel(channel.number);
  }
  monitors->channels.clear();
  monitors->signalled.clear();
}

void on_streamer_known() {
  if (monitors->phase == Phase::kWaitsForStreamer) {
    monitors->phase = Phase::kFollowsBoth;
    manual_trigger_set_ptz(monitors->ptz_state);
  }
}

// False: there is no such channel.
bool query_channel(int number, unsigned owner, GCancellable *cancellable) {
  const std::string object = std::string(kChannelRoot) + '/' + std::to_string(number);
  const gint64 begun = g_get_monotonic_time();
  const auto proxy = make_proxy(kStreamer, object.c_str(), kChannelInterface, cancellable);
  if (!proxy) {
    return false;
  }
  if (!GStrvPtr(g_dbus_proxy_get_cached_property_names(proxy.get()))) {
    if (g_get_monotonic_time() - begun >= kCallLimitUs) {
      log_warning("The streamer does not answer: its channels are ignored until it restarts");
    }
    return false;
  }
  const auto enabled = cached_boolean(proxy.get(), "Enabled");
  post_answer(&Monitors::streamer, owner, cancellable, [=] { add_channel(number, enabled); });
  return true;
}

void scan_channels(unsigned owner, GCancellable *cancellable) {
  int number = 1;
  while (number <= kMaxChannels && query_channel(number, owner, cancellable)) {
    ++number;
  }
  if (number > kMaxChannels) {
    log_warning("The streamer has too many channels; stopping after channel %d", kMaxChannels);
  }
  post_answer(&Monitors::streamer, owner, cancellable, on_streamer_known);
}

void on_streamer_owner(GDBusConnection *connection, const std::string &owner) {
  Service &streamer = monitors->streamer;
  reset_owner(streamer);
  if (!monitors->channels.empty()) {
    on_streamer_known();  // as far as it was searched
  }
  drop_channels();
  if (owner.empty()) {
    warn_without_bus(connection);
    on_streamer_known();
    return;
  }
  streamer.signals = SignalSubscription(connection, owner, kChannelInterface, "EnabledChanged",
                                        on_enabled_changed);
  streamer.worker.queue(
      [count = streamer.owner](GCancellable *cancellable) { scan_channels(count, cancellable); });
}

// --- The camera-control coordinator ---

PtzState state_for(bool enabled) {
  return enabled ? PtzState::kEnabled : PtzState::kDisabled;
}

void set_ptz_state(PtzState state) {
  monitors->ptz_state = state;
  if (monitors->phase == Phase::kFollowsBoth) {
    manual_trigger_set_ptz(state);
    return;
  }
  manual_trigger_store_ptz(state);
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
  monitors->ptz_signalled = true;
  set_ptz_state(state_for(enabled));
}

void query_ptz(unsigned owner, GCancellable *cancellable) {
  const auto proxy = make_proxy(kCoordinator, kCoordinatorObject, kCoordinator, cancellable);
  const auto enabled = proxy ? cached_boolean(proxy.get(), "PTZEnabled") : std::nullopt;
  post_answer(&Monitors::coordinator, owner, cancellable, [=] {
    if (!monitors->ptz_signalled) {
      set_ptz_state(enabled ? state_for(*enabled) : PtzState::kUnknown);
    }
  });
}

void on_coordinator_owner(GDBusConnection *connection, const std::string &owner) {
  Service &coordinator = monitors->coordinator;
  reset_owner(coordinator);
  monitors->ptz_signalled = false;
  if (owner.empty()) {
    warn_without_bus(connection);
    set_ptz_state(PtzState::kUnknown);
    return;
  }
  coordinator.signals = SignalSubscription(connection, owner, kCoordinator, "PtzEnabledChanged",
                                           on_ptz_enabled_changed);
  coordinator.worker.queue(
      [count = coordinator.owner](GCancellable *cancellable) { query_ptz(count, cancellable); });
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
