#include "platform/confutils.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>

#include "base/glib-ptr.h"
#include "base/unique-fd.h"
#include "support/file-size-limit.h"
#include "support/recording-listener.h"
#include "support/temp-dir.h"

namespace {

int owner_error = 0;  // an errno: no file changes its owner

}  // namespace

// NOLINTNEXTLINE(readability-inconsistent-declaration-parameter-name): the library's are reserved.
extern "C" int fchown(int fd, uid_t owner, gid_t group) noexcept {
  if (owner_error != 0) {
    errno = owner_error;
    return -1;
  }
  return static_cast<int>(syscall(SYS_fchown, fd, owner, group));
}

namespace {

constexpr uid_t kSomeone = 1234;
constexpr gid_t kSomeGroup = 2345;

bool set_contents(const std::string &path, std::string_view text, Error &error) {
  return confutils_set_file_contents_with_sync(
             path.c_str(), text.data(), static_cast<gssize>(text.size()), error.out()) != FALSE;
}

mode_t mode_of(const std::string &path) {
  struct stat status {};
  EXPECT_EQ(stat(path.c_str(), &status), 0);
  return status.st_mode & ALLPERMS;
}

class Umask {
 public:
  explicit Umask(mode_t mask) : old_(umask(mask)) {}
  ~Umask() { umask(old_); }
  Umask(const Umask &) = delete;
  Umask &operator=(const Umask &) = delete;

 private:
  mode_t old_;
};

TEST(Confutils, MakesANewFileThatEveryoneMayReadWhateverTheUmask) {
  const TempDir dir;
  const Umask tight(0077);
  Error error;
  EXPECT_TRUE(set_contents(dir.path("new"), "text", error));
  EXPECT_FALSE(error);
  EXPECT_EQ(dir.read("new"), "text");
  EXPECT_EQ(mode_of(dir.path("new")), 0644U);
}

TEST(Confutils, ReplacesTheWholeOfAFile) {
  const TempDir dir;
  const std::string file = dir.write("file", "something longer than what comes");
  Error error;
  EXPECT_TRUE(set_contents(file, "short", error));
  EXPECT_EQ(dir.read("file"), "short");
  EXPECT_EQ(dir.names(), Lines{"file"});
}

TEST(Confutils, KeepsTheModeOfTheFileThatItReplaces) {
  const TempDir dir;
  const std::string file = dir.write("file", "old");
  ASSERT_EQ(chmod(file.c_str(), 0640), 0);
  Error error;
  EXPECT_TRUE(set_contents(file, "new", error));
  EXPECT_EQ(mode_of(file), 0640U);
}

TEST(Confutils, KeepsTheOwnerAsFarAsTheCallerMaySetIt) {
  const TempDir dir;
  const std::string file = dir.write("file", "old");
  const bool may_give_away = chown(file.c_str(), kSomeone, kSomeGroup) == 0;
  Error error;
  EXPECT_TRUE(set_contents(file, "new", error));
  struct stat status {};
  ASSERT_EQ(stat(file.c_str(), &status), 0);
  EXPECT_EQ(status.st_uid, may_give_away ? kSomeone : geteuid());
  EXPECT_EQ(status.st_gid, may_give_away ? kSomeGroup : getegid());
  EXPECT_EQ(dir.read("file"), "new");
}

TEST(Confutils, ReplacesAFileWhoseOwnerItMayNotKeep) {
  const TempDir dir;
  const std::string file = dir.write("file", "old");
  Error error;
  owner_error = EPERM;
  EXPECT_TRUE(set_contents(file, "new", error));
  owner_error = 0;
  EXPECT_EQ(dir.read("file"), "new");
}

TEST(Confutils, LeavesTheOldFileWhereItsOwnerCannotBeKeptForAnotherReason) {
  const TempDir dir;
  const std::string file = dir.write("file", "old");
  Error error;
  owner_error = EIO;
  EXPECT_FALSE(set_contents(file, "new", error));
  owner_error = 0;
  EXPECT_TRUE(error.matches(G_FILE_ERROR, G_FILE_ERROR_IO));
  EXPECT_EQ(dir.read("file"), "old");
  EXPECT_EQ(dir.names(), Lines{"file"});
}

TEST(Confutils, WritesNothingAsAnEmptyFile) {
  const TempDir dir;
  const std::string file = dir.write("file", "old");
  Error error;
  EXPECT_TRUE(set_contents(file, "", error));
  EXPECT_EQ(dir.read("file"), "");
}

TEST(Confutils, WritesBytesBeyondAZeroWhenGivenALength) {
  const TempDir dir;
  const std::string_view bytes("a\0b", 3);
  Error error;
  EXPECT_TRUE(set_contents(dir.path("file"), bytes, error));
  EXPECT_EQ(dir.read("file"), bytes);
}

TEST(Confutils, StopsAtTheTerminatingZeroWithoutALength) {
  const TempDir dir;
  const std::string file = dir.path("file");
  EXPECT_TRUE(confutils_set_file_contents_with_sync(file.c_str(), "a\0b", -1, nullptr));
  EXPECT_EQ(dir.read("file"), "a");
}

TEST(Confutils, ReplacesTheFileThatALinkNamesAndKeepsTheLink) {
  const TempDir dir;
  dir.make_directory("elsewhere");
  const std::string target = dir.write("elsewhere/target", "old");
  const std::string link = dir.path("link");
  ASSERT_EQ(symlink("elsewhere/target", link.c_str()), 0);
  Error error;
  EXPECT_TRUE(set_contents(link, "new", error));
  EXPECT_EQ(dir.read("elsewhere/target"), "new");
  struct stat status {};
  ASSERT_EQ(lstat(link.c_str(), &status), 0);
  EXPECT_TRUE(S_ISLNK(status.st_mode));
  EXPECT_EQ(dir.names(), (Lines{"elsewhere", "link"}));
}

// --- Contents that are on storage already ---

ino_t inode_of(const std::string &path) {
  struct stat status {};
  EXPECT_EQ(stat(path.c_str(), &status), 0);
  return status.st_ino;
}

// Whether a file of the contents is replaced when these contents are asked for.
bool replaces(const std::string &file, std::string_view contents) {
  // A file's number may be given to the next one, unless something still has the old file.
  const UniqueFd old(open(file.c_str(), O_RDONLY | O_CLOEXEC));
  const ino_t before = inode_of(file);
  Error error;
  EXPECT_TRUE(set_contents(file, contents, error));
  return inode_of(file) != before;
}

TEST(Confutils, LeavesAFileAloneThatItSyncedWithTheseContents) {
  const TempDir dir;
  const std::string file = dir.path("file");
  Error error;
  EXPECT_TRUE(set_contents(file, "text", error));
  EXPECT_FALSE(replaces(file, "text"));
  EXPECT_TRUE(replaces(file, "tex2"));
  EXPECT_FALSE(replaces(file, "tex2"));
  EXPECT_TRUE(replaces(file, "text"));
  EXPECT_EQ(dir.names(), Lines{"file"});
}

TEST(Confutils, LeavesAFileAloneWhoeverOwnsItNow) {
  const TempDir dir;
  const std::string file = dir.path("file");
  Error error;
  EXPECT_TRUE(set_contents(file, "text", error));
  (void)chown(file.c_str(), kSomeone, kSomeGroup);
  ASSERT_EQ(chmod(file.c_str(), 0600), 0);
  EXPECT_FALSE(replaces(file, "text"));
}

TEST(Confutils, ReplacesTheSameContentsThatSomebodyElseWrote) {
  const TempDir dir;
  const std::string file = dir.write("file", "text");
  EXPECT_TRUE(replaces(file, "text"));
  EXPECT_FALSE(replaces(file, "text"));
  ASSERT_EQ(unlink(file.c_str()), 0);
  dir.write("file", "text");
  EXPECT_TRUE(replaces(file, "text"));
}

TEST(Confutils, IsNotTakenInByATimeOfLastChangeThatLies) {
  const TempDir dir;
  const std::string file = dir.write("file", "text");
  const timespec long_ago[2] = {};
  ASSERT_EQ(utimensat(AT_FDCWD, file.c_str(), long_ago, 0), 0);
  EXPECT_TRUE(replaces(file, "text"));
}

TEST(Confutils, RemembersWhatItSyncedWhateverTheClockSays) {
  const TempDir dir;
  const std::string file = dir.path("file");
  Error error;
  EXPECT_TRUE(set_contents(file, "text", error));
  const timespec years_ahead[2] = {{.tv_sec = 2'000'000'000, .tv_nsec = 0},
                                   {.tv_sec = 2'000'000'000, .tv_nsec = 0}};
  ASSERT_EQ(utimensat(AT_FDCWD, file.c_str(), years_ahead, 0), 0);
  EXPECT_TRUE(replaces(file, "text"));  // not what it left
  EXPECT_FALSE(replaces(file, "text"));
}

TEST(Confutils, RefusesTheLinkOfSomebodyElse) {
  if (geteuid() != 0) {
    return;  // there is nobody to give it to
  }
  const TempDir dir;
  dir.write("target", "old");
  const std::string link = dir.path("link");
  ASSERT_EQ(symlink("target", link.c_str()), 0);
  ASSERT_EQ(lchown(link.c_str(), kSomeone, kSomeGroup), 0);
  Error error;
  EXPECT_FALSE(set_contents(link, "new", error));
  EXPECT_TRUE(error.matches(G_FILE_ERROR, G_FILE_ERROR_PERM)) << error.message();
  EXPECT_EQ(dir.read("target"), "old");
}

TEST(Confutils, FollowsALinkToAFileThatIsStillToBeMade) {
  const TempDir dir;
  const std::string link = dir.path("link");
  ASSERT_EQ(symlink("target", link.c_str()), 0);
  Error error;
  EXPECT_TRUE(set_contents(link, "new", error));
  EXPECT_EQ(dir.read("target"), "new");
  EXPECT_FALSE(replaces(link, "new"));
}

TEST(Confutils, GivesUpOnLinksThatGoRound) {
  const TempDir dir;
  const std::string link = dir.path("link");
  ASSERT_EQ(symlink("link", link.c_str()), 0);
  Error error;
  EXPECT_FALSE(set_contents(link, "new", error));
  EXPECT_TRUE(error.matches(G_FILE_ERROR, G_FILE_ERROR_LOOP)) << error.message();
}

TEST(Confutils, LeavesTheOldFileAndNothingElseWhenTheDiskIsFull) {
  const TempDir dir;
  const std::string file = dir.write("file", "old");
  const std::string large(64, 'x');
  Error error;
  {
    const FileSizeLimit limit(large.size() / 2);
    EXPECT_FALSE(set_contents(file, large, error));
  }
  EXPECT_TRUE(error);
  EXPECT_EQ(error.get()->domain, G_FILE_ERROR);
  EXPECT_EQ(dir.read("file"), "old");
  EXPECT_EQ(dir.names(), Lines{"file"});
}

TEST(Confutils, LeavesNothingBehindWhenANewFileDoesNotFit) {
  const TempDir dir;
  Error error;
  {
    const FileSizeLimit limit(0);
    EXPECT_FALSE(set_contents(dir.path("file"), "text", error));
  }
  EXPECT_TRUE(error);
  EXPECT_EQ(dir.names(), Lines{});
}

TEST(Confutils, RefusesAFileInADirectoryThatDoesNotExist) {
  const TempDir dir;
  Error error;
  EXPECT_FALSE(set_contents(dir.path("missing/file"), "text", error));
  EXPECT_TRUE(error.matches(G_FILE_ERROR, G_FILE_ERROR_NOENT)) << error.message();
}

TEST(Confutils, DoesNotReplaceADirectory) {
  const TempDir dir;
  const std::string directory = dir.make_directory("directory");
  Error error;
  EXPECT_FALSE(set_contents(directory, "text", error));
  EXPECT_TRUE(error.matches(G_FILE_ERROR, G_FILE_ERROR_ISDIR)) << error.message();
  EXPECT_EQ(dir.names(), Lines{"directory"});
}

TEST(Confutils, FailsWithoutAnErrorToSet) {
  EXPECT_FALSE(confutils_set_file_contents_with_sync("/nonexistent/file", "text", -1, nullptr));
}

}  // namespace
