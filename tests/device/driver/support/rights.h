// What the device manager's rules do on a device: rights for the group of the service account.
#pragma once

#include <string>

// The group may read and write this file.
void grant(const std::string &path);
// And all that root may write below this folder of sysfs.
void grant_tree(const std::string &folder);
