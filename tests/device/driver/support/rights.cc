#include "support/rights.h"

#include <grp.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

namespace {
constexpr mode_t kGroupMayWrite = 0664;
}

void grant(const std::string &path) {
  const group *hardware = getgrnam("hardware");
  ASSERT_TRUE(hardware);
  EXPECT_EQ(chown(path.c_str(), 0, hardware->gr_gid), 0) << path;
  EXPECT_EQ(chmod(path.c_str(), kGroupMayWrite), 0) << path;
}

void grant_tree(const std::string &folder) {
  for (const auto &entry :
       std::filesystem::recursive_directory_iterator(std::filesystem::canonical(folder))) {
    if (entry.is_regular_file() &&
        (entry.status().permissions() & std::filesystem::perms::owner_write) !=
            std::filesystem::perms::none) {
      grant(entry.path());
    }
  }
}
