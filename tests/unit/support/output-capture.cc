#include "support/output-capture.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <array>
#include <cstdio>

OutputCapture::OutputCapture(int descriptor) : descriptor_(descriptor) {
  std::fflush(nullptr);
  std::array<int, 2> ends{};
  EXPECT_EQ(pipe2(ends.data(), O_CLOEXEC), 0);
  reader_.reset(ends[0]);
  const UniqueFd writer(ends[1]);
  saved_.reset(fcntl(descriptor, F_DUPFD_CLOEXEC, 0));
  EXPECT_EQ(dup2(writer.get(), descriptor), descriptor);
}

OutputCapture::~OutputCapture() {
  give_back();
}

void OutputCapture::give_back() {
  if (saved_) {
    std::fflush(nullptr);
    dup2(saved_.get(), descriptor_);
    saved_.reset();
  }
}

std::string OutputCapture::text() {
  give_back();
  return read_to_end(reader_.get());
}

std::string read_to_end(int descriptor) {
  std::string text;
  std::array<char, 4096> piece{};
  ssize_t length = 0;
  while ((length = read(descriptor, piece.data(), piece.size())) > 0) {
    text.append(piece.data(), static_cast<std::size_t>(length));
  }
  return text;
}
