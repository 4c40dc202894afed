// Kernel attribute files of the industrial I/O converters. Main thread.
#pragma once

#include <glib.h>

#include <optional>
#include <string>

// Where /sys and /dev are found. For tests, which have a tree of their own; the daemon never calls
// it.
void iio_set_root(std::string root);
// A path below that root.
std::string iio_path(const std::string &absolute);

// What the file holds up to its last newline. Nothing, with a message, when it can't be read; with
// `error` in place of the message where one is asked for.
std::optional<std::string> sysfs_read(const std::string &path);
std::optional<std::string> sysfs_read(const std::string &path, GError **error);
enum class SysfsWrite { kDone, kNotOpened, kNotWritten, kNotClosed };
// Writes a text in one piece. A failure is logged; what follows may work all the same.
SysfsWrite sysfs_write(const std::string &path, const std::string &text);
// Writes a flag: the first digit of a number.
SysfsWrite sysfs_write_number(const std::string &path, int number);

enum IioKind { IIO_KIND_DEVICE = 0, IIO_KIND_TRIGGER = 1 };

// The kernel's name for a device or trigger, "iio:device3" or "trigger0".
std::string iio_entry(int kind, int number);
// Its folder, with a slash at the end.
std::string iio_folder(int kind, int number);
// The number of the first entry of that kind whose name is `name`; -1 when there is none.
int iio_find_number(const std::string &name, int kind);
// Whether the device of that number is there and has that name. Logs nothing.
bool iio_is_device(int number, const std::string &name);
