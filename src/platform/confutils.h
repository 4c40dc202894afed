// The device's configuration utilities library.
#pragma once

#include <glib.h>

#ifdef __cplusplus
extern "C" {
#endif

// What temporary files have between the name of the file that they are to replace and six letters
// or digits. Only a process that was killed leaves one.
#define CONFUTILS_TEMPORARY_SUFFIX ".tmp-"

// Replaces the contents of the file `path` by `length` bytes of `data` (-1: up to the terminating
// zero) and syncs file and directory to storage. Whoever reads the file, at whatever moment and
// after whatever crash, finds the old or the new contents, whole. The owner and the mode of a
// replaced file are kept as far as the caller may set them; a new file gets mode 0644, so that a
// file that is written before privileges are dropped can be read after. A link is followed, and
// kept, where root or the caller owns it; one of somebody else is an error.
//
// Contents that are on storage already cost neither a new file nor a sync: the file holds these
// bytes, and this function synced it or it has lain there since before the process started.
//
// Returns FALSE and sets `error` (domain G_FILE_ERROR) when the new contents could not be stored;
// the old file is then untouched and nothing is left beside it (only when syncing the directory
// failed are the new contents in place already). Callable from any thread.
gboolean confutils_set_file_contents_with_sync(const gchar *path, const gchar *data, gssize length,
                                               GError **error);

#ifdef __cplusplus
}
#endif
