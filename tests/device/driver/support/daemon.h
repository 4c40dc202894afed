// The daemon as the device runs it: /usr/bin/portd as root, with its files where they always are.
#pragma once

#include <sys/types.h>

#include <string>

struct ProcessUse {
  int descriptors = 0;
  long memory_kb = 0;  // resident
  long cpu_ms = 0;     // since it was started
};

class Daemon {
 public:
  Daemon() = default;
  Daemon(const Daemon &) = delete;
  Daemon &operator=(const Daemon &) = delete;
  ~Daemon();

  // Writes the hardware description, which is given without its root element, and an empty settings
  // file. The daemon must not run.
  static void install(const std::string &ports);
  // Starts the daemon and waits until it answers on the bus.
  void start();
  // For a daemon that does not get that far: its exit status, or -1 when a signal ended it.
  int run_to_end();
  // SIGTERM; the exit status, or -1 when a signal ended it.
  int stop();
  void kill_hard();

  bool running() const { return pid_ > 0; }
  pid_t pid() const { return pid_; }
  ProcessUse use() const;
  // How much processor time it takes in this much time, in percent.
  int load_percent(int milliseconds) const;
  // All that it has printed since the test began.
  static std::string log();
  static bool logged(const std::string &text);
  static int log_count(const std::string &text);

 private:
  void launch();
  int wait_for_end();
  pid_t pid_ = 0;
};
