#include "support/kernel-module.h"

#include <fcntl.h>
#include <glib.h>
#include <gtest/gtest.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "base/unique-fd.h"

namespace {
constexpr const char *kModules = "/lib/modules/";
}

KernelModule::KernelModule(std::string name, const std::string &parameters)
    : name_(std::move(name)) {
  const UniqueFd file(open((kModules + name_ + ".ko").c_str(), O_RDONLY | O_CLOEXEC));
  loaded_ = syscall(SYS_finit_module, file.get(), parameters.c_str(), 0) == 0;
  EXPECT_TRUE(loaded_) << name_ << " " << parameters << ": " << g_strerror(errno);
}

KernelModule::~KernelModule() {
  if (loaded_) {
    const int error = unload();
    EXPECT_EQ(error, 0) << name_ << ": " << g_strerror(error);
  }
}

int KernelModule::unload() {
  std::string name = name_;
  std::replace(name.begin(), name.end(), '-', '_');
  if (syscall(SYS_delete_module, name.c_str(), O_NONBLOCK) != 0) {
    return errno;
  }
  loaded_ = false;
  return 0;
}
