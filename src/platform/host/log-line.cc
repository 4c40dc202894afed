#include "platform/host/log-line.h"

#include <glib.h>
#include <sys/stat.h>
#include <syslog.h>

#include <string>

namespace {

struct Level {
  const char *word;
  int flag;
  int priority;
};

constexpr Level kLevels[] = {
    {"ERROR", G_LOG_LEVEL_ERROR, LOG_CRIT},        {"CRITICAL", G_LOG_LEVEL_CRITICAL, LOG_ERR},
    {"WARNING", G_LOG_LEVEL_WARNING, LOG_WARNING}, {"MESSAGE", G_LOG_LEVEL_MESSAGE, LOG_NOTICE},
    {"INFO", G_LOG_LEVEL_INFO, LOG_INFO},          {"DEBUG", G_LOG_LEVEL_DEBUG, LOG_DEBUG},
};

const Level *find_level(int level) {
  for (const auto &entry : kLevels) {
    if (level & entry.flag) {
      return &entry;
    }
  }
  return nullptr;
}

// A line break inside the text would let a client forge a log line of its own.
void append_as_one_line(std::string &line, std::string_view text) {
  while (!text.empty() && text.back() == '\n') {
    text.remove_suffix(1);
  }
  for (const char c : text) {
    line += c == '\n' || c == '\r' ? ' ' : c;
  }
}

}  // namespace

bool is_journal_stream(int descriptor, const char *journal_stream) {
  struct stat file {};
  return journal_stream && fstat(descriptor, &file) == 0 &&
         std::to_string(file.st_dev) + ":" + std::to_string(file.st_ino) == journal_stream;
}

std::string log_line(const LogMessage &message, bool with_priority) {
  const Level *level = find_level(message.level);
  std::string line;
  if (with_priority) {
    line += "<" + std::to_string(level ? level->priority : LOG_INFO) + ">";
  }
  line += level ? level->word : "LEVEL" + std::to_string(message.level & G_LOG_LEVEL_MASK);
  line += ": ";
  if (!message.domain.empty()) {
    line.append(message.domain).append(": ");
  }
  append_as_one_line(line, message.text);
  line += '\n';
  return line;
}
