// Assertions on pointers. GLib's own words for them depend on the language of the caller; the
// daemon always says NULL, as its other assertions do.
#pragma once

#include <glib.h>

#define assert_nonnull(pointer)                                        \
  do {                                                                 \
    if (G_UNLIKELY((pointer) == nullptr)) {                            \
      g_assertion_message(G_LOG_DOMAIN, __FILE__, __LINE__, G_STRFUNC, \
                          "'" #pointer "' should not be NULL");        \
    }                                                                  \
  } while (0)

// For the argument that is a port: messages call it "ioport", whatever its name in the code.
#define assert_port(port)                                                              \
  do {                                                                                 \
    if (G_UNLIKELY(!(port))) {                                                         \
      g_assertion_message_expr(G_LOG_DOMAIN, __FILE__, __LINE__, G_STRFUNC, "ioport"); \
    }                                                                                  \
  } while (0)

#define return_if_no_port(port, ...)                                       \
  do {                                                                     \
    if (G_UNLIKELY((port) == nullptr)) {                                   \
      g_return_if_fail_warning(G_LOG_DOMAIN, G_STRFUNC, "ioport != NULL"); \
      return __VA_ARGS__;                                                  \
    }                                                                      \
  } while (0)
