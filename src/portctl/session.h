// What one run of portctl was asked to do, and the table of all that it can do.
#pragma once

#include <optional>
#include <span>
#include <string>
#include <vector>

#include "portctl/bus.h"

struct Options {
  bool json = false;
  bool wait = false;      // until a sequence has ended
  bool reported = false;  // report states instead of driving the port
  bool strict = false;    // warnings count as mistakes
  bool help = false;
  std::string address;  // of the bus; empty: the system bus
  std::string settings;
  std::string notes;
  std::string title;
  std::optional<double> timeout;  // seconds
  int repeat = 1;
  std::optional<bool> input_side;
};

struct Session {
  Options options;
  std::vector<std::string> words;  // after the command
  Bus bus;
  bool colours = false;  // on standard output
};

struct Command {
  const char *name;
  const char *usage;    // what follows the name
  const char *summary;  // one line
  const char *help;     // a screen at most, without usage and summary
  const char *options;  // the letters of the options that it takes, see main.cc
  std::size_t least;    // number of words
  std::size_t most;
  int (*run)(Session &session);  // the exit status
};

inline constexpr std::size_t kAny = 1024;

std::span<const Command> commands();

// One word for each: "on", "active", "1", "true" and their opposites. Ends the program otherwise.
bool parse_state(const std::string &word);

// The commands, by file.
int list_command(Session &session);
int get_command(Session &session);
int connectors_command(Session &session);
int events_command(Session &session);
int words_command(Session &session);

int set_command(Session &session);
int toggle_command(Session &session);
int virtual_command(Session &session);
int direction_command(Session &session);
int name_command(Session &session);
int active_command(Session &session);
int drop_command(Session &session);
int refresh_command(Session &session);

int pulse_command(Session &session);
int sequence_command(Session &session);

int supervised_command(Session &session);

int monitor_command(Session &session);
int wait_command(Session &session);

int watch_command(Session &session);

int check_command(Session &session);
