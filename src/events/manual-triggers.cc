#include "events/manual-triggers.h"

#include <forward_list>
#include <string>
#include <string_view>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "base/signal-handler.h"
#include "events/trigger-ports.h"

namespace {

constexpr const char *kStreamer = "com.kelv.Streamer";
constexpr const char *kChannelRoot = "/com/kelv/Streamer/Video/Channel";
constexpr const char *kChannelInterface = "com.kelv.Streamer.Video.Channel";
constexpr const char *kCoordinator = "com.kelv.PTZ.Coordinator";
constexpr const char *kCoordinatorObject = "/com/kelv/PTZ/Coordinator/1";

// A streamer that has an answer for every path, or takes its time for each, must not keep the
// daemon for good.
constexpr int kMaxChannels = 1024;
constexpr gint64 kScanLimitUs = 60'000'000;
// A service that has said nothing by then does not answer.
constexpr gint64 kCallLimitUs = 25'000'000;

struct Channel {
  int number;
  GObjectPtr<GDBusProxy> proxy;
  SignalHandler enabled_changed;
};

struct Monitors {
  GObjectPtr<GDBusProxy> streamer;
  SignalHandler streamer_owner;
  GObjectPtr<GDBusProxy> coordinator;
  SignalHandler coordinator_owner;
  SignalHandler coordinator_signals;
  std::forward_list<Channel> channels;
};

Monitors &monitors() {
  static Monitors instance;
  return instance;
}

// --- Proxies ---

GObjectPtr<GDBusProxy> make_proxy(const char *service, const char *object, const char *interface) {
  Error error;
  GObjectPtr<GDBusProxy> proxy(
      g_dbus_proxy_new_for_bus_sync(G_BUS_TYPE_SYSTEM, G_DBUS_PROXY_FLAGS_NONE, nullptr, service,
                                    object, interface, nullptr, error.out()));
  if (!proxy) {
    log_warning("Error creating proxy: %s\n", error.message());
  }
  return proxy;
}

bool has_owner(GDBusProxy *proxy) {
  return static_cast<bool>(GCharPtr(g_dbus_proxy_get_name_owner(proxy)));
}

// Null when the property is missing or not a boolean.
GVariantPtr cached_boolean(GDBusProxy *proxy, const char *property) {
  GVariantPtr value(g_dbus_proxy_get_cached_property(proxy, property));
  if (value && !g_variant_is_of_type(value.get(), G_VARIANT_TYPE_BOOLEAN)) {
    log_warning("%s has a property %s that is not a boolean", g_dbus_proxy_get_object_path(proxy),
                property);
    value.reset();
  }
  return value;
}

// --- The streamer and its channels ---

void on_channel_signal(GDBusProxy * /*proxy*/, const char * /*sender*/, const char *signal,
                       GVariant *parameters, gpointer user_data) {
  if (std::string_view(signal) != "EnabledChanged" ||
      !g_variant_is_of_type(parameters, G_VARIANT_TYPE("(b)"))) {
    return;
  }
  gboolean enabled = FALSE;
  g_variant_get(parameters, "(b)", &enabled);
  manual_trigger_set_channel(static_cast<const Channel *>(user_data)->number, enabled);
}

void follow_channel(int number, GObjectPtr<GDBusProxy> proxy) {
  Channel &channel = monitors().channels.emplace_front();
  channel.number = number;
  channel.proxy = std::move(proxy);
  const GVariantPtr enabled = cached_boolean(channel.proxy.get(), "Enabled");
  manual_trigger_set_channel(number, !enabled || g_variant_get_boolean(enabled.get()));
  if (enabled) {
    channel.enabled_changed =
        SignalHandler(channel.proxy.get(), "g-signal", G_CALLBACK(on_channel_signal), &channel);
  }
}

// False: there is no such channel.
bool adopt_channel(int number) {
  const std::string object = std::string(kChannelRoot) + '/' + std::to_string(number);
  GObjectPtr<GDBusProxy> proxy = make_proxy(kStreamer, object.c_str(), kChannelInterface);
  if (!proxy || !GStrvPtr(g_dbus_proxy_get_cached_property_names(proxy.get()))) {
    return false;
  }
  follow_channel(number, std::move(proxy));
  return true;
}

void scan_channels() {
  const gint64 deadline = g_get_monotonic_time() + kScanLimitUs;
  int number = 1;
  while (adopt_channel(number)) {
    if (number == kMaxChannels || g_get_monotonic_time() > deadline) {
      log_warning("The streamer has too many channels, or is too slow; stopping after channel %d",
                  number);
      return;
    }
    ++number;
  }
}

void drop_channels() {
  for (const auto &channel : monitors().channels) {
    manual_trigger_remove_channel(channel.number);
  }
  monitors().channels.clear();
}

// The name may pass from one process to the next without a gap, so each owner starts afresh.
void on_streamer_owner(GObject * /*proxy*/, GParamSpec * /*property*/, gpointer /*user_data*/) {
  drop_channels();
  if (has_owner(monitors().streamer.get())) {
    scan_channels();
  }
}

void start_streamer_monitor() {
  const gint64 begun = g_get_monotonic_time();
  monitors().streamer = make_proxy(kStreamer, kChannelRoot, kChannelInterface);
  if (!monitors().streamer) {
    return;
  }
  monitors().streamer_owner = SignalHandler(monitors().streamer.get(), "notify::g-name-owner",
                                            G_CALLBACK(on_streamer_owner), nullptr);
  if (g_get_monotonic_time() - begun >= kCallLimitUs) {
    log_warning("The streamer does not answer; its channels wait until it is started anew");
  } else if (has_owner(monitors().streamer.get())) {
    scan_channels();
  }
}

// --- The camera-control coordinator ---

PtzState current_ptz_state() {
  GDBusProxy *proxy = monitors().coordinator.get();
  if (!proxy || !has_owner(proxy)) {
    return PTZ_UNKNOWN;
  }
  const GVariantPtr enabled = cached_boolean(proxy, "PTZEnabled");
  if (!enabled) {
    return PTZ_UNKNOWN;
  }
  return g_variant_get_boolean(enabled.get()) ? PTZ_ENABLED : PTZ_DISABLED;
}

void on_coordinator_owner(GObject * /*proxy*/, GParamSpec * /*property*/, gpointer /*user_data*/) {
  manual_trigger_set_ptz(current_ptz_state());
}

void on_coordinator_signal(GDBusProxy * /*proxy*/, const char * /*sender*/, const char *signal,
                           GVariant *parameters, gpointer /*user_data*/) {
  if (std::string_view(signal) != "PtzEnabledChanged" ||
      !g_variant_is_of_type(parameters, G_VARIANT_TYPE("(ib)"))) {
    return;
  }
  gint32 unused = 0;
  gboolean enabled = FALSE;
  g_variant_get(parameters, "(ib)", &unused, &enabled);
  manual_trigger_set_ptz(enabled ? PTZ_ENABLED : PTZ_DISABLED);
}

void start_ptz_monitor() {
  monitors().coordinator = make_proxy(kCoordinator, kCoordinatorObject, kCoordinator);
  if (GDBusProxy *proxy = monitors().coordinator.get()) {
    monitors().coordinator_owner =
        SignalHandler(proxy, "notify::g-name-owner", G_CALLBACK(on_coordinator_owner), nullptr);
    monitors().coordinator_signals =
        SignalHandler(proxy, "g-signal", G_CALLBACK(on_coordinator_signal), nullptr);
  }
}

}  // namespace

// The coordinator's word is needed to judge the first channel, and is acted on when all channels
// are known.
void manual_trigger_start() {
  if (!manual_triggers_enabled()) {
    return;
  }
  start_ptz_monitor();
  const PtzState ptz_state = current_ptz_state();
  manual_trigger_expect_ptz(ptz_state);
  start_streamer_monitor();
  manual_trigger_set_ptz(ptz_state);
}

void manual_trigger_stop() {
  monitors() = Monitors();
}
