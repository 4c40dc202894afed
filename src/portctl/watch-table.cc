#include "portctl/watch-table.h"

#include <algorithm>

#include "portctl/describe.h"
#include "portctl/text.h"

namespace {

constexpr const char *kReverse = "\033[7m";
constexpr const char *kReset = "\033[0m";
constexpr int kLeastNews = 4;
constexpr int kFrame = 4;  // title, heading, line above the news, footer

struct LineState {
  std::string_view word;
  char letter;
  const char *colour;
};
constexpr LineState kLineStates[] = {
    {"open", 'o', "\033[44;97m"},
    {"closed", 'c', "\033[42;30m"},
    {"short", 's', "\033[41;97m"},
    {"cut", 'x', "\033[45;97m"},
};

const LineState *line_state(const std::string &word) {
  const auto *found = std::find_if(std::begin(kLineStates), std::end(kLineStates),
                                   [&](const LineState &state) { return state.word == word; });
  return found == std::end(kLineStates) ? nullptr : found;
}

// As the daemon decides: the last range that holds the level.
const LineState *state_of_level(const Supervision &supervision, std::uint32_t level) {
  const LineState *state = nullptr;
  for (const auto &range : supervision.ranges) {
    if (range.lower <= level && level <= range.upper) {
      state = line_state(range.state);
    }
  }
  return state;
}

std::uint32_t highest_level(const Supervision &supervision) {
  std::uint32_t highest = supervision.level;
  for (const auto &range : supervision.ranges) {
    highest = std::max(highest, range.upper);
  }
  return std::max(highest, 1U);
}

struct Widths {
  int name;
  int rest;
};
constexpr int kNumber = 4;
constexpr int kRole = 10;
constexpr int kState = 10;

Widths widths_of(int columns) {
  const int name = std::clamp(columns / 3, 12, 32);
  return {name, std::max(columns - kNumber - 1 - name - 1 - kRole - kState, 0)};
}

std::string reversed(const std::string &text, bool colours) {
  return colours ? kReverse + text + kReset : text;
}

// The measured line with its bar, or what else there is to say of the port.
std::string rest_of(const Port &port, int width, bool colours) {
  const auto cell = line_cell(port);
  if (!port.supervision || !port.supervision->on || port.supervision->line.empty()) {
    const std::string text = port.supervision ? "supervision off" : port.flag_words();
    return styled(fitted(visible(text), width), Style::kDim, colours);
  }
  constexpr int text_width = 14;
  const std::string text = styled(fitted(cell.text, text_width), cell.style, colours);
  return width > text_width ? text + level_bar(*port.supervision, width - text_width, colours)
                            : text;
}

std::string state_of(const WatchedPort &watched, bool colours) {
  // What changed can be told without colours too.
  const std::string text = fitted(
      std::string(watched.port->state()) + (watched.changed && !colours ? " *" : ""), kState - 1);
  if (watched.changed) {
    return reversed(text, colours) + " ";
  }
  return styled(text, watched.port->active ? Style::kGood : Style::kPlain, colours) + " ";
}

std::string port_line(const WatchedPort &watched, const WatchView &view) {
  const Port &port = *watched.port;
  const Widths widths = widths_of(view.columns);
  const std::string role =
      std::string(port.input ? "input" : "output") + (port.configurable ? " <>" : "");
  const std::string number = std::to_string(port.number);
  const auto indent = static_cast<std::size_t>(std::max(kNumber - display_width(number), 0));
  return std::string(indent, ' ') + number + " " + fitted(visible(port.name()), widths.name) + " " +
         fitted(role, kRole) + state_of(watched, view.colours) +
         rest_of(port, widths.rest, view.colours);
}

std::string heading(const WatchView &view) {
  const Widths widths = widths_of(view.columns);
  const std::string text = "  No " + fitted("Name", widths.name) + " " + fitted("Role", kRole) +
                           fitted("State", kState) + fitted("Line or flags", widths.rest);
  return styled(text, Style::kBold, view.colours);
}

std::string title_line(const WatchView &view) {
  const auto inputs = std::count_if(view.ports.begin(), view.ports.end(),
                                    [](const WatchedPort &watched) { return watched.port->input; });
  const auto count = static_cast<std::ptrdiff_t>(view.ports.size());
  const std::string left = " " + (view.title.empty() ? "" : visible(view.title) + "  ") +
                           (view.up ? std::to_string(count) + " ports: " + std::to_string(inputs) +
                                          " in, " + std::to_string(count - inputs) + " out"
                                    : "the daemon is not running, waiting for it");
  const int room = view.columns - display_width(view.time) - 1;
  return reversed(fitted(left, room) + view.time + " ", view.colours);
}

std::string news_heading(const WatchView &view) {
  const int hidden = static_cast<int>(view.ports.size()) - table_rows(view);
  std::string line = hidden > 0 ? "-- " + std::to_string(hidden) + " more ports: up, down " : "";
  line.resize(static_cast<std::size_t>(view.columns), '-');
  return styled(line, Style::kDim, view.colours);
}

std::string footer(const WatchView &view) {
  return styled(fitted(" q quit   <> can be turned   levels: o open c closed s short x cut, # now",
                       view.columns),
                Style::kDim, view.colours);
}

}  // namespace

std::string level_bar(const Supervision &supervision, int width, bool colours) {
  const auto cells = static_cast<std::uint64_t>(std::max(width - 2, 1));
  const std::uint64_t highest = highest_level(supervision);
  const auto at = std::min(supervision.level * cells / (highest + 1), cells - 1);
  std::string bar = "[";
  for (std::uint64_t i = 0; i < cells; ++i) {
    const auto level = static_cast<std::uint32_t>((2 * i + 1) * (highest + 1) / (2 * cells));
    const LineState *state = state_of_level(supervision, level);
    const char letter = i == at ? '#' : (state ? state->letter : '.');
    const bool coloured = colours && state;
    bar += (coloured ? state->colour : "") + std::string(1, letter) + (coloured ? kReset : "");
  }
  return bar + "]";
}

int table_rows(const WatchView &view) {
  const int room = std::max(view.rows - kFrame - kLeastNews, 1);
  return std::min(static_cast<int>(view.ports.size()), room);
}

std::vector<std::string> watch_lines(const WatchView &view) {
  std::vector<std::string> lines = {title_line(view), heading(view)};
  const int shown = table_rows(view);
  for (int i = 0; i < shown; ++i) {
    const auto index = static_cast<std::size_t>(view.first) + static_cast<std::size_t>(i);
    if (index < view.ports.size()) {
      lines.push_back(port_line(view.ports[index], view));
    }
  }
  lines.push_back(news_heading(view));
  const auto room = static_cast<std::size_t>(std::max(view.rows - kFrame - shown, 0));
  const std::size_t count = std::min(view.news.size(), room);
  for (std::size_t i = view.news.size() - count; i < view.news.size(); ++i) {
    lines.push_back(fitted(view.news[i], view.columns));
  }
  lines.resize(static_cast<std::size_t>(std::max(view.rows - 1, 1)));
  lines.push_back(footer(view));
  return lines;
}
