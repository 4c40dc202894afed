#include "platform/kv-log.h"

#include <glib.h>

#include <cstdio>
#include <string>
#include <string_view>

namespace {

struct Level {
  GLogLevelFlags flag;
  const char *word;
};

constexpr Level kLevels[] = {
    {G_LOG_LEVEL_ERROR, "ERROR"},     {G_LOG_LEVEL_CRITICAL, "CRITICAL"},
    {G_LOG_LEVEL_WARNING, "WARNING"}, {G_LOG_LEVEL_MESSAGE, "MESSAGE"},
    {G_LOG_LEVEL_INFO, "INFO"},       {G_LOG_LEVEL_DEBUG, "DEBUG"},
};

std::string level_word(int level) {
  for (const auto &entry : kLevels) {
    if (level & entry.flag) {
      return entry.word;
    }
  }
  return "LEVEL" + std::to_string(level & G_LOG_LEVEL_MASK);
}

std::string_view field(const GLogField *fields, gsize count, const char *key) {
  for (gsize i = 0; i < count; ++i) {
    if (std::string_view(fields[i].key) == key) {
      const auto *text = static_cast<const char *>(fields[i].value);
      return fields[i].length < 0 ? std::string_view(text)
                                  : std::string_view(text, static_cast<size_t>(fields[i].length));
    }
  }
  return {};
}

// One message is one line, whatever a port's name or a neighbour's error text holds: a line break
// inside the text would let a client forge a log line of its own.
void append_as_one_line(std::string &line, std::string_view text) {
  while (!text.empty() && text.back() == '\n') {
    text.remove_suffix(1);
  }
  for (const char c : text) {
    if (c == '\n' || c == '\r') {
      line += ' ';
    } else {
      line += c;
    }
  }
}

// Applications have levels above GLib's own, which the type that GLib passes them in can't hold by
// the rules of C++. They are read once here, and are plain numbers from then on.
__attribute__((no_sanitize("enum"))) GLogWriterOutput write_to_stdout(GLogLevelFlags flags,
                                                                      const GLogField *fields,
                                                                      gsize count,
                                                                      gpointer /*user_data*/) {
  const int level = flags;
  const std::string domain(field(fields, count, "GLIB_DOMAIN"));
  if ((level & G_LOG_LEVEL_DEBUG) &&
      g_log_writer_default_would_drop(G_LOG_LEVEL_DEBUG,
                                      domain.empty() ? nullptr : domain.c_str())) {
    return G_LOG_WRITER_HANDLED;
  }
  std::string line = level_word(level) + ": ";
  if (!domain.empty()) {
    line += domain + ": ";
  }
  append_as_one_line(line, field(fields, count, "MESSAGE"));
  line += '\n';
  (void)std::fwrite(line.data(), 1, line.size(), stdout);
  (void)std::fflush(stdout);
  return G_LOG_WRITER_HANDLED;
}

}  // namespace

void kv_log_stdout() {
  g_log_set_writer_func(write_to_stdout, nullptr, nullptr);
}
