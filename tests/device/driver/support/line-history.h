// What was done to GPIO lines, as the kernel recorded it.
#pragma once

#include <map>
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
  // The same for several lines, in the order of what was done over all of them. The lines are given
  // by number with a name for each, which begins its entries: "lamp set 1".
  static std::vector<std::string> together(const std::map<int, std::string> &names);
  static void forget();
};
