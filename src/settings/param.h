// The port settings file: a key file with one group a port, which outlives restarts. Groups, keys
// and comments of others in it are kept as they are.
//
// Operations lock the file in memory by themselves; the registry lock, where both are needed, is
// taken first. Main thread.
#pragma once

#include <string>

struct IOPort;

inline constexpr const char *kSettingsFile = "/etc/portd/portd.conf";

// Replaces the key file in memory by the contents of `file`; a missing file reads as empty. False,
// with a message on standard error and no key file held, when the file can't be read.
bool param_read_configuration(const std::string &file);
// Writes the key file in memory. False, with a message on standard error, when it can't be stored;
// what the file held before is then untouched.
bool param_write_configuration(const std::string &file);
// Drops the key file in memory.
void param_free_configuration();

// Copies the port's group into the port. False when there is none, or when reading stopped at a key
// that is missing or malformed; what was read before that key stays.
bool param_get_conf_vals(IOPort *ioport);
// Copies the port's settings into its group.
void param_set_conf_vals(IOPort *ioport);

// Stores the settings of one port: into the key file in memory when one is held, else by reading,
// changing and replacing the file. What goes wrong is said on standard error.
void param_save_for_port(IOPort *ioport, const std::string &file);
// The same for every port in service whose number is below their count, in one go.
void param_save_all(const std::string &file);

// Gives the file to the account that the daemon runs under after start-up.
void param_chown_to_service_user(const std::string &file);
