// The port settings file: a key file with one group a port, which outlives restarts. Groups, keys
// and comments of others in it are kept as they are.
//
// Operations take the settings lock by themselves, since the storage writer stores on a thread of
// its own; the registry lock, where both are needed, is taken first. Main thread.
#pragma once

#include <functional>
#include <string>

struct IOPort;

inline constexpr const char *kSettingsFile = "/etc/portd/portd.conf";

// Replaces the key file in memory by the contents of `file`, with every save that was asked for; a
// missing file reads as empty. False, with a message on standard error and no key file held, when
// the file can't be read, or when its existence is not known. Only a regular file is read,
// and a link to one only where root or the daemon's own account owns the link.
bool param_read_configuration(const std::string &file);
// Writes the key file in memory. False, with a message on standard error, when it can't be stored;
// what the file held before is then untouched.
bool param_write_configuration(const std::string &file);
// Drops the key file in memory.
void param_free_configuration();

// Copies the port's group into the port. False when there is none, or when reading stopped at a key
// that is missing or malformed; what was read before that key stays.
bool param_get_conf_vals(IOPort *port);
// Copies the port's settings into its group.
void param_set_conf_vals(IOPort *port);

// Stores the settings of one port: into the key file in memory when one is held, else by reading,
// changing and replacing the file. What goes wrong is said on standard error. Waits for storage.
void param_save_for_port(IOPort *port, const std::string &file);
// Has the storage writer do the same with the settings that the port has now, and does not wait.
// Requests that wait share one read and one write, and of several for one port the last one counts.
// `ended`, if any, is called from the main loop when the save has ended, well or not.
void param_request_save(IOPort *port, const std::string &file,
                        std::function<void()> ended = nullptr);
// The same for every port in service whose number is below their count, at once. Waits for
// storage.
void param_save_all(const std::string &file);

// Gives the file to the account that the daemon runs under after start-up. Where root made the file
// a link, that is the file that it names; nobody else's link is followed.
void param_chown_to_service_user(const std::string &file);
// Removes what saves that were cut off, by a power failure say, have left beside the file.
void param_remove_unfinished(const std::string &file);
