// The GPIO library over sysfs.
#include <fcntl.h>
#include <glib.h>
#include <sys/stat.h>
#include <ugpio/ugpio.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <memory>
#include <string_view>
#include <utility>

#include "base/log.h"
#include "base/unique-fd.h"
#include "platform/host/ugpio-host.h"

struct Ugpio {
  unsigned int number = 0;
  bool exported = false;  // by this context, so it takes the export back
  bool input = false;
  // Until then (monotonic, in microseconds) a missing or forbidden file is waited for.
  gint64 open_deadline = 0;
  bool complete = false;  // one of the files was there, so that a missing one stays missing
  UniqueFd value;
};

namespace {

// The kernel has the files of an exported line ready at once. The rights that a rule of the device
// manager gives to them come a moment later.
constexpr gint64 kOpenTimeout = 500 * G_TIME_SPAN_MILLISECOND;
constexpr gulong kOpenRetryInterval = G_TIME_SPAN_MILLISECOND;

constexpr std::size_t kAttributeSize = 64;

std::string &root() {
  static std::string path = "/sys";
  return path;
}

// Cleaning up after a failure must not hide why it failed.
class ErrnoGuard {
 public:
  ErrnoGuard() = default;
  ErrnoGuard(const ErrnoGuard &) = delete;
  ErrnoGuard &operator=(const ErrnoGuard &) = delete;
  ~ErrnoGuard() { errno = errno_; }

 private:
  int errno_ = errno;
};

int fail(int code) {
  errno = code;
  return -1;
}

template <typename Call>
auto uninterrupted(Call call) {
  auto result = call();
  while (result < 0 && errno == EINTR) {
    result = call();
  }
  return result;
}

std::string class_path(std::string_view file) {
  return root() + "/class/gpio/" + std::string(file);
}

std::string line_path(const ugpio_t &context) {
  return class_path("gpio" + std::to_string(context.number));
}

// Callers say which line failed; only here it is known why.
void explain(const std::string &action, const std::string &path) {
  const ErrnoGuard keeper;
  log_warning("Can't %s %s: %s", action.c_str(), path.c_str(), g_strerror(errno));
}

UniqueFd open_file(const std::string &path, int flags) {
  return UniqueFd(uninterrupted([&] { return open(path.c_str(), flags | O_CLOEXEC); }));
}

bool may_retry_open(const ugpio_t &context, int code) {
  const bool may_change = code == EACCES || (code == ENOENT && !context.complete);
  return may_change && g_get_monotonic_time() < context.open_deadline;
}

UniqueFd open_attribute(ugpio_t &context, const char *name, int flags) {
  const std::string path = line_path(context) + "/" + name;
  UniqueFd fd = open_file(path, flags);
  while (!fd && may_retry_open(context, errno)) {
    g_usleep(kOpenRetryInterval);
    fd = open_file(path, flags);
  }
  context.complete = context.complete || fd;
  return fd;
}

// An attribute takes its text in one piece or not at all.
bool write_text(const UniqueFd &fd, std::string_view text) {
  if (!fd) {
    return false;
  }
  const ssize_t written = uninterrupted([&] { return write(fd.get(), text.data(), text.size()); });
  if (written >= 0 && static_cast<std::size_t>(written) != text.size()) {
    errno = EIO;
  }
  return written >= 0 && static_cast<std::size_t>(written) == text.size();
}

bool write_attribute(ugpio_t &context, const char *name, std::string_view text) {
  return write_text(open_attribute(context, name, O_WRONLY | O_TRUNC), text);
}

bool write_or_explain(ugpio_t &context, const char *name, std::string_view text) {
  const bool written = write_attribute(context, name, text);
  if (!written) {
    explain("write", line_path(context) + "/" + name);
  }
  return written;
}

bool write_number(const char *file, unsigned int number) {
  return write_text(open_file(class_path(file), O_WRONLY | O_TRUNC), std::to_string(number));
}

// --- Taking and giving back ---

bool is_exported(const ugpio_t &context) {
  struct stat status {};
  return stat(line_path(context).c_str(), &status) == 0;
}

bool export_line(ugpio_t &context) {
  if (is_exported(context)) {
    return true;
  }
  if (write_number("export", context.number)) {
    context.exported = true;
    context.open_deadline = g_get_monotonic_time() + kOpenTimeout;
    return true;
  }
  // Busy may also mean that another process exported the line since we looked.
  const int reason = errno;
  if (reason == EBUSY && is_exported(context)) {
    return true;
  }
  errno = reason;
  explain("export GPIO " + std::to_string(context.number) + " with", class_path("export"));
  return false;
}

struct ReleaseLine {
  void operator()(ugpio_t *context) const {
    const ErrnoGuard keeper;
    context->value.reset();
    // EINVAL: the line went away with its chip.
    if (context->exported && !write_number("unexport", context->number) && errno != EINVAL) {
      explain("give GPIO " + std::to_string(context->number) + " back with",
              class_path("unexport"));
    }
    delete context;
  }
};
using ContextPtr = std::unique_ptr<ugpio_t, ReleaseLine>;

ContextPtr request_line(unsigned int gpio) {
  ContextPtr context(new ugpio_t);
  context->number = gpio;
  if (!export_line(*context)) {
    context.reset();
  }
  return context;
}

// --- Direction and edges ---

const char *edge_word(unsigned int flags) {
  const bool falling = (flags & UGPIOF_TRIG_FALL) != 0;
  const bool rising = (flags & UGPIOF_TRIG_RISE) != 0;
  if (falling && rising) {
    return "both";
  }
  return falling ? "falling" : "rising";
}

// A line that can't interrupt has no such file. It can still be read, which is better than no line.
bool set_edges(ugpio_t &context, unsigned int flags) {
  if (write_attribute(context, "edge", edge_word(flags))) {
    return true;
  }
  if (errno != ENOENT) {
    explain("write", line_path(context) + "/edge");
    return false;
  }
  log_warning("GPIO %u has no edge interrupts: its changes are not detected", context.number);
  return true;
}

// Edges that an earlier user left on would keep the line from becoming an output.
bool clear_edges(ugpio_t &context) {
  const auto edges = ugpio_host_read_file(line_path(context) + "/edge");
  return !edges || edges->empty() || edges == "none" || write_or_explain(context, "edge", "none");
}

bool make_input(ugpio_t &context, unsigned int flags) {
  context.input = true;
  if (!write_or_explain(context, "direction", "in")) {
    return false;
  }
  const bool triggers = (flags & (UGPIOF_TRIG_FALL | UGPIOF_TRIG_RISE)) != 0;
  return triggers ? set_edges(context, flags) : clear_edges(context);
}

bool make_output(ugpio_t &context, unsigned int flags) {
  const bool high = (flags & UGPIOF_INIT_HIGH) != 0;
  return clear_edges(context) && write_or_explain(context, "direction", high ? "high" : "low");
}

bool configure(ugpio_t &context, unsigned int flags) {
  return (flags & UGPIOF_DIR_IN) != 0 ? make_input(context, flags) : make_output(context, flags);
}

// --- Values ---

UniqueFd open_value(ugpio_t &context) {
  if (!context.input) {
    UniqueFd fd = open_attribute(context, "value", O_RDWR);
    if (fd || errno != EACCES) {
      return fd;
    }
  }
  return open_attribute(context, "value", O_RDONLY);
}

int parse_level(char level) {
  if (level != '0' && level != '1') {
    return fail(EIO);
  }
  return level == '1' ? 1 : 0;
}

int read_level(int fd) {
  std::array<char, kAttributeSize> text{};
  const ssize_t length = uninterrupted([&] { return pread(fd, text.data(), text.size(), 0); });
  return length < 0 ? -1 : parse_level(text.front());
}

std::optional<unsigned int> number_of(const char *name) {
  if (!name) {
    errno = EINVAL;
    return std::nullopt;
  }
  const auto line = ugpio_host_find_line(name);
  if (!line) {
    explain("find GPIO line", name);
    return std::nullopt;
  }
  const auto number = ugpio_host_line_number(*line);
  if (!number) {
    explain("find the number of GPIO line " + std::string(name) + " in", root() + "/class/gpio");
  }
  return number;
}

}  // namespace

void ugpio_host_set_root(std::string root_path) {
  root() = std::move(root_path);
}

const std::string &ugpio_host_root() {
  return root();
}

std::optional<std::string> ugpio_host_read_file(const std::string &path) {
  const UniqueFd fd = open_file(path, O_RDONLY);
  std::array<char, kAttributeSize> text{};
  const ssize_t length =
      fd ? uninterrupted([&] { return read(fd.get(), text.data(), text.size()); }) : -1;
  if (length < 0) {
    return std::nullopt;
  }
  const std::string_view contents(text.data(), static_cast<std::size_t>(length));
  return std::string(contents.substr(0, contents.find('\n')));
}

ugpio_t *ugpio_request(unsigned int gpio, const char * /*label*/) {
  return request_line(gpio).release();
}

ugpio_t *ugpio_request_named(const char *name) {
  const auto number = number_of(name);
  return number ? ugpio_request(*number, name) : nullptr;
}

ugpio_t *ugpio_request_one(unsigned int gpio, unsigned int flags, const char * /*label*/) {
  ContextPtr context = request_line(gpio);
  if (context && !configure(*context, flags)) {
    context.reset();
  }
  return context.release();
}

ugpio_t *ugpio_request_one_named(const char *name, unsigned int flags) {
  const auto number = number_of(name);
  return number ? ugpio_request_one(*number, flags, name) : nullptr;
}

int ugpio_full_open(ugpio_t *context) {
  if (!context) {
    return fail(EINVAL);
  }
  context->value = open_value(*context);
  if (!context->value) {
    explain("open", line_path(*context) + "/value");
    return -1;
  }
  // A fresh descriptor signals an edge until its first read, whether there was one or not.
  (void)read_level(context->value.get());
  return 0;
}

int ugpio_set_activelow(ugpio_t *context, int activelow) {
  if (!context) {
    return fail(EINVAL);
  }
  return write_or_explain(*context, "active_low", activelow != 0 ? "1" : "0") ? 0 : -1;
}

int ugpio_get_value(ugpio_t *context) {
  return context ? read_level(context->value.get()) : fail(EINVAL);
}

int ugpio_set_value(ugpio_t *context, int value) {
  if (!context) {
    return fail(EINVAL);
  }
  const char level = value != 0 ? '1' : '0';
  return uninterrupted([&] { return pwrite(context->value.get(), &level, 1, 0); }) < 0 ? -1 : 0;
}

int ugpio_fd(ugpio_t *context) {
  if (!context) {
    return fail(EINVAL);
  }
  return context->value ? context->value.get() : fail(EBADF);
}

void ugpio_close(ugpio_t *context) {
  if (context) {
    context->value.reset();
  }
}

void ugpio_free(ugpio_t *context) {
  const ContextPtr released(context);
}
