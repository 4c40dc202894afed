// The whole terminal, drawn line by line and given back as it was on every way out of the program.
#pragma once

#include <termios.h>

#include <string>
#include <vector>

class Screen {
 public:
  // Takes the terminal of standard output; ends the program where that is none.
  Screen();
  Screen(const Screen &) = delete;
  Screen &operator=(const Screen &) = delete;
  ~Screen();

  // Asks the terminal for its size anew; the next draw() draws everything.
  void resize();
  int columns() const { return columns_; }
  int rows() const { return rows_; }

  // Writes those of the lines that differ from what stands there. Each is columns() wide at most.
  void draw(const std::vector<std::string> &lines);

 private:
  int columns_ = 80;
  int rows_ = 24;
  std::vector<std::string> shown_;
};
