// Timed states: one pulse, or any list of steps.
#include <cstdio>

#include "portctl/ports.h"
#include "portctl/session.h"
#include "portctl/text.h"

namespace {

// The daemon takes no more in one call.
constexpr std::size_t kMaxSteps = 65536;

struct Step {
  bool active;
  int milliseconds;
};
using Steps = std::vector<Step>;

int parse_milliseconds(const std::string &text) {
  const auto number = parse_number(text);
  if (!number) {
    fail(STATUS_USAGE, "\"" + visible(text) + "\" is no time: give milliseconds");
  }
  if (*number > 2147483U) {
    fail(STATUS_USAGE, "the daemon holds a step for 2147483 ms (35 minutes) at most");
  }
  return static_cast<int>(*number);
}

Step parse_step(const std::string &text) {
  const auto colon = text.find(':');
  if (colon == std::string::npos) {
    fail(STATUS_USAGE,
         "\"" + visible(text) + "\" is no step: give STATE:MILLISECONDS, such as on:200");
  }
  return {parse_state(text.substr(0, colon)), parse_milliseconds(text.substr(colon + 1))};
}

Steps parse_steps(const std::string &text, int repeat) {
  Steps once;
  for (std::size_t begin = 0; begin <= text.size();) {
    const auto end = std::min(text.find(',', begin), text.size());
    once.push_back(parse_step(text.substr(begin, end - begin)));
    begin = end + 1;
  }
  if (once.size() * static_cast<std::size_t>(repeat) > kMaxSteps) {
    fail(STATUS_USAGE, "that is more than 65536 steps, which the daemon does not take in one go");
  }
  Steps steps;
  for (int i = 0; i < repeat; ++i) {
    steps.insert(steps.end(), once.begin(), once.end());
  }
  return steps;
}

GVariant *steps_variant(const Steps &steps) {
  GVariantBuilder builder;
  g_variant_builder_init(&builder, G_VARIANT_TYPE("a(bi)"));
  for (const auto &step : steps) {
    g_variant_builder_add(&builder, "(bi)", step.active, step.milliseconds);
  }
  return g_variant_builder_end(&builder);
}

// Listens from before the sequence starts, so that the end of a short one is not missed.
class EndOfSequence {
 public:
  EndOfSequence(Bus &bus, std::uint32_t number) : bus_(bus), number_(static_cast<gint32>(number)) {
    id_ = g_dbus_connection_signal_subscribe(bus.connection(), kControlName, kControlName,
                                             "ActionSequenceDone", kControlPath, nullptr,
                                             G_DBUS_SIGNAL_FLAGS_NONE, on_done, this, nullptr);
    watch_ = g_bus_watch_name_on_connection(bus.connection(), kControlName,
                                            G_BUS_NAME_WATCHER_FLAGS_NONE, nullptr, on_vanished,
                                            this, nullptr);
  }
  EndOfSequence(const EndOfSequence &) = delete;
  EndOfSequence &operator=(const EndOfSequence &) = delete;
  ~EndOfSequence() {
    g_dbus_connection_signal_unsubscribe(bus_.connection(), id_);
    g_bus_unwatch_name(watch_);
  }

  void wait() const {
    while (!done_) {
      g_main_context_iteration(nullptr, TRUE);
    }
  }

 private:
  static void on_done(GDBusConnection * /*connection*/, const char * /*sender*/,
                      const char * /*path*/, const char * /*interface*/, const char * /*member*/,
                      GVariant *arguments, gpointer data) {
    auto &self = *static_cast<EndOfSequence *>(data);
    gint32 number = -1;
    if (g_variant_is_of_type(arguments, G_VARIANT_TYPE("(i)"))) {
      g_variant_get(arguments, "(i)", &number);
    }
    self.done_ = self.done_ || number == self.number_;
  }
  static void on_vanished(GDBusConnection * /*connection*/, const char * /*name*/,
                          gpointer /*data*/) {
    fail(STATUS_NO_DAEMON,
         "the daemon ended before the sequence did: see \"systemctl status portd\"");
  }

  Bus &bus_;
  gint32 number_;
  guint id_;
  guint watch_;
  bool done_ = false;
};

int run(Session &session, const Steps &steps) {
  const std::string &word = session.words[0];
  const std::uint32_t number = port_number(session.bus, word);
  std::optional<EndOfSequence> end;
  if (session.options.wait) {
    end.emplace(session.bus, number);
  }
  Error error;
  if (!iocontrol_state_call_start_action_sequence_sync(
          session.bus.control(), number, session.options.reported, steps_variant(steps), nullptr,
          error.out())) {
    fail_call(error, "port " + word);
  }
  if (end) {
    end->wait();
  }
  return STATUS_OK;
}

}  // namespace

int pulse_command(Session &session) {
  return run(session, {{true, parse_milliseconds(session.words[1])}, {false, 0}});
}

int sequence_command(Session &session) {
  return run(session, parse_steps(session.words[1], session.options.repeat));
}
