// Settings that older firmware left behind: the export of its parameter store, called the parhand
// file, and settings files to be merged. Main thread.
#pragma once

#include <glib.h>

#include <optional>
#include <string>

// The text of a parhand file. It lies where everybody may put one, so that only a regular file of
// at most 1 MiB counts that belongs to root, the service account or whoever runs the daemon; it is
// opened once, and a link is not followed. None when there is no file, and with a warning when it
// is one that does not count.
std::optional<std::string> param_read_parhand(const char *path);

// Carries the parameters of a parhand file over into the ports in service, group by group in the
// order of the file. Nothing is stored. What can't be read costs the rest of its group, and the
// first such case is reported in `error` (domain of the control interface); an input group of a
// port that does not exist ends the import.
void param_import_parhand_text(const std::string &text, GError **error);
// The same for a file, which param_read_parhand() reads.
void param_import_parhand(const char *file, GError **error);

// Copies every key of the settings file `input` into the settings file `output`, in place of those
// that are there. False and `error` when either can't be read; false, with a message in the log,
// when the result can't be stored, which leaves `output` as it was.
bool param_upgrade(const char *input, const char *output, GError **error);
