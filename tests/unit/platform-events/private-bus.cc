#include "private-bus.h"

#include <glib/gstdio.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>

#include "base/glib-ptr.h"
#include "base/unique-fd.h"

namespace {

// A test that crashes must not leave its bus behind.
void end_with_parent(gpointer /*user_data*/) {
  prctl(PR_SET_PDEATHSIG, SIGTERM);
}

// The bus prints its address when it listens, and nothing after.
void wait_for_address(int fd) {
  char letter = '\0';
  while (read(fd, &letter, 1) == 1 && letter != '\n') {
  }
}

}  // namespace

std::string point_system_bus_at_nothing() {
  static const GCharPtr directory(g_dir_make_tmp("platform-events-XXXXXX", nullptr));
  std::atexit([] {
    g_unlink((std::string(directory.get()) + "/bus").c_str());
    g_rmdir(directory.get());
  });
  std::string address = "unix:path=" + std::string(directory.get()) + "/bus";
  g_setenv("DBUS_SYSTEM_BUS_ADDRESS", address.c_str(), TRUE);
  return address;
}

PrivateBus::PrivateBus(const std::string &address) {
  const std::string option = "--address=" + address;
  const char *const arguments[] = {"dbus-daemon",     "--session",    "--nofork", "--nopidfile",
                                   "--print-address", option.c_str(), nullptr};
  int output = -1;
  Error error;
  if (!g_spawn_async_with_pipes(
          nullptr, const_cast<gchar **>(arguments), nullptr,
          static_cast<GSpawnFlags>(G_SPAWN_SEARCH_PATH | G_SPAWN_DO_NOT_REAP_CHILD),
          end_with_parent, nullptr, &daemon_, nullptr, &output, nullptr, error.out())) {
    g_printerr("No private bus: %s\n", error.message());
    std::abort();
  }
  const UniqueFd printed(output);
  wait_for_address(printed.get());
}

PrivateBus::~PrivateBus() {
  kill(daemon_, SIGTERM);
  waitpid(daemon_, nullptr, 0);
}
