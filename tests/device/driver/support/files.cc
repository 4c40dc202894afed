#include "support/files.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>

#include "base/glib-ptr.h"
#include "base/unique-fd.h"

namespace {
constexpr int kFileMode = 0644;
constexpr int kFolderMode = 0755;
constexpr int kDecimal = 10;
}  // namespace

std::optional<std::string> read_text(const std::string &path) {
  char *contents = nullptr;
  if (!g_file_get_contents(path.c_str(), &contents, nullptr, nullptr)) {
    return std::nullopt;
  }
  const GCharPtr owner(contents);
  std::string text = contents;
  if (!text.empty() && text.back() == '\n') {
    text.pop_back();
  }
  return text;
}

long long read_number(const std::string &path) {
  const auto text = read_text(path);
  char *end = nullptr;
  const gint64 number = text ? g_ascii_strtoll(text->c_str(), &end, kDecimal) : -1;
  if (!text || end == text->c_str()) {
    ADD_FAILURE() << path << " holds no number";
    return -1;
  }
  return number;
}

int try_write_text(const std::string &path, std::string_view text) {
  const UniqueFd fd(open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, kFileMode));
  if (!fd) {
    return errno;
  }
  const ssize_t written = write(fd.get(), text.data(), text.size());
  return written == static_cast<ssize_t>(text.size()) ? 0 : errno;
}

void write_text(const std::string &path, std::string_view text) {
  const int error = try_write_text(path, text);
  EXPECT_EQ(error, 0) << path << ": " << g_strerror(error);
}

bool exists(const std::string &path) {
  return g_file_test(path.c_str(), G_FILE_TEST_EXISTS) == TRUE;
}

void make_folder(const std::string &path) {
  EXPECT_EQ(g_mkdir_with_parents(path.c_str(), kFolderMode), 0)
      << path << ": " << g_strerror(errno);
}
