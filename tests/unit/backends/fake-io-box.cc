#include "fake-io-box.h"

#include <cstdint>
#include <mutex>
#include <string_view>
#include <utility>

#include "base/condition.h"
#include "base/glib-ptr.h"

namespace {

constexpr std::int64_t kTimeoutUs = 20'000'000;

// Never destroyed: the backend's own proxies go later.
std::vector<GDBusProxy *> &proxies() {
  static auto *const alive = new std::vector<GDBusProxy *>;
  return *alive;
}

void forget(gpointer /*user_data*/, GObject *where_the_object_was) {
  std::erase(proxies(), reinterpret_cast<GDBusProxy *>(where_the_object_was));
}

// What the threads that call share with the test.
std::mutex lock;
MonotonicCondition changed;
std::vector<std::string> calls;
int hanging = 0;
std::string owner = ":1.1";

GVariant *answer(std::string_view method) {
  if (method == "GetIOBoxConnected") {
    return g_variant_new("(b)", TRUE);
  }
  if (method == "GetIOPortStatus") {
    return g_variant_new("(s)", "enabled");
  }
  return method == "GetIOState" ? g_variant_new("(s)", fake_io_box().state.c_str())
                                : g_variant_new("()");
}

void on_cancelled(GCancellable * /*cancellable*/, gpointer /*user_data*/) {
  const std::lock_guard guard(lock);
  changed.notify_all();
}

// The caller holds the lock. False: cancelled.
bool hang(std::unique_lock<std::mutex> &guard, std::string_view method, GCancellable *cancellable) {
  if (fake_io_box().hangs_in != method) {
    return true;
  }
  ++hanging;
  changed.notify_all();
  guard.unlock();
  const gulong handler =
      g_cancellable_connect(cancellable, G_CALLBACK(on_cancelled), nullptr, nullptr);
  guard.lock();
  while (fake_io_box().hangs_in == method && !g_cancellable_is_cancelled(cancellable)) {
    changed.wait(guard);
  }
  --hanging;
  guard.unlock();
  g_cancellable_disconnect(cancellable, handler);
  guard.lock();
  return !g_cancellable_is_cancelled(cancellable);
}

}  // namespace

FakeIoBox &fake_io_box() {
  static FakeIoBox box;
  return box;
}

std::vector<std::string> io_box_calls() {
  const std::lock_guard guard(lock);
  return std::exchange(calls, {});
}

bool io_box_hangs() {
  const std::int64_t deadline = g_get_monotonic_time() + kTimeoutUs;
  std::unique_lock guard(lock);
  while (hanging == 0 && g_get_monotonic_time() < deadline) {
    changed.wait_until(guard, deadline);
  }
  return hanging > 0;
}

void io_box_recovers() {
  const std::lock_guard guard(lock);
  fake_io_box().hangs_in.clear();
  changed.notify_all();
}

void io_box_restarts() {
  {
    const std::lock_guard guard(lock);
    owner += "1";
  }
  for (GDBusProxy *proxy : std::vector<GDBusProxy *>(proxies())) {
    g_object_notify(G_OBJECT(proxy), "g-name-owner");
  }
}

std::size_t io_box_proxies() {
  return proxies().size();
}

void io_box_signals(int number, const char *state) {
  const GVariantPtr parameters(g_variant_ref_sink(g_variant_new("(is)", number, state)));
  for (GDBusProxy *proxy : std::vector<GDBusProxy *>(proxies())) {
    g_signal_emit_by_name(proxy, "g-signal", ":1.1", "IOStateChanged", parameters.get());
  }
}

// These take the place of the library's.

extern "C" GDBusProxy *g_dbus_proxy_new_for_bus_sync(GBusType /*bus_type*/, GDBusProxyFlags flags,
                                                     GDBusInterfaceInfo * /*info*/,
                                                     const gchar *name, const gchar *object_path,
                                                     const gchar *interface_name,
                                                     GCancellable * /*cancellable*/,
                                                     GError **error) {
  if (!fake_io_box().present) {
    g_set_error_literal(error, G_IO_ERROR, G_IO_ERROR_NOT_CONNECTED, "There is no bus");
    return nullptr;
  }
  auto *proxy = static_cast<GDBusProxy *>(
      g_object_new(G_TYPE_DBUS_PROXY, "g-flags", flags, "g-name", name, "g-object-path",
                   object_path, "g-interface-name", interface_name, nullptr));
  g_object_weak_ref(G_OBJECT(proxy), forget, nullptr);
  proxies().push_back(proxy);
  return proxy;
}

extern "C" gchar *g_dbus_proxy_get_name_owner(GDBusProxy * /*proxy*/) {
  const std::lock_guard guard(lock);
  return g_strdup(owner.c_str());
}

extern "C" GVariant *g_dbus_proxy_call_sync(GDBusProxy * /*proxy*/, const gchar *method_name,
                                            GVariant *parameters, GDBusCallFlags /*flags*/,
                                            gint /*timeout_msec*/, GCancellable *cancellable,
                                            GError **error) {
  const GVariantPtr taken(parameters ? g_variant_ref_sink(parameters) : nullptr);
  const GCharPtr text(taken ? g_variant_print(taken.get(), FALSE) : g_strdup("()"));
  if (std::string_view(text.get()).starts_with("(" + std::to_string(kSilentBoxPort) + ",")) {
    return g_variant_ref_sink(answer(method_name));
  }
  std::unique_lock guard(lock);
  if (!fake_io_box().present) {
    g_set_error_literal(error, G_DBUS_ERROR, G_DBUS_ERROR_SERVICE_UNKNOWN, "There is no service");
    return nullptr;
  }
  calls.push_back(std::string(method_name) + " " + text.get());
  if (!hang(guard, method_name, cancellable)) {
    g_set_error_literal(error, G_IO_ERROR, G_IO_ERROR_CANCELLED, "Cancelled");
    return nullptr;
  }
  return g_variant_ref_sink(answer(method_name));
}
