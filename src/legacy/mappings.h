// The files that lead the legacy configuration service to the ports.
#pragma once

// Writes the service registry entry and the legacy mappings for the ports in service. A file that
// can't be written is said in the log and stays as it was; one that would not change is left alone.
// Waits for storage. Main thread.
void legacy_write_mappings();
// Has the storage writer do the same for the ports that are in service now, and does not wait.
void legacy_request_mappings();
// Removes what a power failure while writing has left among the hardware descriptions, where it
// would be taken for one. To be called before those are read. Main thread.
void legacy_remove_unfinished();
