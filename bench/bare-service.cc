// What the daemon is measured against: a GDBus service with as many names as are given, one object
// with one method, and nothing else. With --discard first it throws its calls away where the bus
// connection reads them, which is as fast as a GDBus service can get rid of them.
#include <gio/gio.h>
#include <glib-unix.h>

#include <csignal>
#include <cstdlib>
#include <string_view>

namespace {

constexpr const char *kPath = "/bench/Bare";
constexpr const char *kInterface = "bench.Bare";
constexpr const char *kDocument =
    "<node><interface name='bench.Bare'><method name='Empty'>"
    "<arg type='u' direction='in'/><arg type='b' direction='out'/></method>"
    "<method name='Swallow'><arg type='u' direction='in'/><arg type='b' direction='in'/></method>"
    "</interface></node>";

void on_call(GDBusConnection * /*connection*/, const char * /*sender*/, const char * /*path*/,
             const char * /*interface*/, const char *method, GVariant * /*parameters*/,
             GDBusMethodInvocation *invocation, gpointer /*user_data*/) {
  const bool empty = std::string_view(method) == "Empty";
  g_dbus_method_invocation_return_value(invocation, empty ? g_variant_new("(b)", TRUE) : nullptr);
}

constexpr GDBusInterfaceVTable kCallbacks = {on_call, nullptr, nullptr, {}};

GDBusMessage *discard_swallowed(GDBusConnection * /*connection*/, GDBusMessage *message,
                                gboolean incoming, gpointer /*user_data*/) {
  const char *member = g_dbus_message_get_member(message);
  if (incoming && member && std::string_view(member) == "Swallow") {
    g_object_unref(message);
    return nullptr;
  }
  return message;
}

gboolean on_sigterm(gpointer loop) {
  g_main_loop_quit(static_cast<GMainLoop *>(loop));
  return G_SOURCE_REMOVE;
}

}  // namespace

int main(int argc, char **argv) {
  GMainLoop *loop = g_main_loop_new(nullptr, FALSE);
  GDBusConnection *bus = g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, nullptr);
  GDBusNodeInfo *node = g_dbus_node_info_new_for_xml(kDocument, nullptr);
  if (!bus || !node ||
      g_dbus_connection_register_object(bus, kPath,
                                        g_dbus_node_info_lookup_interface(node, kInterface),
                                        &kCallbacks, nullptr, nullptr, nullptr) == 0) {
    return EXIT_FAILURE;
  }
  int first = 1;
  if (argc > 1 && std::string_view(argv[1]) == "--discard") {
    g_dbus_connection_add_filter(bus, discard_swallowed, nullptr, nullptr);
    first = 2;
  }
  for (int i = first; i < argc; ++i) {
    g_bus_own_name_on_connection(bus, argv[i], G_BUS_NAME_OWNER_FLAGS_NONE, nullptr, nullptr,
                                 nullptr, nullptr);
  }
  g_unix_signal_add(SIGTERM, on_sigterm, loop);
  g_main_loop_run(loop);
  return EXIT_SUCCESS;
}
