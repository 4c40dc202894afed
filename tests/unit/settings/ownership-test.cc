// Giving the settings file to the service account. The account data base of the machine that runs
// the tests may hold anything, so these tests have one of their own.
#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>

#include <string_view>

#include "settings/param-fixture.h"

namespace {

passwd *account = nullptr;
group *account_group = nullptr;

}  // namespace

extern "C" passwd *getpwnam(const char *name) {
  return std::string_view(name) == "pcd" ? account : nullptr;
}

extern "C" group *getgrnam(const char *name) {
  return std::string_view(name) == "pcd" ? account_group : nullptr;
}

namespace {

constexpr uid_t kServiceUid = 4321;
constexpr gid_t kServiceGid = 5432;

class SettingsOwner : public Settings {
 protected:
  ~SettingsOwner() override {
    account = nullptr;
    account_group = nullptr;
  }
  // Only root may give a file away; everyone may keep it.
  const bool root = geteuid() == 0;
  passwd known_user = [this] {
    passwd user{};
    user.pw_uid = root ? kServiceUid : geteuid();
    return user;
  }();
  group known_group = [this] {
    group found{};
    found.gr_gid = root ? kServiceGid : getegid();
    return found;
  }();
};

TEST_F(SettingsOwner, IsTheServiceAccount) {
  account = &known_user;
  account_group = &known_group;
  dir.write("portd.conf", "");
  param_chown_to_service_user(file);
  struct stat status {};
  ASSERT_EQ(stat(file.c_str(), &status), 0);
  EXPECT_EQ(status.st_uid, known_user.pw_uid);
  EXPECT_EQ(status.st_gid, known_group.gr_gid);
}

TEST_F(SettingsOwner, StaysWhenTheAccountDoesNotExist) {
  account_group = &known_group;
  dir.write("portd.conf", "");
  param_chown_to_service_user(file);
  EXPECT_TRUE(log.took_warning("Failed to get uid"));
  struct stat status {};
  ASSERT_EQ(stat(file.c_str(), &status), 0);
  EXPECT_EQ(status.st_uid, geteuid());
}

TEST_F(SettingsOwner, StaysWhenTheGroupDoesNotExist) {
  account = &known_user;
  dir.write("portd.conf", "");
  param_chown_to_service_user(file);
  EXPECT_TRUE(log.took_warning("Failed to get gid"));
  struct stat status {};
  ASSERT_EQ(stat(file.c_str(), &status), 0);
  EXPECT_EQ(status.st_uid, geteuid());
}

TEST_F(SettingsOwner, StaysThatOfAFileWithASecondName) {
  account = &known_user;
  account_group = &known_group;
  dir.write("secret", "");
  ASSERT_EQ(link(dir.path("secret").c_str(), file.c_str()), 0);
  param_chown_to_service_user(file);
  EXPECT_TRUE(log.took_containing(G_LOG_LEVEL_WARNING, "chown failed on file '" + file + "': "));
  struct stat status {};
  ASSERT_EQ(stat(file.c_str(), &status), 0);
  EXPECT_EQ(status.st_uid, geteuid());
}

TEST_F(SettingsOwner, StaysThatOfAFileThatSomebodyElseLinksTo) {
  if (!root) {
    return;  // nobody else can make the link
  }
  account = &known_user;
  account_group = &known_group;
  dir.write("secret", "");
  ASSERT_EQ(symlink("secret", file.c_str()), 0);
  ASSERT_EQ(lchown(file.c_str(), kServiceUid, kServiceGid), 0);
  param_chown_to_service_user(file);
  EXPECT_TRUE(log.took_warning("chown failed on file '" + file + "': (1) Operation not permitted"));
  struct stat status {};
  ASSERT_EQ(stat(file.c_str(), &status), 0);
  EXPECT_EQ(status.st_uid, 0U);
}

TEST_F(SettingsOwner, OfAFileThatIsTheAccountsAlreadyIsNotChanged) {
  account = &known_user;
  account_group = &known_group;
  dir.write("portd.conf", "");
  param_chown_to_service_user(file);
  struct stat before {};
  ASSERT_EQ(stat(file.c_str(), &before), 0);
  param_chown_to_service_user(file);
  struct stat after {};
  ASSERT_EQ(stat(file.c_str(), &after), 0);
  EXPECT_EQ(after.st_ctim.tv_sec, before.st_ctim.tv_sec);
  EXPECT_EQ(after.st_ctim.tv_nsec, before.st_ctim.tv_nsec);
}

TEST_F(SettingsOwner, CanNotBeChangedOfAFileThatIsMissing) {
  account = &known_user;
  account_group = &known_group;
  param_chown_to_service_user(file);
  EXPECT_TRUE(
      log.took_warning("chown failed on file '" + file + "': (2) No such file or directory"));
}

}  // namespace
