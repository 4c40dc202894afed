// The command watch: a live table of all ports on the whole terminal.
#include <fcntl.h>
#include <glib-unix.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <deque>
#include <map>

#include "base/unique-fd.h"
#include "portctl/describe.h"
#include "portctl/follow.h"
#include "portctl/screen.h"
#include "portctl/session.h"
#include "portctl/watch-table.h"

namespace {

constexpr guint kTickMs = 250;
constexpr int kTicksPerFetch = 8;
constexpr gint64 kHighlightUs = gint64{2} * G_USEC_PER_SEC;
constexpr std::size_t kNewsKept = 200;
constexpr std::size_t kLongestNote = 4096;

// "2026-11-21T22:30:01.123+00:00" -> "22:30:01"
std::string clock_time() {
  return time_stamp().substr(11, 8);
}

class Watch : public Follower {
 public:
  Watch(Session &session, Screen &screen, GMainLoop *loop)
      : Follower(session.bus), session_(session), screen_(screen), loop_(loop) {}

  void begin();

 private:
  void on_up() override;
  void on_down() override;
  void on_change(const Change &change, Port &port) override;
  void on_sequence_done(int number, const Port *port) override;
  void on_event(const SentEvent &event) override;

  static gboolean tick(gpointer data);
  static gboolean resized(gpointer data);
  static gboolean ended(gpointer data);
  static gboolean on_key(gint fd, GIOCondition condition, gpointer data);
  static gboolean on_notes(gint fd, GIOCondition condition, gpointer data);

  void handle_key(char key);
  void handle_notes(const char *text, std::size_t size);
  void watch_notes();
  void add_news(const std::string &text);
  void draw();
  void refresh();

  Session &session_;
  Screen &screen_;
  GMainLoop *loop_;
  bool up_ = false;
  int ticks_ = 0;
  int first_ = 0;
  std::string escape_;  // keys of an escape sequence so far
  std::string note_;    // a line of the notes that has no end yet
  std::deque<std::string> news_;
  std::map<int, gint64> changed_;  // by port number: when, on the monotonic clock
  UniqueFd notes_;
};

void Watch::begin() {
  g_unix_signal_add(SIGINT, ended, loop_);
  g_unix_signal_add(SIGTERM, ended, loop_);
  g_unix_signal_add(SIGHUP, ended, loop_);
  g_unix_signal_add(SIGWINCH, resized, this);
  g_timeout_add(kTickMs, tick, this);
  if (isatty(STDIN_FILENO)) {
    g_unix_fd_add(STDIN_FILENO, static_cast<GIOCondition>(G_IO_IN | G_IO_HUP), on_key, this);
  }
  if (!session_.options.notes.empty()) {
    watch_notes();
  }
  start();
  draw();
}

// Open for writing too: a FIFO then never ends when one of those that write to it does.
void Watch::watch_notes() {
  notes_.reset(open(session_.options.notes.c_str(), O_RDWR | O_NONBLOCK | O_CLOEXEC));
  if (!notes_) {
    fail(STATUS_USAGE,
         "--notes: " + visible(session_.options.notes) + " can't be opened: " + g_strerror(errno));
  }
  g_unix_fd_add(notes_.get(), G_IO_IN, on_notes, this);
}

gboolean Watch::on_notes(gint fd, GIOCondition /*condition*/, gpointer data) {
  char text[kLongestNote];
  const ssize_t size = read(fd, text, sizeof text);
  if (size <= 0) {
    return size < 0 && errno == EAGAIN ? G_SOURCE_CONTINUE : G_SOURCE_REMOVE;
  }
  static_cast<Watch *>(data)->handle_notes(text, static_cast<std::size_t>(size));
  return G_SOURCE_CONTINUE;
}

void Watch::handle_notes(const char *text, std::size_t size) {
  for (std::size_t i = 0; i < size; ++i) {
    if (text[i] != '\n') {
      note_ += text[i];
    }
    if (text[i] == '\n' || note_.size() >= kLongestNote) {
      add_news(note_);
      note_.clear();
    }
  }
}

void Watch::add_news(const std::string &text) {
  news_.push_back(clock_time() + "  " + visible(text));
  if (news_.size() > kNewsKept) {
    news_.pop_front();
  }
  draw();
}

void Watch::on_up() {
  up_ = true;
  add_news("the daemon serves " + std::to_string(ports().size()) + " ports");
}

void Watch::on_down() {
  up_ = false;
  add_news("the daemon is not running");
}

void Watch::on_change(const Change &change, Port &port) {
  changed_[change.port] = g_get_monotonic_time();
  std::string text = "port " + std::to_string(change.port) + " " + port.name() + " is " +
                     (change.input ? "an input, " : "an output, ") + port.state();
  if (port.supervision && port.supervision->on) {
    text += ", the line " + line_cell(port).text;
  }
  add_news(text + (change.reported ? ", reported by a client" : ""));
}

void Watch::on_sequence_done(int number, const Port *port) {
  add_news("port " + std::to_string(number) + (port ? " " + port->name() : "") +
           ": the sequence has ended");
}

void Watch::on_event(const SentEvent &event) {
  add_news("event " + std::to_string(event.id) + (event.type.empty() ? "" : " " + event.type) +
           ": " + event_keys_text(event.keys));
}

// Levels move without a signal, and so do names, ranges and supervision when others set them.
void Watch::refresh() {
  if (!up_) {
    return;
  }
  if (++ticks_ % kTicksPerFetch == 0) {
    fetch();
    return;
  }
  for (auto &port : ports()) {
    if (port.supervision) {
      refresh_readout(bus(), port);
    }
  }
}

gboolean Watch::tick(gpointer data) {
  auto &self = *static_cast<Watch *>(data);
  self.refresh();
  self.draw();
  return G_SOURCE_CONTINUE;
}

gboolean Watch::resized(gpointer data) {
  auto &self = *static_cast<Watch *>(data);
  self.screen_.resize();
  self.draw();
  return G_SOURCE_CONTINUE;
}

gboolean Watch::ended(gpointer data) {
  g_main_loop_quit(static_cast<GMainLoop *>(data));
  return G_SOURCE_CONTINUE;
}

gboolean Watch::on_key(gint fd, GIOCondition /*condition*/, gpointer data) {
  auto &self = *static_cast<Watch *>(data);
  char keys[32];
  const ssize_t count = read(fd, keys, sizeof keys);
  if (count <= 0) {
    g_main_loop_quit(self.loop_);
    return G_SOURCE_REMOVE;
  }
  for (ssize_t i = 0; i < count; ++i) {
    self.handle_key(keys[i]);
  }
  self.draw();
  return G_SOURCE_CONTINUE;
}

void Watch::handle_key(char key) {
  escape_ += key;
  if (escape_ == "\033" || escape_ == "\033[" || escape_ == "\033O") {
    return;
  }
  const bool arrow = escape_.size() == 3;
  if ((arrow && key == 'A') || key == 'k') {
    --first_;
  } else if ((arrow && key == 'B') || key == 'j') {
    ++first_;
  } else if (key == 'q' || key == 'Q') {
    g_main_loop_quit(loop_);
  }
  escape_.clear();
}

void Watch::draw() {
  WatchView view = {.news = news_,
                    .title = session_.options.title,
                    .time = clock_time(),
                    .up = up_,
                    .columns = screen_.columns(),
                    .rows = screen_.rows(),
                    .colours = session_.colours};
  const gint64 now = g_get_monotonic_time();
  for (const auto &port : ports()) {
    const auto when = changed_.find(port.number);
    view.ports.push_back({&port, when != changed_.end() && now - when->second < kHighlightUs});
  }
  const int last = static_cast<int>(view.ports.size()) - table_rows(view);
  first_ = std::clamp(first_, 0, std::max(last, 0));
  view.first = first_;
  screen_.draw(watch_lines(view));
}

}  // namespace

int watch_command(Session &session) {
  // Before the terminal is taken: what fails here shall stay readable.
  session.bus.connection();
  Screen screen;
  const GMainLoopPtr loop(g_main_loop_new(nullptr, FALSE));
  Watch watch(session, screen, loop.get());
  watch.begin();
  g_main_loop_run(loop.get());
  return STATUS_OK;
}
