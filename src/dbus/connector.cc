#include "dbus/connector.h"

#include <functional>
#include <vector>

#include "dbus/bus-service.h"
#include "pcd-connector-gen.h"
#include "port/ioport.h"
#include "port/port-registry.h"

namespace {

BusService service("com.kelv.PCD.Connector", "/com/kelv/PCD/Connector");

struct Selection {
  bool video;
  bool audio;
};

Selection parse_description(const char *description) {
  const bool all = g_strcmp0(description, "*") == 0;
  return {.video = all || g_ascii_strcasecmp(description, "video connector") == 0,
          .audio = all || g_ascii_strcasecmp(description, "audio connector") == 0};
}

// Every selected connector, in registry order. A port with both flags is one connector.
void for_each_connector(const char *description, const std::function<void(IOPort *)> &visit) {
  const Selection selection = parse_description(description);
  port_registry_for_each([&](IOPort *port) {
    if ((selection.video && io_port_get_flag(port, "video_connector")) ||
        (selection.audio && io_port_get_flag(port, "audio_connector"))) {
      visit(port);
    }
  });
}

gboolean get_num_connectors(PCDConnector *object, GDBusMethodInvocation *invocation,
                            const char *description, gpointer /*user_data*/) {
  gint count = 0;
  for_each_connector(description, [&](IOPort * /*port*/) { ++count; });
  pcd_connector_complete_get_num_connectors(object, invocation, count);
  return TRUE;
}

gboolean get_connector_states(PCDConnector *object, GDBusMethodInvocation *invocation,
                              const char *description, gpointer /*user_data*/) {
  std::vector<gint32> states;
  for_each_connector(description,
                     [&](IOPort *port) { states.push_back(io_port_get_state(port) ? 1 : 0); });
  pcd_connector_complete_get_connector_states(
      object, invocation,
      g_variant_new_fixed_array(G_VARIANT_TYPE_INT32, states.data(), states.size(),
                                sizeof(gint32)));
  return TRUE;
}

}  // namespace

void connector_start() {
  PCDConnector *object = pcd_connector_skeleton_new();
  connect_handlers(object, {{"handle-get-num-connectors", G_CALLBACK(get_num_connectors)},
                            {"handle-get-connector-states", G_CALLBACK(get_connector_states)}});
  service.start(G_DBUS_INTERFACE_SKELETON(object));
}

void connector_stop() {
  service.stop();
}
