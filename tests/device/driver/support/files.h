// Small files of the kernel: attributes in sysfs and configfs, and what /proc says.
#pragma once

#include <optional>
#include <string>
#include <string_view>

// The whole text without its last line break; nothing when it can't be read.
std::optional<std::string> read_text(const std::string &path);
// The text as a number; a test failure and -1 when it is none.
long long read_number(const std::string &path);
// In one write, as attributes want it. The errno of a failure, 0 otherwise.
int try_write_text(const std::string &path, std::string_view text);
// The same, and a test failure when it fails.
void write_text(const std::string &path, std::string_view text);
bool exists(const std::string &path);
void make_folder(const std::string &path);
