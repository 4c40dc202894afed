// What the process writes to standard output or standard error while a capture lives.
#pragma once

#include <string>

#include "base/unique-fd.h"

class OutputCapture {
 public:
  // STDOUT_FILENO or STDERR_FILENO.
  explicit OutputCapture(int descriptor);
  ~OutputCapture();
  OutputCapture(const OutputCapture &) = delete;
  OutputCapture &operator=(const OutputCapture &) = delete;

  // Ends the capture and gives what was written, which must fit in a pipe (64 KiB).
  std::string text();

 private:
  void give_back();

  int descriptor_;
  UniqueFd saved_;
  UniqueFd reader_;
};

// Reads the descriptor to its end.
std::string read_to_end(int descriptor);
