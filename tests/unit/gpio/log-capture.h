// Collects what the code under test logs, instead of printing it.
#pragma once

#include <glib.h>

#include <algorithm>
#include <string>
#include <vector>

class LogCapture {
 public:
  LogCapture() : old_(g_log_set_default_handler(take, this)) {}
  LogCapture(const LogCapture &) = delete;
  LogCapture &operator=(const LogCapture &) = delete;
  ~LogCapture() { g_log_set_default_handler(old_, nullptr); }

  // How often this very message was logged as a warning.
  long count(const std::string &message) const {
    return std::count(warnings_.begin(), warnings_.end(), message);
  }
  const std::vector<std::string> &warnings() const { return warnings_; }

 private:
  static void take(const gchar * /*domain*/, GLogLevelFlags level, const gchar *message,
                   gpointer self) {
    if ((level & G_LOG_LEVEL_WARNING) != 0) {
      static_cast<LogCapture *>(self)->warnings_.emplace_back(message);
    }
  }

  GLogFunc old_;
  std::vector<std::string> warnings_;
};
