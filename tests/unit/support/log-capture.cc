#include "support/log-capture.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <iterator>

namespace {

constexpr auto kWarningOrWorse =
    static_cast<GLogLevelFlags>(G_LOG_LEVEL_ERROR | G_LOG_LEVEL_CRITICAL | G_LOG_LEVEL_WARNING);

}  // namespace

LogCapture::LogCapture() {
  g_log_set_default_handler(handle, this);
}

LogCapture::~LogCapture() {
  g_log_set_default_handler(g_log_default_handler, nullptr);
  for (const auto &message : messages_) {
    if (message.level & kWarningOrWorse) {
      ADD_FAILURE() << "nobody expected this in the log: " << message.text;
    }
  }
}

__attribute__((no_sanitize("enum"))) void LogCapture::handle(const gchar * /*domain*/,
                                                             GLogLevelFlags flags,
                                                             const gchar *text, gpointer self) {
  const int level = flags;
  if (level & G_LOG_FLAG_FATAL) {
    std::fprintf(stderr, "%s\n", text);  // the process ends now; say why
  }
  auto *capture = static_cast<LogCapture *>(self);
  const std::lock_guard lock(capture->lock_);
  capture->messages_.push_back({level & G_LOG_LEVEL_MASK, text});
}

template <typename Matches>
bool LogCapture::take_first(Matches matches) {
  const std::lock_guard lock(lock_);
  const auto found = std::find_if(messages_.begin(), messages_.end(), matches);
  if (found == messages_.end()) {
    return false;
  }
  messages_.erase(found);
  return true;
}

bool LogCapture::took(int level, std::string_view text) {
  return take_first([&](const auto &m) { return m.level == level && m.text == text; });
}

bool LogCapture::took_warning(std::string_view text) {
  return took(G_LOG_LEVEL_WARNING, text);
}

bool LogCapture::took_critical(std::string_view text) {
  return took(G_LOG_LEVEL_CRITICAL, text);
}

bool LogCapture::took_containing(int level, std::string_view part) {
  return take_first(
      [&](const auto &m) { return m.level == level && m.text.find(part) != std::string::npos; });
}

std::size_t LogCapture::take_all(int level, std::string_view text) {
  const std::lock_guard lock(lock_);
  return std::erase_if(messages_,
                       [&](const auto &m) { return m.level == level && m.text == text; });
}

std::vector<std::string> LogCapture::take_warnings() {
  const std::lock_guard lock(lock_);
  std::vector<std::string> warnings;
  std::erase_if(messages_, [&](const auto &m) {
    if (m.level == G_LOG_LEVEL_WARNING) {
      warnings.push_back(m.text);
    }
    return m.level == G_LOG_LEVEL_WARNING;
  });
  return warnings;
}

bool LogCapture::empty() {
  const std::lock_guard lock(lock_);
  return messages_.empty();
}

void LogCapture::forget() {
  const std::lock_guard lock(lock_);
  messages_.clear();
}
