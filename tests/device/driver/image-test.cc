// What the daemon takes of a device's storage.
#include <gtest/gtest.h>
#include <sys/stat.h>

namespace {

constexpr long kMostBytes = 300L * 1024;

TEST(Image, LeavesRoomForOthers) {
  struct stat info {};
  ASSERT_EQ(stat("/usr/bin/portd", &info), 0);
  RecordProperty("image_bytes", static_cast<int>(info.st_size));
  EXPECT_LE(info.st_size, kMostBytes);
}

}  // namespace
