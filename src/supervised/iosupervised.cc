#include "supervised/iosupervised.h"

#include <vector>

#include "base/glib-ptr.h"
#include "base/own-name.h"
#include "iosupervised-supervised-gen.h"
#include "port/ioport.h"
#include "port/port-error.h"
#include "port/port-registry.h"
#include "settings/param.h"
#include "supervised/supervised-utils.h"

namespace {

constexpr const char *kName = "com.kelv.IOSupervised.Supervised";
constexpr const char *kPath = "/com/kelv/IOSupervised/Supervised";

constexpr const char *kNotSupervisable = "Port is not supervisable.";
// Clients match this one without a full stop.
constexpr const char *kNotSupervisableForStates = "Port is not supervisable";

GObjectPtr<IOSupervisedSupervised> skeleton;
BusName bus_name;

gboolean fail(GDBusMethodInvocation *invocation, IOSupervisedError code, const char *message) {
  g_dbus_method_invocation_return_error_literal(invocation, io_supervised_error_quark(), code,
                                                message);
  return TRUE;
}

gboolean fail_no_port(GDBusMethodInvocation *invocation) {
  return fail(invocation, IO_SUPERVISED_ERROR_NO_PORT, "No such port.");
}

// What the port said, or the words of the method when it said nothing.
gboolean fail_with(GDBusMethodInvocation *invocation, const Error &error, const char *otherwise) {
  if (!error) {
    return fail(invocation, IO_SUPERVISED_ERROR_GENERIC, otherwise);
  }
  g_dbus_method_invocation_return_gerror(invocation, error.get());
  return TRUE;
}

// The port of the device that a client means by the number, or none.
IOPortRef find_ioport(guint number) {
  IOPortRef ioport = port_registry_find(number);
  return io_port_is_ioport(ioport.get()) ? std::move(ioport) : nullptr;
}

// The port when it can be supervised. None: the caller has been answered.
IOPortRef find_supervisable(GDBusMethodInvocation *invocation, guint number,
                            const char *not_supervisable = kNotSupervisable) {
  IOPortRef ioport = port_registry_find(number);
  if (!ioport) {
    fail_no_port(invocation);
  } else if (!io_port_is_supervisable(ioport.get())) {
    fail(invocation, IO_SUPERVISED_ERROR_NOT_SUPERVISABLE, not_supervisable);
    ioport.reset();
  }
  return ioport;
}

gboolean get_number_of_ports(IOSupervisedSupervised *object, GDBusMethodInvocation *invocation,
                             gpointer /*user_data*/) {
  iosupervised_supervised_complete_get_number_of_ports(
      object, invocation, port_registry_count_inputs(), port_registry_count_outputs());
  return TRUE;
}

gboolean is_supervisable(IOSupervisedSupervised *object, GDBusMethodInvocation *invocation,
                         guint number, gpointer /*user_data*/) {
  const IOPortRef ioport = find_ioport(number);
  if (!ioport) {
    return fail_no_port(invocation);
  }
  iosupervised_supervised_complete_is_supervisable(object, invocation,
                                                   io_port_is_supervisable(ioport.get()), FALSE);
  return TRUE;
}

gboolean get_supervised(IOSupervisedSupervised *object, GDBusMethodInvocation *invocation,
                        guint number, gpointer /*user_data*/) {
  const IOPortRef ioport = find_ioport(number);
  if (!ioport) {
    return fail_no_port(invocation);
  }
  iosupervised_supervised_complete_get_supervised(object, invocation,
                                                  io_port_is_supervised(ioport.get()));
  return TRUE;
}

gboolean set_supervised(IOSupervisedSupervised *object, GDBusMethodInvocation *invocation,
                        guint number, gboolean supervised, gpointer /*user_data*/) {
  const IOPortRef ioport = find_ioport(number);
  if (!ioport) {
    return fail_no_port(invocation);
  }
  if (io_port_is_supervised(ioport.get()) != (supervised != FALSE)) {
    if (!io_port_set_supervised(ioport.get(), supervised)) {
      return fail(invocation, IO_SUPERVISED_ERROR_NOT_SUPERVISABLE, kNotSupervisable);
    }
    param_save_for_port(ioport.get(), kSettingsFile);
    // Which of the port's events apply depends on whether it is supervised.
    io_port_redeclare_events(ioport.get());
  }
  iosupervised_supervised_complete_set_supervised(object, invocation);
  return TRUE;
}

gboolean set_supervised_ranges(IOSupervisedSupervised *object, GDBusMethodInvocation *invocation,
                               guint number, const char *state, guint lower, guint upper,
                               gpointer /*user_data*/) {
  const IOPortRef ioport = find_supervisable(invocation, number);
  if (!ioport) {
    return TRUE;
  }
  Error error;
  if (!io_port_set_supervised_range(ioport.get(), state, lower, upper, error.out())) {
    return fail_with(invocation, error, "Could not set ranges.");
  }
  param_save_for_port(ioport.get(), kSettingsFile);
  iosupervised_supervised_complete_set_supervised_ranges(object, invocation);
  return TRUE;
}

gboolean get_supervised_ranges(IOSupervisedSupervised *object, GDBusMethodInvocation *invocation,
                               guint number, gpointer /*user_data*/) {
  const IOPortRef ioport = find_supervisable(invocation, number);
  if (!ioport) {
    return TRUE;
  }
  SupervisedRanges ranges;
  if (!io_port_get_supervised_ranges(ioport.get(), &ranges)) {
    return fail(invocation, IO_SUPERVISED_ERROR_GENERIC, "Could not get ranges.");
  }
  iosupervised_supervised_complete_get_supervised_ranges(object, invocation,
                                                         supervised_ranges_to_variant(ranges));
  return TRUE;
}

gboolean get_supervised_readout(IOSupervisedSupervised *object, GDBusMethodInvocation *invocation,
                                guint number, gpointer /*user_data*/) {
  const IOPortRef ioport = find_supervisable(invocation, number);
  if (!ioport) {
    return TRUE;
  }
  SupervisedRangeState state = SUPERVISED_STATE_UNDEFINED;
  std::uint32_t level = 0;
  Error error;
  if (!io_port_get_supervised_readout(ioport.get(), &state, &level, error.out())) {
    return fail_with(invocation, error, "Could not get supervised readout.");
  }
  iosupervised_supervised_complete_get_supervised_readout(
      object, invocation, supervised_range_state2string(state), level);
  return TRUE;
}

gboolean get_supervised_states(IOSupervisedSupervised *object, GDBusMethodInvocation *invocation,
                               guint number, gpointer /*user_data*/) {
  const IOPortRef ioport = find_supervisable(invocation, number, kNotSupervisableForStates);
  if (!ioport) {
    return TRUE;
  }
  std::vector<const char *> states;
  if (!supervised_supported_states(ioport.get(), &states)) {
    return fail(invocation, IO_SUPERVISED_ERROR_GENERIC, "Could not get supported states.");
  }
  const auto count = static_cast<guint>(states.size());
  states.push_back(nullptr);
  iosupervised_supervised_complete_get_supervised_states(object, invocation, count, states.data());
  return TRUE;
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

struct Handler {
  const char *signal;
  GCallback callback;
};

void connect_handlers(IOSupervisedSupervised *object) {
  const Handler handlers[] = {
      {"handle-get-number-of-ports", G_CALLBACK(get_number_of_ports)},
      {"handle-is-supervisable", G_CALLBACK(is_supervisable)},
      {"handle-get-supervised", G_CALLBACK(get_supervised)},
      {"handle-set-supervised", G_CALLBACK(set_supervised)},
      {"handle-set-supervised-ranges", G_CALLBACK(set_supervised_ranges)},
      {"handle-get-supervised-ranges", G_CALLBACK(get_supervised_ranges)},
      {"handle-get-supervised-readout", G_CALLBACK(get_supervised_readout)},
      {"handle-get-supervised-states", G_CALLBACK(get_supervised_states)},
      {"handle-get-supervised-port-numbers", G_CALLBACK(get_supervised_port_numbers)},
  };
  for (const auto &handler : handlers) {
    g_signal_connect(object, handler.signal, handler.callback, nullptr);
  }
}

void on_bus_acquired(GDBusConnection *connection, const char * /*name*/, gpointer /*user_data*/) {
  skeleton.reset(iosupervised_supervised_skeleton_new());
  connect_handlers(skeleton.get());
  export_object(G_DBUS_INTERFACE_SKELETON(skeleton.get()), connection, kPath);
}

}  // namespace

void iosupervised_start() {
  bus_name = BusName(kName, on_bus_acquired);
}

void iosupervised_stop() {
  if (skeleton) {
    g_dbus_interface_skeleton_unexport(G_DBUS_INTERFACE_SKELETON(skeleton.get()));
    skeleton.reset();
  }
  bus_name.reset();
}
