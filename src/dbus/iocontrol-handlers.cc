#include "dbus/iocontrol-handlers.h"

#include <memory>
#include <optional>

#include "base/heap.h"
#include "base/main-queue.h"
#include "dbus/bus-service.h"
#include "dbus/with-port.h"
#include "legacy/bridge.h"
#include "port/ioport.h"
#include "port/port-error.h"
#include "port/port-registry.h"
#include "settings/param.h"
#include "settings/setting-words.h"

namespace {

void fail(GDBusMethodInvocation *invocation, IOControlError code, const char *message) {
  g_dbus_method_invocation_return_error_literal(invocation, io_control_error_quark(), code,
                                                message);
}

// One of the device's own ports.
template <typename Serve>
gboolean with_port(GDBusMethodInvocation *invocation, guint number, Serve serve) {
  return serve_port(invocation, io_control_error_quark(), find_ioport(number), serve);
}

// Also a port that is only virtual: the registry finds no others.
template <typename Serve>
gboolean with_any_port(GDBusMethodInvocation *invocation, guint number, Serve serve) {
  return serve_port(invocation, io_control_error_quark(), port_registry_find(number), serve);
}

void save(IOPort *port) {
  param_request_save(port, kSettingsFile);
}

// Answers, and then stores the settings, once the port has no calls to other services under way.
// Other callers are not held up.
template <typename Answer>
void answer_and_save(IOPort *port, Answer answer) {
  const std::shared_ptr<IOPort> kept = io_port_new_reference(port);
  io_port_when_idle(port, [kept, answer] {
    answer();
    save(kept.get());
  });
}

gboolean get_state(IOControlState *object, GDBusMethodInvocation *invocation, guint number,
                   gpointer /*user_data*/) {
  return with_port(invocation, number, [&](IOPort *port) {
    iocontrol_state_complete_get_state(object, invocation, io_port_get_state(port));
  });
}

gboolean is_configurable(IOControlState *object, GDBusMethodInvocation *invocation, guint number,
                         gpointer /*user_data*/) {
  return with_port(invocation, number, [&](IOPort *port) {
    iocontrol_state_complete_is_configurable(object, invocation,
                                             io_port_get_type(port) == PORT_CONFIGURABLE);
  });
}

gboolean get_direction(IOControlState *object, GDBusMethodInvocation *invocation, guint number,
                       gpointer /*user_data*/) {
  return with_port(invocation, number, [&](IOPort *port) {
    iocontrol_state_complete_get_direction(object, invocation, direction_word(io_port_input(port)));
  });
}

// Stores the settings after a refusal too.
gboolean set_direction(IOControlState *object, GDBusMethodInvocation *invocation, guint number,
                       const char *direction, gpointer /*user_data*/) {
  return with_port(invocation, number, [&](IOPort *port) {
    const auto input = parse_direction(direction);
    if (!input) {
      fail(invocation, IO_CONTROL_ERROR_GENERIC,
           "Incorrect input to set_direction eiter use 'input' or 'output'");
    } else if (io_port_set_direction(port, *input)) {
      return answer_and_save(port,
                             [=] { iocontrol_state_complete_set_direction(object, invocation); });
    } else {
      fail(invocation, IO_CONTROL_ERROR_NOT_CONFIGURABLE, "Port not configurable.");
    }
    save(port);
  });
}

gboolean get_active(IOControlState *object, GDBusMethodInvocation *invocation, guint number,
                    gpointer /*user_data*/) {
  return with_port(invocation, number, [&](IOPort *port) {
    iocontrol_state_complete_get_active(object, invocation,
                                        activelow_word(io_port_get_activelow(port, true)),
                                        activelow_word(io_port_get_activelow(port, false)));
  });
}

// Stores the settings after a refusal too.
gboolean set_active(IOControlState *object, GDBusMethodInvocation *invocation, guint number,
                    gboolean input, const char *state, gpointer /*user_data*/) {
  return with_port(invocation, number, [&](IOPort *port) {
    const auto activelow = parse_activelow(state);
    if (!activelow) {
      fail(invocation, IO_CONTROL_ERROR_GENERIC,
           "Incorrect input to set_active eiter use 'open' or 'closed'");
    } else if (io_port_set_activelow(port, *activelow, input)) {
      return answer_and_save(port,
                             [=] { iocontrol_state_complete_set_active(object, invocation); });
    } else {
      fail(invocation, IO_CONTROL_ERROR_GENERIC,
           *activelow ? "Could not set port to open." : "Could not set port to closed.");
    }
    save(port);
  });
}

gboolean get_names(IOControlState *object, GDBusMethodInvocation *invocation, guint number,
                   gpointer /*user_data*/) {
  return with_port(invocation, number, [&](IOPort *port) {
    std::optional<std::string> input;
    std::optional<std::string> output;
    io_port_get_names(port, &input, &output);
    iocontrol_state_complete_get_names(object, invocation, input.value_or("").c_str(),
                                       output.value_or("").c_str());
  });
}

gboolean set_name(IOControlState *object, GDBusMethodInvocation *invocation, guint number,
                  gboolean input, const char *name, gpointer /*user_data*/) {
  return with_port(invocation, number, [&](IOPort *port) {
    const auto set = input ? io_port_set_input_name : io_port_set_output_name;
    if (!set(port, name)) {
      return fail(invocation, IO_CONTROL_ERROR_GENERIC,
                  input ? "Could not set input name for the port."
                        : "Could not set output name for the port.");
    }
    iocontrol_state_complete_set_name(object, invocation);
    save(port);
  });
}

gboolean set_virtual(IOControlState *object, GDBusMethodInvocation *invocation, guint number,
                     gboolean state, gpointer /*user_data*/) {
  return with_any_port(invocation, number, [&](IOPort *port) {
    if (!io_port_set_virtual(port, state)) {
      return fail(invocation, IO_CONTROL_ERROR_GENERIC, "Could not set port.");
    }
    iocontrol_state_complete_set_virtual(object, invocation);
    save(port);
  });
}

ActionSequence parse_sequence(bool is_virtual, GVariant *steps) {
  ActionSequence sequence = {is_virtual, {}};
  GVariantIter iter;
  gboolean state = FALSE;
  gint32 time_ms = 0;
  g_variant_iter_init(&iter, steps);
  while (g_variant_iter_next(&iter, "(bi)", &state, &time_ms)) {
    sequence.steps.push_back({state != FALSE, time_ms});
  }
  return sequence;
}

gboolean start_action_sequence(IOControlState *object, GDBusMethodInvocation *invocation,
                               guint number, gboolean is_virtual, GVariant *steps,
                               gpointer /*user_data*/) {
  return with_any_port(invocation, number, [&](IOPort *port) {
    if (g_variant_n_children(steps) > kMaxSequenceSteps) {
      post_to_main_loop(heap_trim);  // once the message, which is most of the heap, is gone
      return fail(invocation, IO_CONTROL_ERROR_GENERIC, "The sequence has too many steps.");
    }
    ActionSequence sequence = parse_sequence(is_virtual, steps);
    if (sequence.steps.empty()) {
      return fail(invocation, IO_CONTROL_ERROR_GENERIC, "The sequence has no steps.");
    }
    if (io_port_is_busy(port)) {
      return fail(invocation, IO_CONTROL_ERROR_BUSY, "The port is busy.");
    }
    if (!io_port_run_action_sequence(port, std::move(sequence))) {
      return fail(invocation, IO_CONTROL_ERROR_NOT_OUTPUT, "Port not output.");
    }
    iocontrol_state_complete_start_action_sequence(object, invocation);
  });
}

gboolean get_nbr_ports(IOControlState *object, GDBusMethodInvocation *invocation,
                       gpointer /*user_data*/) {
  iocontrol_state_complete_get_nbr_ports(object, invocation, port_registry_count_inputs(),
                                         port_registry_count_outputs());
  return TRUE;
}

GVariant *flags_to_variant(const IOPort *port) {
  GVariantBuilder builder;
  g_variant_builder_init(&builder, G_VARIANT_TYPE("a(sb)"));
  for (const auto &[name, value] : io_port_get_flags(port)) {
    g_variant_builder_add(&builder, "(sb)", name.c_str(), value);
  }
  return g_variant_builder_end(&builder);
}

GVariant *props_to_variant(IOPort *port) {
  const bool input = io_port_direction_input(port);
  return g_variant_new("(sibbbb@a(sb))", io_port_get_id(port).value_or("").c_str(),
                       io_port_get_number(port), io_port_get_state(port), input,
                       io_port_get_type(port) == PORT_CONFIGURABLE,
                       io_port_get_activelow(port, input), flags_to_variant(port));
}

gboolean get_port_props(IOControlState *object, GDBusMethodInvocation *invocation,
                        gpointer /*user_data*/) {
  GVariantBuilder builder;
  gint count = 0;
  g_variant_builder_init(&builder, G_VARIANT_TYPE("a(sibbbba(sb))"));
  {
    const auto lock = port_registry_lock();
    for (IOPort *port : port_registry_active_locked()) {
      g_variant_builder_add_value(&builder, props_to_variant(port));
      ++count;
    }
  }
  iocontrol_state_complete_get_port_props(object, invocation, count,
                                          g_variant_builder_end(&builder));
  return TRUE;
}

// Tells the rest of the device that ports have come or gone.
void reannounce_ports() {
  legacy_interface_renew();
  port_registry_arm_watches();
  port_registry_declare_events();
}

bool drop_port(const char *id) {
  const IOPortRef port = port_registry_get_by_id(id);
  if (!port || !io_port_is_optional(port.get())) {
    return false;
  }
  io_port_drop(port.get());
  port_registry_park(port.get());
  return true;
}

gboolean drop_io_ports(IOControlState *object, GDBusMethodInvocation *invocation,
                       const char *const *ids, gpointer /*user_data*/) {
  std::vector<const char *> dropped;
  for (; *ids; ++ids) {
    if (drop_port(*ids)) {
      dropped.push_back(*ids);
    }
  }
  if (!dropped.empty()) {
    reannounce_ports();
  }
  dropped.push_back(nullptr);
  iocontrol_state_complete_drop_ioports(object, invocation, dropped.data());
  return TRUE;
}

gboolean refresh_io_ports(IOControlState *object, GDBusMethodInvocation *invocation,
                          gpointer /*user_data*/) {
  port_registry_retry_parked([=](std::size_t count) {
    if (count > 0) {
      reannounce_ports();
    }
    iocontrol_state_complete_refresh_ioports(object, invocation);
  });
  return TRUE;
}

}  // namespace

void iocontrol_connect_handlers(IOControlState *object) {
  connect_handlers(object, {
                               {"handle-get-state", G_CALLBACK(get_state)},
                               {"handle-is-configurable", G_CALLBACK(is_configurable)},
                               {"handle-get-direction", G_CALLBACK(get_direction)},
                               {"handle-set-direction", G_CALLBACK(set_direction)},
                               {"handle-get-active", G_CALLBACK(get_active)},
                               {"handle-set-active", G_CALLBACK(set_active)},
                               {"handle-get-names", G_CALLBACK(get_names)},
                               {"handle-set-name", G_CALLBACK(set_name)},
                               {"handle-set-virtual", G_CALLBACK(set_virtual)},
                               {"handle-start-action-sequence", G_CALLBACK(start_action_sequence)},
                               {"handle-get-nbr-ports", G_CALLBACK(get_nbr_ports)},
                               {"handle-get-port-props", G_CALLBACK(get_port_props)},
                               {"handle-drop-ioports", G_CALLBACK(drop_io_ports)},
                               {"handle-refresh-ioports", G_CALLBACK(refresh_io_ports)},
                           });
}
