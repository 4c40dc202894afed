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
