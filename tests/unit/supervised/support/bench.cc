#include "support/bench.h"

#include <dlfcn.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <deque>
#include <filesystem>
#include <fstream>
#include <mutex>
#include <sstream>
#include <utility>

#include "base/glib-ptr.h"
#include "daemon/backends.h"
#include "port/ioport-private.h"
#include "port/port-listener.h"

namespace {

constexpr int kManyTurns = 1000;

struct Timer {
  guint id;
  guint interval;
};

std::vector<Timer> all_timers;
std::vector<std::string> all_reports;
std::mutex logged_lock;
std::vector<std::string> all_logged;  // guarded by logged_lock
std::vector<std::string> broken_files;
std::vector<std::string> broken_devices;
std::deque<std::string> coming_texts;

bool is_broken(int fd, const std::vector<std::string> &broken) {
  if (broken.empty()) {
    return false;
  }
  std::error_code error;
  const auto file = std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(fd), error);
  errno = EIO;
  return std::find(broken.begin(), broken.end(), file.string()) != broken.end();
}

// How the kernel takes a 64-bit offset depends on the machine; the C library knows.
template <typename Function>
Function *real_call(const char *name) {
  return reinterpret_cast<Function *>(dlsym(RTLD_NEXT, name));
}

std::string make_folder() {
  std::string folder = testing::TempDir() + "portd-bench-XXXXXX";
  g_assert(mkdtemp(folder.data()));
  return folder;
}

bool armed(const Timer &timer) {
  return g_main_context_find_source_by_id(nullptr, timer.id) != nullptr;
}

void forget_dead_timers() {
  std::erase_if(all_timers, [](const Timer &timer) { return !armed(timer); });
}

const char *level_word(int level) {
  switch (level & G_LOG_LEVEL_MASK) {
    case G_LOG_LEVEL_CRITICAL:
      return "critical";
    case G_LOG_LEVEL_WARNING:
      return "warning";
    default:
      return "info";
  }
}

// What is logged by a library is a mistake that the daemon made in calling it. Applications have
// levels that the type does not hold.
__attribute__((no_sanitize("enum"))) void on_log(const gchar *domain, GLogLevelFlags level,
                                                 const gchar *text, gpointer /*user_data*/) {
  if (g_strcmp0(domain, G_LOG_DOMAIN) != 0) {
    ADD_FAILURE() << (domain ? domain : "(no domain)") << ": " << text;
  }
  const int number = level;
  const std::lock_guard lock(logged_lock);
  all_logged.push_back(std::string(level_word(number)) + ": " + text);
}

void on_port_changed(const PortChange &change) {
  all_reports.push_back(std::to_string(change.number) + (change.state ? " on" : " off"));
}

// The supervised event asks the port for the state that it tells, whatever was reported.
void on_send_event(IOPort *port, IoEvent * /*event*/, std::int32_t /*state*/) {
  const SupervisedRangeState state = io_port_get_supervised_state(port);
  all_reports.push_back(std::string("event ") + supervised_range_state2string(state));
}

}  // namespace

// The daemon's timers run on the main loop's clock. Here the test is the clock: a timer is a source
// that gets ready only when the test makes it.
extern "C" guint g_timeout_add(guint interval, GSourceFunc function, gpointer data) {
  GSource *source = g_timeout_source_new(G_MAXINT);
  g_source_set_callback(source, function, data, nullptr);
  const guint id = g_source_attach(source, nullptr);
  g_source_unref(source);
  all_timers.push_back({id, interval});
  return id;
}

// GPIO lines are read and driven with these two.
// NOLINTNEXTLINE(readability-inconsistent-declaration-parameter-name): the library's are reserved.
extern "C" ssize_t pread64(int fd, void *buffer, size_t size, off64_t offset) {
  static const auto real = real_call<ssize_t(int, void *, size_t, off64_t)>("pread64");
  return is_broken(fd, broken_files) ? -1 : real(fd, buffer, size, offset);
}

// NOLINTNEXTLINE(readability-inconsistent-declaration-parameter-name)
extern "C" ssize_t pwrite64(int fd, const void *buffer, size_t size, off64_t offset) {
  static const auto real = real_call<ssize_t(int, const void *, size_t, off64_t)>("pwrite64");
  return is_broken(fd, broken_files) ? -1 : real(fd, buffer, size, offset);
}

// Samples are read with this.
// NOLINTNEXTLINE(readability-inconsistent-declaration-parameter-name)
extern "C" ssize_t read(int fd, void *buffer, size_t size) {
  static const auto real = real_call<ssize_t(int, void *, size_t)>("read");
  return is_broken(fd, broken_devices) ? -1 : real(fd, buffer, size);
}

// Attributes of the kernel are read with this.
extern "C" gboolean g_file_get_contents(const gchar *filename, gchar **contents, gsize *length,
                                        GError **error) {
  static const auto real =
      reinterpret_cast<decltype(&g_file_get_contents)>(dlsym(RTLD_NEXT, "g_file_get_contents"));
  if (coming_texts.empty()) {
    return real(filename, contents, length, error);
  }
  *contents = g_strdup(coming_texts.front().c_str());
  coming_texts.pop_front();
  return TRUE;
}

extern "C" void g_usleep(gulong /*microseconds*/) {}

Bench::Bench() : root_(make_folder()), lines_(root_) {
  g_log_set_default_handler(on_log, nullptr);
  all_reports.clear();
  {
    const std::lock_guard lock(logged_lock);
    all_logged.clear();
  }
  coming_texts.clear();
  port_listener() = {};
  port_listener().port_changed = on_port_changed;
  port_listener().send_event = on_send_event;
  backends_register();
}

Bench::~Bench() {
  mend_lines();
  std::error_code ignored;
  std::filesystem::remove_all(root_, ignored);
}

void Bench::write(std::string_view name, std::string_view text) const {
  const std::filesystem::path file = path(name);
  std::filesystem::create_directories(file.parent_path());
  std::ofstream(file) << text;
}

std::string Bench::read(std::string_view name) const {
  std::ifstream file(path(name));
  if (!file || std::filesystem::is_directory(path(name))) {
    return "(none)";
  }
  std::ostringstream text;
  text << file.rdbuf();
  return text.str();
}

void Bench::remove(std::string_view name) const {
  std::filesystem::remove_all(path(name));
}

void Bench::block(std::string_view name) const {
  remove(name);
  std::filesystem::create_directories(path(name));
}

void Bench::texts_to_come(const std::vector<std::string> &texts) {
  coming_texts.assign(texts.begin(), texts.end());
}

void Bench::make_line(int number) const {
  lines_.make_line(number);
}

void Bench::set_line(int number, bool level) const {
  write("class/gpio/gpio" + std::to_string(number) + "/value", level ? "1\n" : "0\n");
}

bool Bench::line(int number) const {
  return read("class/gpio/gpio" + std::to_string(number) + "/value").front() == '1';
}

void Bench::break_line(int number) const {
  broken_files.push_back(lines_.line_path(number, "value"));
}

void Bench::break_reads(std::string_view name) const {
  broken_devices.push_back(path(name));
}

void Bench::mend_lines() {
  broken_devices.clear();
  broken_files.clear();
}

IOPortRef Bench::make_port(BackendKind kind, PortType type,
                           const std::vector<Property> &properties) {
  IOPortRef port(io_port_new());
  io_port_set_type(port.get(), type);
  io_port_restore_direction(port.get(), io_port_direction_input(port.get()));
  io_port_set_id(port.get(), "line");
  io_port_set_number(port.get(), 1);
  io_port_restore_name(port.get(), "Line", true);
  io_port_set_backend(port.get(), kind);
  for (const auto &property : properties) {
    io_port_set_backend_property(port.get(), property.section, property.key,
                                 property.value.c_str());
  }
  return port;
}

void Bench::add_supervised_event(const IOPortRef &port) {
  IoEvent event;
  event.supervised_input = true;
  io_port_events(port.get()).push_front(std::move(event));
}

SupervisedRanges Bench::ranges_of(const IOPortRef &port) {
  SupervisedRanges ranges;
  EXPECT_TRUE(io_port_get_supervised_ranges(port.get(), &ranges));
  return ranges;
}

std::string Bench::readout(const IOPortRef &port) {
  SupervisedRangeState state = SUPERVISED_STATE_OPEN;
  std::uint32_t level = 0;
  Error error;
  if (io_port_get_supervised_readout(port.get(), &state, &level, error.out())) {
    return std::string(supervised_range_state2string(state)) + " " + std::to_string(level);
  }
  return "error " + std::to_string(error.get()->code) + ": " + error.message();
}

void Bench::expect_control_pins_die_for_an_output(const IOPortRef &port, const char *place) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_DEATH(
      {
        io_port_set_type(port.get(), PORT_OUTPUT);
        port->functions->set_direction(port.get(), true);
      },
      std::string(place) + ".*port->type == PORT_INPUT");
}

std::vector<std::string> Bench::reports() {
  return std::exchange(all_reports, {});
}

std::vector<std::string> Bench::logged() {
  const std::lock_guard lock(logged_lock);
  return std::exchange(all_logged, {});
}

bool Bench::was_logged(std::string_view line) {
  const std::lock_guard lock(logged_lock);
  return std::find(all_logged.begin(), all_logged.end(), line) != all_logged.end();
}

void Bench::iterate() {
  for (int turns = 0; g_main_context_iteration(nullptr, FALSE); ++turns) {
    if (turns == kManyTurns) {
      ADD_FAILURE() << "the main loop does not come to rest";
      return;
    }
  }
}

std::size_t Bench::sources() {
  GSource *last = g_idle_source_new();
  const guint end = g_source_attach(last, nullptr);
  g_source_destroy(last);
  g_source_unref(last);
  std::size_t count = 0;
  for (guint id = 1; id < end; ++id) {
    count += g_main_context_find_source_by_id(nullptr, id) ? 1 : 0;
  }
  return count;
}

std::vector<guint> Bench::timers() {
  forget_dead_timers();
  std::vector<guint> intervals(all_timers.size());
  std::transform(all_timers.begin(), all_timers.end(), intervals.begin(),
                 [](const Timer &timer) { return timer.interval; });
  return intervals;
}

void Bench::expire_all() {
  for (const guint interval : timers()) {
    expire(interval);
  }
}

void Bench::expire(guint interval) {
  forget_dead_timers();
  for (const auto &timer : std::vector<Timer>(all_timers)) {
    GSource *source = g_main_context_find_source_by_id(nullptr, timer.id);
    if (source && timer.interval == interval) {
      g_source_set_ready_time(source, 0);
    }
  }
  iterate();
}
