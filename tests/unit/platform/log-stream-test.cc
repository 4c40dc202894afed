// Lines for a reader who reads, reads late or has gone.
#include "platform/host/log-stream.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <string>

#include "base/unique-fd.h"

namespace {

std::string lost_line(std::uint64_t count) {
  return "lost " + std::to_string(count) + "\n";
}

// Both ends of a small pipe or of a socket pair.
struct Ends {
  UniqueFd reader;
  UniqueFd writer;
};

Ends make_pipe() {
  std::array<int, 2> ends{};
  EXPECT_EQ(pipe2(ends.data(), O_CLOEXEC), 0);
  EXPECT_GT(fcntl(ends[1], F_SETPIPE_SZ, 8192), 0);
  return {UniqueFd(ends[0]), UniqueFd(ends[1])};
}

Ends make_socket() {
  std::array<int, 2> ends{};
  EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()), 0);
  constexpr int small = 4096;
  EXPECT_EQ(setsockopt(ends[1], SOL_SOCKET, SO_SNDBUF, &small, sizeof(small)), 0);
  return {UniqueFd(ends[0]), UniqueFd(ends[1])};
}

// What has been written by now.
std::string drain(int fd) {
  std::string text;
  std::array<char, 4096> buffer{};
  pollfd entry = {.fd = fd, .events = POLLIN, .revents = 0};
  while (poll(&entry, 1, 0) > 0) {
    const ssize_t size = read(fd, buffer.data(), buffer.size());
    if (size <= 0) {
      break;
    }
    text.append(buffer.data(), static_cast<std::size_t>(size));
  }
  return text;
}

class LogStreams : public testing::TestWithParam<Ends (*)()> {};

TEST_P(LogStreams, WriteWholeLinesToAReaderWhoReads) {
  const Ends ends = GetParam()();
  LogStream stream(ends.writer.get(), lost_line);
  stream.write_line("one\n");
  stream.write_line("two\n");
  EXPECT_EQ(drain(ends.reader.get()), "one\ntwo\n");
}

TEST_P(LogStreams, LoseLinesOfAReaderWhoDoesNotReadAndSayHowMany) {
  const Ends ends = GetParam()();
  LogStream stream(ends.writer.get(), lost_line);
  constexpr int lines = 5000;
  const std::string line = std::string(99, 'x') + "\n";
  for (int i = 0; i < lines; ++i) {
    stream.write_line(line);
  }
  const std::string before = drain(ends.reader.get());
  stream.write_line("back\n");
  const std::string after = drain(ends.reader.get());
  const auto whole = before.size() / line.size();
  const std::string expected = lost_line(lines - whole) + "back\n";
  // A line that was cut is ended before the next, and counts as lost.
  const bool cut = before.size() % line.size() != 0;
  EXPECT_EQ(after, (cut ? "\n" : "") + expected);
}

TEST_P(LogStreams, SurviveAReaderWhoHasGone) {
  Ends ends = GetParam()();
  (void)std::signal(SIGPIPE, SIG_IGN);
  LogStream stream(ends.writer.get(), lost_line);
  ends.reader.reset();
  stream.write_line("to nobody\n");
  stream.write_line("to nobody\n");
}

INSTANTIATE_TEST_SUITE_P(PipesAndSockets, LogStreams, testing::Values(make_pipe, make_socket));

}  // namespace
