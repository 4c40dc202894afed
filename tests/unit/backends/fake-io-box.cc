#include "fake-io-box.h"

#include <string_view>
#include <vector>

#include "base/glib-ptr.h"

namespace {

std::vector<GDBusProxy *> &proxies() {
  static std::vector<GDBusProxy *> alive;
  return alive;
}

void forget(gpointer /*user_data*/, GObject *where_the_object_was) {
  std::erase(proxies(), reinterpret_cast<GDBusProxy *>(where_the_object_was));
}

GVariant *answer(std::string_view method) {
  if (method == "GetIOBoxConnected") {
    return g_variant_new("(b)", TRUE);
  }
  if (method == "GetIOPortStatus") {
    return g_variant_new("(s)", "enabled");
  }
  return method == "GetIOState" ? g_variant_new("(s)", "open") : g_variant_new("()");
}

}  // namespace

FakeIoBox &fake_io_box() {
  static FakeIoBox box;
  return box;
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

extern "C" GVariant *g_dbus_proxy_call_sync(GDBusProxy * /*proxy*/, const gchar *method_name,
                                            GVariant *parameters, GDBusCallFlags /*flags*/,
                                            gint /*timeout_msec*/, GCancellable * /*cancellable*/,
                                            GError ** /*error*/) {
  const GVariantPtr taken(parameters ? g_variant_ref_sink(parameters) : nullptr);
  return g_variant_ref_sink(answer(method_name));
}
