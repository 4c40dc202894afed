// The commands that wait for what comes: monitor and wait.
#include <glib-unix.h>

#include <algorithm>
#include <csignal>
#include <cstdio>

#include "portctl/describe.h"
#include "portctl/follow.h"
#include "portctl/session.h"

namespace {

gboolean quit(gpointer loop) {
  g_main_loop_quit(static_cast<GMainLoop *>(loop));
  return G_SOURCE_CONTINUE;
}

// --- monitor ---

class Monitor : public Follower {
 public:
  Monitor(Session &session) : Follower(session.bus), session_(session) {}

 private:
  void on_up() override {
    print("up", "the daemon serves " + std::to_string(ports().size()) + " ports",
          JsonObject().add("ports", static_cast<std::int64_t>(ports().size())));
  }
  void on_down() override { print("down", "the daemon is not running", JsonObject()); }
  void on_change(const Change &change, Port &port) override;
  void on_sequence_done(int number, const Port *port) override;
  void on_event(const SentEvent &event) override;

  void print(const char *kind, const std::string &text, const JsonObject &details) const;

  Session &session_;
};

std::string label(int number, const Port *port) {
  return "port " + std::to_string(number) + (port ? " " + visible(port->name()) : "");
}

void Monitor::print(const char *kind, const std::string &text, const JsonObject &details) const {
  const std::string time = time_stamp();
  if (session_.options.json) {
    std::string members = details.text();
    const std::string head = JsonObject().add("time", time).add("kind", kind).text();
    const bool bare = members == "{}";
    std::printf("%s%s%s\n", head.substr(0, head.size() - 1).c_str(), bare ? "" : ", ",
                members.substr(1).c_str());
  } else {
    std::printf("%s  %s\n", styled(time, Style::kDim, session_.colours).c_str(), text.c_str());
  }
  // The reader may be gone, or read line by line.
  if (std::fflush(stdout) != 0) {
    std::exit(STATUS_OK);
  }
}

void Monitor::on_change(const Change &change, Port &port) {
  JsonObject details;
  details.add("port", change.port)
      .add("identifier", port.id)
      .add("name", port.name())
      .add("direction", change.input ? "input" : "output")
      .add("active", change.active)
      .add("reported", change.reported)
      .add("active_low", change.active_low)
      .add("virtual", change.is_virtual)
      .add("hidden", change.hidden);
  std::string text =
      label(change.port, &port) + ": " + (change.input ? "input " : "output ") +
      styled(port.state(), port.active ? Style::kGood : Style::kBold, session_.colours);
  if (port.supervision && port.supervision->on && !port.supervision->line.empty()) {
    const auto cell = line_cell(port);
    text += ", line " + styled(visible(cell.text), cell.style, session_.colours);
    details.add("line", port.supervision->line).add("level", port.supervision->level);
  }
  print("changed", text + (change.reported ? ", reported by a client" : ""), details);
}

void Monitor::on_sequence_done(int number, const Port *port) {
  JsonObject details;
  details.add("port", number);
  if (port) {
    details.add("identifier", port->id).add("name", port->name());
  }
  print("sequence-done", label(number, port) + ": the sequence has ended", details);
}

void Monitor::on_event(const SentEvent &event) {
  const std::string type = event.type.empty() ? "" : " " + visible(event.type);
  print("event",
        "event " + std::to_string(event.id) + type + ": " + visible(event_keys_text(event.keys)),
        JsonObject()
            .add("event", event.id)
            .add("type", event.type)
            .add_raw("keys", json_variant(event.keys)));
}

// --- wait ---

bool is_line_state(const std::string &word) {
  for (const char *state : {"open", "closed", "short", "cut", "undefined"}) {
    if (word == state) {
      return true;
    }
  }
  return false;
}

class Waiter : public Follower {
 public:
  Waiter(Session &session, GMainLoop *loop)
      : Follower(session.bus),
        word_(session.words[0]),
        state_(session.words[1]),
        line_(is_line_state(state_)),
        active_(!line_ && parse_state(state_)),
        loop_(loop) {}

  bool reached() const { return reached_; }

 private:
  void on_up() override { check(find_port(ports(), word_)); }
  void on_down() override {}  // it may come (back) in time
  void on_change(const Change & /*change*/, Port &port) override {
    if (&port == &find_port(ports(), word_)) {
      check(port);
    }
  }
  void on_sequence_done(int /*number*/, const Port * /*port*/) override {}

  void check(const Port &port) {
    if (line_ && !port.supervision) {
      fail(STATUS_REFUSED, "port " + visible(word_) +
                               ": it has no line state to wait for: give active "
                               "or inactive");
    }
    if (line_ ? port.supervision->line == state_ : port.active == active_) {
      reached_ = true;
      g_main_loop_quit(loop_);
    }
  }

  std::string word_;
  std::string state_;
  bool line_;
  bool active_;
  GMainLoop *loop_;
  bool reached_ = false;
};

}  // namespace

int monitor_command(Session &session) {
  const GMainLoopPtr loop(g_main_loop_new(nullptr, FALSE));
  g_unix_signal_add(SIGINT, quit, loop.get());
  g_unix_signal_add(SIGTERM, quit, loop.get());
  Monitor monitor(session);
  monitor.start();
  g_main_loop_run(loop.get());
  return STATUS_OK;
}

int wait_command(Session &session) {
  const GMainLoopPtr loop(g_main_loop_new(nullptr, FALSE));
  if (const auto timeout = session.options.timeout) {
    g_timeout_add(static_cast<guint>(std::min(*timeout * 1000, 4e9)), quit, loop.get());
  }
  Waiter waiter(session, loop.get());
  waiter.start();
  g_main_loop_run(loop.get());
  if (!waiter.reached()) {
    fail(STATUS_TIMEOUT, "port " + visible(session.words[0]) + " did not become " +
                             visible(session.words[1]) + " in time");
  }
  return STATUS_OK;
}
