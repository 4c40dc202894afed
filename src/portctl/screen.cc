#include "portctl/screen.h"

#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <optional>

#include "portctl/bus.h"

namespace {

constexpr const char *kEnterScreen = "\033[?1049h\033[?25l\033[2J";
constexpr const char *kRestoreTerminal = "\033[0m\033[?25h\033[?1049l";
constexpr int kLeastColumns = 40;
constexpr int kLeastRows = 8;

bool taken = false;
std::optional<termios> settings_before;

// A terminal that is gone is no error.
void write_terminal(const std::string &text) {
  std::size_t done = 0;
  while (done < text.size()) {
    const ssize_t written = write(STDOUT_FILENO, text.data() + done, text.size() - done);
    if (written <= 0) {
      return;
    }
    done += static_cast<std::size_t>(written);
  }
}

void restore_terminal() {
  if (!taken) {
    return;
  }
  taken = false;
  write_terminal(kRestoreTerminal);
  if (settings_before) {
    tcsetattr(STDIN_FILENO, TCSAFLUSH, &*settings_before);
  }
}

// Keys come at once and unseen. A stopped program would leave the screen as it is, so there is no
// ^Z.
void read_keys_at_once() {
  termios settings = {};
  if (tcgetattr(STDIN_FILENO, &settings) != 0) {
    return;
  }
  settings_before = settings;
  settings.c_lflag &= ~static_cast<tcflag_t>(ICANON | ECHO);
  settings.c_cc[VSUSP] = _POSIX_VDISABLE;
  settings.c_cc[VMIN] = 1;
  settings.c_cc[VTIME] = 0;
  tcsetattr(STDIN_FILENO, TCSAFLUSH, &settings);
}

}  // namespace

Screen::Screen() {
  if (!isatty(STDOUT_FILENO)) {
    fail(STATUS_USAGE, R"("watch" needs a terminal: "portctl monitor" prints lines)");
  }
  taken = true;
  // Also when the program ends with an error in the middle.
  std::atexit(restore_terminal);
  read_keys_at_once();
  write_terminal(kEnterScreen);
  resize();
}

Screen::~Screen() {
  restore_terminal();
}

void Screen::resize() {
  winsize size = {};
  if (ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0 && size.ws_row > 0) {
    columns_ = std::max<int>(size.ws_col, kLeastColumns);
    rows_ = std::max<int>(size.ws_row, kLeastRows);
  }
  shown_.clear();
  write_terminal("\033[2J");
}

void Screen::draw(const std::vector<std::string> &lines) {
  std::string text;
  const auto rows = std::min(lines.size(), static_cast<std::size_t>(rows_));
  shown_.resize(static_cast<std::size_t>(rows_));
  for (std::size_t i = 0; i < static_cast<std::size_t>(rows_); ++i) {
    const std::string &line = i < rows ? lines[i] : std::string();
    if (line != shown_[i]) {
      text += "\033[" + std::to_string(i + 1) + ";1H" + line + "\033[0m\033[K";
      shown_[i] = line;
    }
  }
  write_terminal(text);
}
