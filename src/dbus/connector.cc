#include "dbus/connector.h"

#include "base/glib-ptr.h"
#include "base/own-name.h"
#include "pcd-connector-gen.h"
#include "port/ioport.h"
#include "port/port-registry.h"

namespace {

constexpr const char *kPath = "/com/kelv/PCD/Connector";

GObjectPtr<PCDConnector> skeleton;

struct Selection {
  bool video;
  bool audio;
};

Selection parse_description(const char *description) {
  const bool all = g_strcmp0(description, "*") == 0;
  return {.video = all || g_ascii_strcasecmp(description, "video connector") == 0,
          .audio = all || g_ascii_strcasecmp(description, "audio connector") == 0};
}

// The states of the selected connectors, in registry order.
std::vector<gint32> connector_states(const char *description) {
  const Selection selection = parse_description(description);
  std::vector<gint32> states;
  port_registry_for_each([&](IOPort *ioport) {
    if ((selection.video && io_port_get_flag(ioport, "video_connector")) ||
        (selection.audio && io_port_get_flag(ioport, "audio_connector"))) {
      states.push_back(io_port_get_state(ioport) ? 1 : 0);
    }
  });
  return states;
}

gboolean get_num_connectors(PCDConnector *object, GDBusMethodInvocation *invocation,
                            const char *description, gpointer /*user_data*/) {
  pcd_connector_complete_get_num_connectors(
      object, invocation, static_cast<gint>(connector_states(description).size()));
  return TRUE;
}

gboolean get_connector_states(PCDConnector *object, GDBusMethodInvocation *invocation,
                              const char *description, gpointer /*user_data*/) {
  const auto states = connector_states(description);
  pcd_connector_complete_get_connector_states(
      object, invocation,
      g_variant_new_fixed_array(G_VARIANT_TYPE_INT32, states.data(), states.size(),
                                sizeof(gint32)));
  return TRUE;
}

}  // namespace

void connector_export(GDBusConnection *connection) {
  skeleton.reset(pcd_connector_skeleton_new());
  g_signal_connect(skeleton.get(), "handle-get-num-connectors", G_CALLBACK(get_num_connectors),
                   nullptr);
  g_signal_connect(skeleton.get(), "handle-get-connector-states", G_CALLBACK(get_connector_states),
                   nullptr);
  export_object(G_DBUS_INTERFACE_SKELETON(skeleton.get()), connection, kPath);
}

void connector_withdraw() {
  if (skeleton) {
    g_dbus_interface_skeleton_unexport(G_DBUS_INTERFACE_SKELETON(skeleton.get()));
    skeleton.reset();
  }
}
