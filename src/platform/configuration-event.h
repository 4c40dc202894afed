// The device's configuration-event library: announces that legacy configuration values have
// changed.
//
// Each send is the signal Changed (s interface, s path, s change) of the interface
// "com.kelv.Configuration.Event" on the object "/com/kelv/Configuration/Event", on the process's
// shared connection to the system bus.
//
// Interfaces and paths are names of the bus's own form. A handle belongs to one thread at a time.
// Errors are of the domain G_IO_ERROR unless they come from the bus.
#pragma once

#include <glib.h>

#include "platform/event.h"

#ifdef __cplusplus
extern "C" {
#endif

// C reads this header too.
typedef struct ConfigurationEvent ConfigurationEvent;  // NOLINT(modernize-use-using)

// A handle for the changes that the service `name` announces; `flags` is 0. The producer is not
// owned and must outlive the handle. NULL: bad argument.
ConfigurationEvent *configuration_event_new(const gchar *name, EventProducer *producer,
                                            guint flags);

// NULL is allowed.
void configuration_event_free(ConfigurationEvent *handle);

// Says that values of `changed_interface` will be announced for the interface and path. Needs no
// bus. FALSE: G_IO_ERROR_INVALID_ARGUMENT, or G_IO_ERROR_EXISTS (declared already).
gboolean configuration_event_declare(ConfigurationEvent *handle, const gchar *interface,
                                     const gchar *path, const gchar *changed_interface,
                                     GError **error);

// Takes a declaration back. Needs no bus. FALSE: G_IO_ERROR_INVALID_ARGUMENT, or
// G_IO_ERROR_NOT_FOUND (not declared).
gboolean configuration_event_undeclare(ConfigurationEvent *handle, const gchar *interface,
                                       const gchar *path, const gchar *changed_interface,
                                       GError **error);

// Starts a new change string. FALSE: no handle.
gboolean configuration_event_initialize_change_string(ConfigurationEvent *handle);

// Appends "key=value" to the change string, after a "&" if it is not the first pair. Bytes of
// either text that mean something in a URI are escaped as there, so that g_uri_parse_params() takes
// the string apart. FALSE: bad argument, text that is not UTF-8, or an empty key.
gboolean configuration_event_append_escaped_pair_to_change_string(ConfigurationEvent *handle,
                                                                  const gchar *key,
                                                                  const gchar *value);

// Announces the change string for `changed_interface` and `changed_path`, on the declaration of
// interface, path and `changed_interface`. The string is kept until the next is started.
// `consumers` is passed on to the device's event system and has no meaning on the bus.
//
// FALSE: G_IO_ERROR_INVALID_ARGUMENT, G_IO_ERROR_NOT_FOUND (not declared), or the bus's own error
// when there is none: nothing is announced then, nor later. Connects to the bus when the process
// has no connection yet, which may wait.
gboolean configuration_event_send(ConfigurationEvent *handle, const gchar *interface,
                                  const gchar *path, const gchar *changed_interface,
                                  const gchar *changed_path, guint consumers, GError **error);

#ifdef __cplusplus
}
#endif
