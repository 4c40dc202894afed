// What the handlers of methods that name a port by its number begin with.
#pragma once

#include <gio/gio.h>

#include <utility>

#include "port/ioport.h"
#include "port/port-error.h"
#include "port/port-registry.h"

// The port of the device that a client means by the number, or none.
inline IOPortRef find_ioport(guint number) {
  IOPortRef port = port_registry_find(number);
  return io_port_is_ioport(port.get()) ? std::move(port) : nullptr;
}

static_assert(int{IO_CONTROL_ERROR_NO_PORT} == int{IO_SUPERVISED_ERROR_NO_PORT});

// Has `serve` answer the call for the port. Without a port the call is refused, with the code that
// both error domains have for that. The call is answered then: TRUE.
template <typename Serve>
gboolean serve_port(GDBusMethodInvocation *invocation, GQuark domain, const IOPortRef &port,
                    Serve serve) {
  if (port) {
    serve(port.get());
  } else {
    g_dbus_method_invocation_return_error_literal(invocation, domain, IO_CONTROL_ERROR_NO_PORT,
                                                  "No such port.");
  }
  return TRUE;
}
