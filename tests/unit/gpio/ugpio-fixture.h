// The host's GPIO library on a kernel that is played by a directory tree.
#pragma once

#include <gtest/gtest.h>
#include <ugpio/ugpio.h>
#include <unistd.h>

#include <cerrno>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "base/glib-ptr.h"
#include "kernel-tree.h"
#include "platform/host/ugpio-host.h"
#include "support/log-capture.h"

using Writes = std::vector<std::string>;
using ContextPtr = std::unique_ptr<ugpio_t, GlibDeleter<ugpio_free>>;

inline constexpr unsigned int kInput = 0x14D;
inline constexpr unsigned int kOutputHigh = 0x42;
inline constexpr unsigned int kOutputLow = 0x40;

// What the GPIO devices know of the name that is asked for.
inline std::optional<UgpioHostLine> named_line;

class UgpioHostTest : public testing::Test {
 protected:
  UgpioHostTest() { named_line.reset(); }

  static ContextPtr request(unsigned int flags) {
    return ContextPtr(ugpio_request_one(12, flags, "pin"));
  }
  static ContextPtr open(unsigned int flags) {
    ContextPtr context = request(flags);
    EXPECT_EQ(ugpio_full_open(context.get()), 0);
    return context;
  }
  std::string line_file(const char *name) const {
    return tree.read_file(std::string("class/gpio/gpio12/") + name);
  }
  void set_line_modes(unsigned int mode) const {
    for (const auto &[name, text] : tree.attributes) {
      tree.set_mode("class/gpio/gpio12/" + name, mode);
    }
  }
  void set_line_file(const char *name, const char *text) const {
    tree.write_file(std::string("class/gpio/gpio12/") + name, text);
  }

  // Whether there was a warning of that beginning about that file of the kernel.
  bool warned(const std::string &beginning, const std::string &file, int code) {
    return log.took_warning(beginning + " " + ugpio_host_root() + "/class/gpio/" + file + ": " +
                            g_strerror(code));
  }

  LogCapture log;
  KernelTree tree;
};

inline constexpr uid_t kNobody = 65534;

// Takes root's rights away for a while; for other users there is nothing to take away.
class Unprivileged {
 public:
  Unprivileged() {
    if (was_root_) {
      EXPECT_EQ(seteuid(kNobody), 0);
    }
  }
  Unprivileged(const Unprivileged &) = delete;
  Unprivileged &operator=(const Unprivileged &) = delete;
  ~Unprivileged() {
    if (was_root_) {
      EXPECT_EQ(seteuid(0), 0);
    }
  }

 private:
  bool was_root_ = geteuid() == 0;
};

// Has root's rights back for a while, where they were taken away.
class Privileged {
 public:
  Privileged() { EXPECT_EQ(seteuid(getuid()), 0); }
  Privileged(const Privileged &) = delete;
  Privileged &operator=(const Privileged &) = delete;
  ~Privileged() { EXPECT_EQ(seteuid(user_), 0); }

 private:
  uid_t user_ = geteuid();
};
