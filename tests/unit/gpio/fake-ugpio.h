// The GPIO library as the backends see it, with lines that tests play with. A line is known by its
// number in decimal, or by its name.
#pragma once

#include <deque>
#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "base/unique-fd.h"

class FakeLine {
 public:
  FakeLine();

  // The line changes and its descriptor signals it.
  void edge(int level);
  // The descriptor signals, whatever the line does.
  void signal() { reader_.reset(); }
  // Its descriptor signals a hang-up, or is none at all.
  void hang_up();
  void vanish() { signalling_.reset(); }
  bool signals() const;

  int read();

  int value = 0;
  std::deque<int> script;  // what the next reads give, before `value` is given
  int reads = 0;
  int request_error = 0;  // an errno for each call, 0: it succeeds
  int open_error = 0;
  int activelow_error = 0;
  int read_error = 0;
  int write_error = 0;
  bool acknowledges = true;  // reading ends the signal

  int fd() const { return signalling_.get(); }

 private:
  void quieten();

  UniqueFd signalling_;  // the writing end of a pipe: signals an error while nobody can read
  UniqueFd reader_;
};

struct FakeUgpio {
  std::map<std::string, FakeLine> lines;
  std::vector<std::string> calls;  // requests, writes and releases, in order
  int requested = 0;               // lines that are out
  std::recursive_mutex lock;

  FakeLine &line(const std::string &name) { return lines[name]; }
  std::vector<std::string> take_calls() { return std::exchange(calls, {}); }
  void reset();
};

FakeUgpio &fake_ugpio();
