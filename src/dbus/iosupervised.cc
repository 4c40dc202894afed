#include "dbus/iosupervised.h"

#include <memory>
#include <vector>

#include "base/glib-ptr.h"
#include "dbus/bus-service.h"
#include "dbus/with-port.h"
#include "iosupervised-supervised-gen.h"
#include "port/ioport.h"
#include "port/port-error.h"
#include "port/port-registry.h"
#include "settings/param.h"
#include "supervised/supervised.h"

namespace {

BusService service("com.kelv.IOSupervised.Supervised", "/com/kelv/IOSupervised/Supervised");

constexpr const char *kNotSupervisable = "Port is not supervisable.";
// Fixed: the text of one method has no full stop.
constexpr const char *kNotSupervisableForStates = "Port is not supervisable";

void fail(GDBusMethodInvocation *invocation, IOSupervisedError code, const char *message) {
  g_dbus_method_invocation_return_error_literal(invocation, io_supervised_error_quark(), code,
                                                message);
}

// The error of the port, or the text of the method when there is none.
void fail_with(GDBusMethodInvocation *invocation, const Error &error, const char *otherwise) {
  if (error) {
    g_dbus_method_invocation_return_gerror(invocation, error.get());
  } else {
    fail(invocation, IO_SUPERVISED_ERROR_GENERIC, otherwise);
  }
}

// One of the device's own ports.
template <typename Serve>
gboolean with_port(GDBusMethodInvocation *invocation, guint number, Serve serve) {
  return serve_port(invocation, io_supervised_error_quark(), find_ioport(number), serve);
}

// A port that can be supervised, whether or not it is one of the device's own.
template <typename Serve>
gboolean with_supervisable(GDBusMethodInvocation *invocation, guint number, Serve serve,
                           const char *not_supervisable = kNotSupervisable) {
  return serve_port(invocation, io_supervised_error_quark(), port_registry_find(number),
                    [&](IOPort *port) {
                      if (io_port_is_supervisable(port)) {
                        serve(port);
                      } else {
                        fail(invocation, IO_SUPERVISED_ERROR_NOT_SUPERVISABLE, not_supervisable);
                      }
                    });
}

gboolean get_number_of_ports(IOSupervisedSupervised *object, GDBusMethodInvocation *invocation,
                             gpointer /*user_data*/) {
  iosupervised_supervised_complete_get_number_of_ports(
      object, invocation, port_registry_count_inputs(), port_registry_count_outputs());
  return TRUE;
}

gboolean is_supervisable(IOSupervisedSupervised *object, GDBusMethodInvocation *invocation,
                         guint number, gpointer /*user_data*/) {
  return with_port(invocation, number, [&](IOPort *port) {
    iosupervised_supervised_complete_is_supervisable(object, invocation,
                                                     io_port_is_supervisable(port), FALSE);
  });
}

gboolean get_supervised(IOSupervisedSupervised *object, GDBusMethodInvocation *invocation,
                        guint number, gpointer /*user_data*/) {
  return with_port(invocation, number, [&](IOPort *port) {
    iosupervised_supervised_complete_get_supervised(object, invocation,
                                                    io_port_is_supervised(port));
  });
}

gboolean set_supervised(IOSupervisedSupervised *object, GDBusMethodInvocation *invocation,
                        guint number, gboolean supervised, gpointer /*user_data*/) {
  return with_port(invocation, number, [&](IOPort *port) {
    if (io_port_is_supervised(port) != (supervised != FALSE)) {
      if (!io_port_set_supervised(port, supervised)) {
        return fail(invocation, IO_SUPERVISED_ERROR_NOT_SUPERVISABLE, kNotSupervisable);
      }
      // Whoever is answered finds the setting stored and the port idle. The setting is taken now: a
      // port that is dropped meanwhile has none.
      const auto left = std::make_shared<int>(2);
      const auto one_done = [left, object, invocation] {
        if (--*left == 0) {
          iosupervised_supervised_complete_set_supervised(object, invocation);
        }
      };
      param_request_save(port, kSettingsFile, one_done);
      io_port_when_idle(port, one_done);
      // Which of the port's events apply depends on whether it is supervised.
      io_port_redeclare_events(port);
      return;
    }
    iosupervised_supervised_complete_set_supervised(object, invocation);
  });
}

gboolean set_supervised_ranges(IOSupervisedSupervised *object, GDBusMethodInvocation *invocation,
                               guint number, const char *state, guint lower, guint upper,
                               gpointer /*user_data*/) {
  return with_supervisable(invocation, number, [&](IOPort *port) {
    Error error;
    if (!io_port_set_supervised_range(port, state, lower, upper, error.out())) {
      return fail_with(invocation, error, "Could not set ranges.");
    }
    param_request_save(port, kSettingsFile, [object, invocation] {
      iosupervised_supervised_complete_set_supervised_ranges(object, invocation);
    });
  });
}

gboolean get_supervised_ranges(IOSupervisedSupervised *object, GDBusMethodInvocation *invocation,
                               guint number, gpointer /*user_data*/) {
  return with_supervisable(invocation, number, [&](IOPort *port) {
    SupervisedRanges ranges;
    if (!io_port_get_supervised_ranges(port, &ranges)) {
      return fail(invocation, IO_SUPERVISED_ERROR_GENERIC, "Could not get ranges.");
    }
    iosupervised_supervised_complete_get_supervised_ranges(object, invocation,
                                                           supervised_ranges_to_variant(ranges));
  });
}

gboolean get_supervised_readout(IOSupervisedSupervised *object, GDBusMethodInvocation *invocation,
                                guint number, gpointer /*user_data*/) {
  return with_supervisable(invocation, number, [&](IOPort *port) {
    SupervisedRangeState state = SUPERVISED_STATE_UNDEFINED;
    std::uint32_t level = 0;
    Error error;
    if (!io_port_get_supervised_readout(port, &state, &level, error.out())) {
      return fail_with(invocation, error, "Could not get supervised readout.");
    }
    iosupervised_supervised_complete_get_supervised_readout(
        object, invocation, supervised_range_state2string(state), level);
  });
}

GVariant *states_to_variant(const std::vector<const char *> &states) {
  GVariantBuilder builder;
  g_variant_builder_init(&builder, G_VARIANT_TYPE("a(s)"));
  for (const char *state : states) {
    g_variant_builder_add(&builder, "(s)", state);
  }
  return g_variant_builder_end(&builder);
}

gboolean get_supervised_states(IOSupervisedSupervised *object, GDBusMethodInvocation *invocation,
                               guint number, gpointer /*user_data*/) {
  return with_supervisable(
      invocation, number,
      [&](IOPort *port) {
        std::vector<const char *> states;
        if (!supervised_supported_states(port, &states)) {
          return fail(invocation, IO_SUPERVISED_ERROR_GENERIC, "Could not get supported states.");
        }
        iosupervised_supervised_complete_get_supervised_states(
            object, invocation, static_cast<guint>(states.size()), states_to_variant(states));
      },
      kNotSupervisableForStates);
}

gboolean get_supervised_port_numbers(IOSupervisedSupervised *object,
                                     GDBusMethodInvocation *invocation, gpointer /*user_data*/) {
  const auto numbers = port_registry_supervisable_numbers();
  iosupervised_supervised_complete_get_supervised_port_numbers(
      object, invocation,
      g_variant_new_fixed_array(G_VARIANT_TYPE_UINT32, numbers.data(), numbers.size(),
                                sizeof(std::uint32_t)));
  return TRUE;
}

}  // namespace

void iosupervised_start() {
  IOSupervisedSupervised *object = iosupervised_supervised_skeleton_new();
  connect_handlers(
      object, {
                  {"handle-get-number-of-ports", G_CALLBACK(get_number_of_ports)},
                  {"handle-is-supervisable", G_CALLBACK(is_supervisable)},
                  {"handle-get-supervised", G_CALLBACK(get_supervised)},
                  {"handle-set-supervised", G_CALLBACK(set_supervised)},
                  {"handle-set-supervised-ranges", G_CALLBACK(set_supervised_ranges)},
                  {"handle-get-supervised-ranges", G_CALLBACK(get_supervised_ranges)},
                  {"handle-get-supervised-readout", G_CALLBACK(get_supervised_readout)},
                  {"handle-get-supervised-states", G_CALLBACK(get_supervised_states)},
                  {"handle-get-supervised-port-numbers", G_CALLBACK(get_supervised_port_numbers)},
              });
  service.start(G_DBUS_INTERFACE_SKELETON(object));
}

void iosupervised_stop() {
  service.stop();
}
