#include "support/daemon.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdio>

#include "base/glib-ptr.h"
#include "support/client.h"
#include "support/files.h"
#include "support/wait.h"

namespace {

constexpr const char *kProgram = "/usr/bin/portd";
constexpr const char *kLog = "/run/portd.log";
constexpr const char *kDescription = "/usr/share/portd/conf.xml";
constexpr const char *kSettings = "/etc/portd/portd.conf";
constexpr int kLogMode = 0644;
constexpr int kPercent = 100;

std::string process_file(pid_t pid, const char *name) {
  return "/proc/" + std::to_string(pid) + "/" + name;
}

int count_descriptors(pid_t pid) {
  const GDirPtr folder(g_dir_open(process_file(pid, "fd").c_str(), 0, nullptr));
  int count = 0;
  while (folder && g_dir_read_name(folder.get())) {
    ++count;
  }
  return count;
}

long resident_kb(pid_t pid) {
  const std::string status = read_text(process_file(pid, "status")).value_or("");
  const auto line = status.find("VmRSS:");
  return line == std::string::npos ? -1 : std::atol(status.c_str() + line + sizeof("VmRSS:"));
}

// The fields after the name, which is in parentheses and may hold anything.
long cpu_ms(pid_t pid) {
  const std::string stat = read_text(process_file(pid, "stat")).value_or("");
  const auto name_end = stat.rfind(')');
  unsigned long user = 0;
  unsigned long system = 0;
  if (name_end == std::string::npos ||
      std::sscanf(stat.c_str() + name_end + 1,
                  " %*c %*d %*d %*d %*d %*d %*u %*u %*u %*u %*u %lu %lu", &user, &system) != 2) {
    return -1;
  }
  return static_cast<long>(user + system) * 1000 / sysconf(_SC_CLK_TCK);
}

}  // namespace

Daemon::~Daemon() {
  if (running()) {
    kill_hard();
  }
}

void Daemon::install(const std::string &ports) {
  unlink(kLog);
  make_folder("/usr/share/portd");
  write_text(kDescription, "<ports>" + ports + "</ports>");
  write_text(kSettings, "");
}

void Daemon::launch() {
  ASSERT_FALSE(running());
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, kLog, O_WRONLY | O_CREAT | O_APPEND,
                                   kLogMode);
  posix_spawn_file_actions_adddup2(&actions, STDOUT_FILENO, STDERR_FILENO);
  std::string program = kProgram;
  std::array<char *, 2> arguments{program.data(), nullptr};
  const int error = posix_spawn(&pid_, kProgram, &actions, nullptr, arguments.data(), environ);
  posix_spawn_file_actions_destroy(&actions);
  ASSERT_EQ(error, 0) << g_strerror(error);
}

void Daemon::start() {
  launch();
  Client client;
  ASSERT_TRUE(wait_until([&] { return client.answers(); })) << log();
}

int Daemon::wait_for_end() {
  int status = 0;
  const pid_t pid = std::exchange(pid_, 0);
  const bool ended = wait_until([&] { return waitpid(pid, &status, WNOHANG) == pid; });
  if (!ended) {
    ADD_FAILURE() << "the daemon does not end";
    kill(pid, SIGKILL);
    waitpid(pid, &status, 0);
  }
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

int Daemon::run_to_end() {
  launch();
  return wait_for_end();
}

int Daemon::stop() {
  kill(pid_, SIGTERM);
  return wait_for_end();
}

void Daemon::kill_hard() {
  kill(pid_, SIGKILL);
  (void)wait_for_end();
}

ProcessUse Daemon::use() const {
  return {.descriptors = count_descriptors(pid_),
          .memory_kb = resident_kb(pid_),
          .cpu_ms = cpu_ms(pid_)};
}

int Daemon::load_percent(int milliseconds) const {
  const long before = use().cpu_ms;
  run_loop_for(milliseconds * G_TIME_SPAN_MILLISECOND);
  return static_cast<int>((use().cpu_ms - before) * kPercent / milliseconds);
}

std::string Daemon::log() {
  return read_text(kLog).value_or("");
}

bool Daemon::logged(const std::string &text) {
  return log().find(text) != std::string::npos;
}

int Daemon::log_count(const std::string &text) {
  const std::string all = log();
  int count = 0;
  for (auto at = all.find(text); at != std::string::npos; at = all.find(text, at + text.size())) {
    ++count;
  }
  return count;
}
