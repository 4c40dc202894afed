#include "platform/kv-log.h"

#include <glib.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <memory>
#include <string>
#include <string_view>

#include "platform/host/log-line.h"
#include "platform/host/log-stream.h"

namespace {

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

// Asked at the first message, when standard output is what it stays.
bool prints_to_journal() {
  static const bool journal = is_journal_stream(STDOUT_FILENO, std::getenv("JOURNAL_STREAM"));
  return journal;
}

std::string describe_loss(std::uint64_t count) {
  const std::string text =
      std::to_string(count) + " log lines were lost: standard output was blocked";
  return log_line({G_LOG_LEVEL_WARNING, G_LOG_DOMAIN, text}, prints_to_journal());
}

LogStream &log_stream() {
  // Never freed: threads may log until the process is gone.
  static LogStream *const stream =
      std::make_unique<LogStream>(STDOUT_FILENO, describe_loss).release();
  return *stream;
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
  const LogMessage message = {level, domain, field(fields, count, "MESSAGE")};
  log_stream().write_line(log_line(message, prints_to_journal()));
  return G_LOG_WRITER_HANDLED;
}

}  // namespace

void kv_log_stdout() {
  g_log_set_writer_func(write_to_stdout, nullptr, nullptr);
}
