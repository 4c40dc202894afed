#include "base/trusted-file.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <utility>

#include "base/glib-ptr.h"

namespace {

constexpr int kMostLinks = 8;

void set_error(GError **error, int code, const char *text) {
  g_set_error_literal(error, G_FILE_ERROR, g_file_error_from_errno(code), text);
  errno = code;
}

void set_error(GError **error, int code) {
  set_error(error, code, g_strerror(code));
}

// More than one name means that the link may have been made elsewhere and for something else.
bool is_trusted(const struct stat &link) {
  return (link.st_uid == 0 || link.st_uid == geteuid()) && link.st_nlink == 1;
}

// What the link that was opened says, for a path that it stands at.
std::optional<std::string> target_of(int link, const std::string &path) {
  std::array<char, PATH_MAX> text{};
  const ssize_t length = readlinkat(link, "", text.data(), text.size());
  if (length <= 0 || static_cast<std::size_t>(length) == text.size()) {
    return std::nullopt;
  }
  std::string target(text.data(), static_cast<std::size_t>(length));
  const std::size_t slash = path.rfind('/');
  return target.front() == '/' || slash == std::string::npos ? target
                                                             : path.substr(0, slash + 1) + target;
}

// The path that the links at the end of `path` lead to, followed one by one. What is no link is
// left to the caller, whose open fails with the reason.
std::optional<std::string> follow_trusted_links(const std::string &path, GError **error) {
  std::string reached = path;
  for (int links = 0; links < kMostLinks; ++links) {
    const UniqueFd fd(open(reached.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
    struct stat status {};
    if (!fd || fstat(fd.get(), &status) != 0 || !S_ISLNK(status.st_mode)) {
      return reached;
    }
    if (!is_trusted(status)) {
      std::string what = "'";
      what.append(reached).append("' is a link of uid ").append(std::to_string(status.st_uid));
      set_error(error, EPERM, what.c_str());
      return std::nullopt;
    }
    auto target = target_of(fd.get(), reached);
    if (!target) {
      break;
    }
    reached = std::move(*target);
  }
  set_error(error, ELOOP);
  return std::nullopt;
}

}  // namespace

RegularFile open_regular_file(const std::string &path, GError **error) {
  RegularFile file;
  // Neither a pipe nor a terminal holds the caller up.
  file.fd.reset(open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  if (!file.fd || fstat(file.fd.get(), &file.status) != 0) {
    set_error(error, errno, errno == ELOOP ? "Is a link" : g_strerror(errno));
    file.fd.reset();
  } else if (!S_ISREG(file.status.st_mode)) {
    set_error(error, EINVAL, "Not a regular file");
    file.fd.reset();
  }
  return file;
}

RegularFile open_trusted_file(std::string &path, GError **error) {
  Error refused;
  RegularFile file = open_regular_file(path, refused.out());
  if (refused.matches(G_FILE_ERROR, G_FILE_ERROR_LOOP)) {
    path = follow_trusted_links(path, error).value_or("");
    return path.empty() ? RegularFile() : open_regular_file(path, error);
  }
  if (refused) {
    g_propagate_error(error, g_error_copy(refused.get()));
  }
  return file;
}

std::optional<std::string> read_file(const RegularFile &file, std::size_t limit, GError **error) {
  constexpr std::size_t step = 65'536;
  std::string text;
  std::size_t length = 0;
  text.resize(std::min(static_cast<std::size_t>(file.status.st_size), limit) + 1);
  for (;;) {
    const ssize_t got = read(file.fd.get(), text.data() + length, text.size() - length);
    if (got < 0 && errno == EINTR) {
      continue;
    }
    if (got < 0) {
      set_error(error, errno);
      return std::nullopt;
    }
    length += static_cast<std::size_t>(got);
    if (length > limit) {
      set_error(error, EFBIG);
      return std::nullopt;
    }
    if (got == 0) {
      text.resize(length);
      return text;
    }
    if (length == text.size()) {
      text.resize(length + step);
    }
  }
}
