// What was done to GPIO lines, as the kernel recorded it.
#pragma once

#include <string>
#include <vector>

// While it lives, the kernel records every change of direction and every level that is set.
class LineHistory {
 public:
  LineHistory();
  LineHistory(const LineHistory &) = delete;
  LineHistory &operator=(const LineHistory &) = delete;
  ~LineHistory();

  // For one line in order: "in", "out", "set 0" and "set 1". Becoming an output sets the level and
  // then the direction.
  static std::vector<std::string> of(int number);
  static void forget();
};
