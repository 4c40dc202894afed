// What the watch shows, as lines of a given width. Pure: no terminal, no bus.
#pragma once

#include <deque>
#include <string>
#include <vector>

#include "portctl/ports.h"

struct WatchedPort {
  const Port *port;
  bool changed;  // lately: worth the eye
};

struct WatchView {
  std::vector<WatchedPort> ports = {};
  std::deque<std::string> news = {};  // the newest last; visible text
  std::string title = {};
  std::string time = {};
  bool up = false;  // the daemon serves
  int columns = 80;
  int rows = 24;
  int first = 0;  // the port in the uppermost line of the table
  bool colours = false;
};

// Lines of the table that there is room for.
int table_rows(const WatchView &view);

// All lines of the screen, at most `rows` of at most `columns` each.
std::vector<std::string> watch_lines(const WatchView &view);

// `width` cells over all levels that the ranges name: each shows by its letter which state its
// levels mean (o open, c closed, s short, x cut, . none), and # stands where the level is.
std::string level_bar(const Supervision &supervision, int width, bool colours);
