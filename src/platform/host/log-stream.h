// Lines for a reader who may be slow or stuck, which must not become the writer's trouble.
#pragma once

#include <cstdint>
#include <mutex>
#include <string>
#include <string_view>

class LogStream {
 public:
  // The descriptor stays the caller's. `describe_loss` makes the line that says how many were lost.
  LogStream(int fd, std::string (*describe_loss)(std::uint64_t count))
      : fd_(fd), describe_loss_(describe_loss) {}

  // Writes a line with its line break, or loses it when the reader takes nothing for a moment.
  // Until the reader takes something again, lines are lost without waiting. Any thread.
  void write_line(const std::string &line);

 private:
  bool write_before(std::string_view text, int timeout_ms);

  const int fd_;
  std::string (*const describe_loss_)(std::uint64_t count);
  std::mutex lock_;
  std::uint64_t lost_ = 0;
  bool truncated_ = false;  // the last line that was written lacks its end
};
