// The files that lead the legacy configuration service to the ports.
#pragma once

// Writes the service registry entry and the legacy mappings for the ports in service. A file that
// can't be written is said in the log and stays as it was. Main thread.
void legacy_write_mappings();
// Removes what a power failure while writing has left among the hardware descriptions, where it
// would be taken for one. To be called before those are read. Main thread.
void legacy_remove_unfinished();
