// The hardware description: which ports the device has, what drives them and which events they
// raise. An event parser reads it, so only the order of the start tags counts: each element speaks
// of the port that was made last, wherever it stands.
#pragma once

#include <optional>
#include <string>

// Reads one document into the port registry. False, with a critical message, when it is no regular
// file, could not be read or is malformed; what stood before the error is kept. Main thread, at
// start-up.
bool hwdesc_load_file(const std::string &path);

// Reads the files of a directory in the order in which it lists them, and stops at the first one
// that fails. Without the directory: does nothing.
void hwdesc_load_directory(const std::string &path);

// Lets go of what only reading documents needs. Main thread, after the last document.
void hwdesc_finish();

// The port number of the first virtual input, if a document gave one.
std::optional<int> hwdesc_first_virtual_input();
