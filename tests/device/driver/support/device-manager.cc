#include "support/device-manager.h"

#include <gtest/gtest.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <string>
#include <utility>
#include <vector>

#include "support/wait.h"

namespace {

constexpr const char *kControl = "/run/udev/control";

pid_t run(std::vector<std::string> words) {
  std::vector<char *> arguments;
  arguments.reserve(words.size() + 1);
  for (std::string &word : words) {
    arguments.push_back(word.data());
  }
  arguments.push_back(nullptr);
  pid_t pid = 0;
  const int error = posix_spawn(&pid, arguments[0], nullptr, nullptr, arguments.data(), environ);
  EXPECT_EQ(error, 0) << words[0];
  return pid;
}

void expect_done(const std::vector<std::string> &words) {
  int status = -1;
  EXPECT_GT(waitpid(run(words), &status, 0), 0);
  EXPECT_EQ(status, 0) << words[1];
}

// What the kernel does not make anew for the next test.
void take_back(const char *path, mode_t mode) {
  EXPECT_EQ(chown(path, 0, 0), 0) << path;
  EXPECT_EQ(chmod(path, mode), 0) << path;
}

}  // namespace

DeviceManager::DeviceManager() : pid_(run({"/usr/lib/systemd/systemd-udevd"})) {
  EXPECT_TRUE(wait_until([] { return access(kControl, F_OK) == 0; }));
  expect_done({"/usr/bin/udevadm", "trigger", "--action=add"});
  settle();
}

DeviceManager::~DeviceManager() {
  kill(pid_, SIGTERM);
  waitpid(pid_, nullptr, 0);
  constexpr mode_t attribute = 0200;
  constexpr mode_t folder = 0755;
  take_back("/sys/class/gpio/export", attribute);
  take_back("/sys/class/gpio/unexport", attribute);
  take_back("/sys/kernel/config/iio/triggers/hrtimer", folder);
}

void DeviceManager::settle() {
  expect_done({"/usr/bin/udevadm", "settle"});
}
