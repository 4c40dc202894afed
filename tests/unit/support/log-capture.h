// What GLib logs while a capture lives. A test takes the messages that it provokes; a warning, or
// worse, that nobody took fails the test when the capture ends.
#pragma once

#include <glib.h>

#include <cstddef>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

struct LogMessage {
  int level;  // a number, since applications have levels that GLogLevelFlags does not hold
  std::string text;
};

// One at a time in a process. Messages may come from any thread.
class LogCapture {
 public:
  LogCapture();
  ~LogCapture();
  LogCapture(const LogCapture &) = delete;
  LogCapture &operator=(const LogCapture &) = delete;

  // Takes the oldest message of that level and text. False: there is none.
  [[nodiscard]] bool took(int level, std::string_view text);
  [[nodiscard]] bool took_warning(std::string_view text);
  [[nodiscard]] bool took_critical(std::string_view text);
  // The same for a part of the text, where the system words the rest.
  [[nodiscard]] bool took_containing(int level, std::string_view part);
  // Takes every message of that level and text and gives their number.
  [[nodiscard]] std::size_t take_all(int level, std::string_view text);
  // Takes the texts of all warnings, oldest first.
  [[nodiscard]] std::vector<std::string> take_warnings();
  // Whether nothing was logged that nobody took.
  [[nodiscard]] bool empty();
  // Takes everything, for tests that are not about what is logged.
  void forget();

 private:
  static void handle(const gchar *domain, GLogLevelFlags flags, const gchar *text, gpointer self);
  template <typename Matches>
  bool take_first(Matches matches);

  std::mutex lock_;
  std::vector<LogMessage> messages_;
};
