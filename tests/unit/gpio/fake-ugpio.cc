#include "fake-ugpio.h"

#include <fcntl.h>
#include <glib.h>
#include <poll.h>
#include <ugpio/ugpio.h>

#include <array>
#include <cerrno>

#include "base/glib-ptr.h"

struct Ugpio {
  std::string name;
  bool open = false;
};

namespace {

using Guard = std::lock_guard<std::recursive_mutex>;

int fail(int code) {
  errno = code;
  return -1;
}

void note(const std::string &call, const std::string &name, const std::string &argument = "") {
  fake_ugpio().calls.push_back(call + " " + name + (argument.empty() ? "" : " ") + argument);
}

std::string hexadecimal(unsigned int number) {
  return GCharPtr(g_strdup_printf("0x%X", number)).get();
}

ugpio_t *take(const std::string &call, const std::string &name, unsigned int flags) {
  const Guard guard(fake_ugpio().lock);
  note(call, name, hexadecimal(flags));
  if (const int error = fake_ugpio().line(name).request_error) {
    errno = error;
    return nullptr;
  }
  ++fake_ugpio().requested;
  return new ugpio_t{.name = name};
}

FakeLine &line_of(const ugpio_t *context) {
  return fake_ugpio().line(context->name);
}

}  // namespace

FakeLine::FakeLine() {
  std::array<int, 2> ends{};
  if (pipe2(ends.data(), O_CLOEXEC | O_NONBLOCK) == 0) {
    reader_.reset(ends[0]);
    signalling_.reset(ends[1]);
  }
}

void FakeLine::edge(int level) {
  value = level;
  signal();
}

void FakeLine::hang_up() {
  std::array<int, 2> ends{};
  if (pipe2(ends.data(), O_CLOEXEC) == 0) {
    const UniqueFd writer(ends[1]);
    signalling_.reset(ends[0]);
  }
}

bool FakeLine::signals() const {
  pollfd poll_fd{.fd = fd(), .events = 0, .revents = 0};
  return poll(&poll_fd, 1, 0) > 0;
}

void FakeLine::quieten() {
  if (!reader_) {
    const std::string pipe = "/proc/self/fd/" + std::to_string(fd());
    reader_.reset(open(pipe.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
  }
}

int FakeLine::read() {
  ++reads;
  if (acknowledges) {
    quieten();
  }
  if (read_error != 0) {
    return fail(read_error);
  }
  if (script.empty()) {
    return value;
  }
  const int level = script.front();
  script.pop_front();
  return level;
}

void FakeUgpio::reset() {
  lines.clear();
  calls.clear();
  requested = 0;
}

FakeUgpio &fake_ugpio() {
  static FakeUgpio fake;
  return fake;
}

ugpio_t *ugpio_request(unsigned int gpio, const char * /*label*/) {
  return take("request", std::to_string(gpio), 0);
}

ugpio_t *ugpio_request_named(const char *name) {
  return take("request_named", name, 0);
}

ugpio_t *ugpio_request_one(unsigned int gpio, unsigned int flags, const char *label) {
  return take("request_one " + std::string(label), std::to_string(gpio), flags);
}

ugpio_t *ugpio_request_one_named(const char *name, unsigned int flags) {
  return take("request_one_named", name, flags);
}

int ugpio_full_open(ugpio_t *context) {
  const Guard guard(fake_ugpio().lock);
  if (const int error = line_of(context).open_error) {
    return fail(error);
  }
  context->open = true;
  return 0;
}

int ugpio_set_activelow(ugpio_t *context, int activelow) {
  const Guard guard(fake_ugpio().lock);
  note("activelow", context->name, std::to_string(activelow));
  const int error = line_of(context).activelow_error;
  return error != 0 ? fail(error) : 0;
}

int ugpio_get_value(ugpio_t *context) {
  const Guard guard(fake_ugpio().lock);
  return context->open ? line_of(context).read() : fail(EBADF);
}

int ugpio_set_value(ugpio_t *context, int value) {
  const Guard guard(fake_ugpio().lock);
  note("set", context->name, std::to_string(value));
  FakeLine &line = line_of(context);
  if (!context->open || line.write_error != 0) {
    return fail(context->open ? line.write_error : EBADF);
  }
  line.value = value != 0 ? 1 : 0;
  return 0;
}

int ugpio_fd(ugpio_t *context) {
  const Guard guard(fake_ugpio().lock);
  return context->open ? line_of(context).fd() : fail(EBADF);
}

void ugpio_close(ugpio_t *context) {
  const Guard guard(fake_ugpio().lock);
  context->open = false;
}

void ugpio_free(ugpio_t *context) {
  const Guard guard(fake_ugpio().lock);
  note("free", context->name);
  --fake_ugpio().requested;
  delete context;
}
