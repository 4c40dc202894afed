// What the checker has to say, with the place it is about.
#pragma once

#include <string>
#include <vector>

struct Place {
  std::string file;
  int line = 1;    // from 1
  int column = 1;  // in characters, from 1
};

struct Finding {
  Place place;
  bool error;  // the daemon would do something else than is meant; else: look again
  std::string text;
};

class Findings {
 public:
  void error(const Place &place, std::string text) { add(place, true, std::move(text)); }
  void warning(const Place &place, std::string text) { add(place, false, std::move(text)); }
  // Each file's findings by place.
  std::vector<Finding> sorted() const;

 private:
  void add(const Place &place, bool is_error, std::string text);

  std::vector<Finding> findings_;
  std::vector<std::string> files_;  // in the order in which they were first named
};

// In double quotes, for messages.
std::string quoted(std::string_view text);

// The one of the words that is the most like `word`, when one is like it at all; else "". Letter
// case,
// "-" for "_" and a plural count as nothing.
std::string_view nearest(std::string_view word, const std::vector<std::string_view> &words);

// "; did you mean "X"?", or nothing.
std::string suggestion(std::string_view word, const std::vector<std::string_view> &words);
