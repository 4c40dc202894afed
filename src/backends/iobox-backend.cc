#include "backends/iobox-backend.h"

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "backends/iobox-calls.h"
#include "base/log.h"
#include "base/main-queue.h"
#include "base/patience.h"
#include "base/signal-handler.h"
#include "base/worker.h"
#include "port/port-work.h"

namespace {

constexpr const char *kService = "com.kelv.IOBoxMonitor";
constexpr const char *kObject = "/com/kelv/IOBoxMonitor";

constexpr IoBoxPlace kNoProxy = {"iobox_port_setup", 168};
constexpr IoBoxPlace kNoInitialState = {"iobox_port_setup", 219};
constexpr IoBoxPlace kNoHandler = {"iobox_port_setup", 237};

IoBoxBackendData *data_of(const IOPort *port) {
  return static_cast<IoBoxBackendData *>(io_port_backend_data(port));
}

// --- The service ---

// The proxy is used by the worker while it stays as it is; the rest is of the main thread.
struct Monitor {
  GObjectPtr<GDBusProxy> proxy;
  SignalHandler signals;
  SignalHandler owner;
  std::vector<IOPort *> ports;       // those that follow the box
  std::weak_ptr<Patience> patience;  // of the set-ups that are under way
  Worker worker{"I/O box"};          // last: its jobs end before what they use goes
};

Monitor &monitor() {
  static Monitor instance;
  return instance;
}

// For a call that waits as long as the bus allows. On the worker's thread.
IoBoxCall unhurried(GCancellable *cancellable) {
  return {monitor().proxy.get(), cancellable, nullptr};
}

void unfollow(IoBoxBackendData *data) {
  std::erase(monitor().ports, std::exchange(data->follower, nullptr));
}

void follow(IOPort *port) {
  IoBoxBackendData *data = data_of(port);
  unfollow(data);
  data->follower = port;
  monitor().ports.push_back(port);
}

// --- Modes ---

const char *mode_word(const IOPort *port) {
  if (!io_port_input(port)) {
    return "out";
  }
  return io_port_supervised_input(port) ? "supervised_in" : "in";
}

IoBoxMode mode_of(const IOPort *port) {
  return {io_port_get_number(port), data_of(port)->output_value, mode_word(port)};
}

// Any thread. The box is told in the order of the calls of this.
void iobox_set_mode(IOPort *port) {
  IoBoxBackendData *data = data_of(port);
  if (!data->connected) {
    return;
  }
  const auto work = std::make_shared<PortWork>(port);
  const std::lock_guard lock(data->mode_lock);
  monitor().worker.queue([work, mode = mode_of(port)](GCancellable *cancellable) {
    iobox_send_mode(unhurried(cancellable), mode);
  });
}

void note_level(IoBoxBackendData *data, std::int32_t level) {
  data->state = level > 0 ? SUPERVISED_STATE_CLOSED : SUPERVISED_STATE_OPEN;
}

// Any thread. The level counts from now on, however long the box takes.
void drive(IOPort *port, std::int32_t level) {
  IoBoxBackendData *data = data_of(port);
  note_level(data, level);
  data->output_value = level;
  iobox_set_mode(port);
}

// --- What the box says ---

void take_state(IOPort *port, SupervisedRangeState state) {
  IoBoxBackendData *data = data_of(port);
  const auto now = static_cast<std::int32_t>(state);
  if (data->state.exchange(now) != now && data->watching) {
    io_port_report_line(port, state);
  }
}

// A question for the state of an input, on its way to the box and back. While it is, the port may
// be set up anew or become an output, and a signal may overtake the answer: where one was heard
// since the question left, the answer says nothing newer.
struct Question {
  IOPort *port = nullptr;
  IoBoxHeard heard;  // also tells one set-up of the port from the next
  unsigned heard_before = 0;
};

bool still_asked(const Question &question) {
  const IoBoxBackendData *data = data_of(question.port);
  return data && data->heard == question.heard && *question.heard == question.heard_before;
}

std::optional<SupervisedRangeState> ask_state(const IoBoxCall &call, int number,
                                              Question &question) {
  question.heard_before = *question.heard;
  return iobox_ask_state(call, number);
}

void on_proxy_signal(GDBusProxy * /*proxy*/, const char * /*sender*/, const char *signal,
                     GVariant *parameters, gpointer /*user_data*/) {
  for (IOPort *port : std::vector<IOPort *>(monitor().ports)) {
    iobox_handle_signal(port, signal, parameters);
  }
}

// --- A service that is started anew knows neither modes nor whom it has told of which state ---

void tell_anew(IOPort *port) {
  const auto work = std::make_shared<PortWork>(port);
  Question question = {port, data_of(port)->heard, 0};
  const std::lock_guard lock(data_of(port)->mode_lock);
  monitor().worker.queue([work, question, mode = mode_of(port),
                          input = io_port_input(port)](GCancellable *cancellable) mutable {
    const IoBoxCall call = unhurried(cancellable);
    iobox_send_mode(call, mode);
    const auto state = input ? ask_state(call, mode.number, question) : std::nullopt;
    if (state) {
      post_to_main_loop([work, question, state] {
        if (still_asked(question) && io_port_input(question.port)) {
          take_state(question.port, *state);
        }
      });
    }
  });
}

void on_owner_changed(GObject *proxy, GParamSpec * /*property*/, gpointer /*user_data*/) {
  if (!GCharPtr(g_dbus_proxy_get_name_owner(G_DBUS_PROXY(proxy)))) {
    return;
  }
  for (IOPort *port : monitor().ports) {
    if (io_port_is_set_up(port)) {
      tell_anew(port);
    }
  }
}

// --- Set-up ---

// Waits for the bus alone: the first call has the service started.
bool make_proxy() {
  Monitor &box = monitor();
  if (!box.proxy) {
    Error error;
    box.proxy.reset(g_dbus_proxy_new_for_bus_sync(
        G_BUS_TYPE_SYSTEM,
        static_cast<GDBusProxyFlags>(G_DBUS_PROXY_FLAGS_DO_NOT_LOAD_PROPERTIES |
                                     G_DBUS_PROXY_FLAGS_DO_NOT_AUTO_START_AT_CONSTRUCTION),
        nullptr, kService, kObject, kService, nullptr, error.out()));
  }
  if (!box.proxy) {
    log_iobox(G_LOG_LEVEL_MESSAGE, kNoProxy, "Proxy for %s not available", kService);
    return false;
  }
  if (!box.signals) {
    box.signals = SignalHandler(box.proxy.get(), "g-signal", G_CALLBACK(on_proxy_signal), nullptr);
    box.owner = SignalHandler(box.proxy.get(), "notify::g-name-owner", G_CALLBACK(on_owner_changed),
                              nullptr);
  }
  return true;
}

// Set-ups that wait behind each other, at start or in a refresh, share their patience.
std::shared_ptr<Patience> shared_patience() {
  auto patience = monitor().patience.lock();
  if (!patience) {
    patience = std::make_shared<Patience>();
    monitor().patience = patience;
  }
  return patience;
}

// A port that is being set up, on its way to the worker and back.
struct SetUp {
  std::shared_ptr<PortWork> work;
  std::shared_ptr<Patience> patience;
  Question question;
  IoBoxMode mode{};
  bool input = false;
  const char *fault = nullptr;                // what keeps the port out of service
  bool usable = false;                        // the port's events are on
  std::optional<SupervisedRangeState> state;  // of an input
};

// On the worker's thread.
void ask_box(SetUp &set_up, GCancellable *cancellable) {
  const IoBoxCall call = {monitor().proxy.get(), cancellable, set_up.patience.get()};
  if (!iobox_is_connected(call)) {
    set_up.fault = "no I/O box is connected";
    return;
  }
  if (!iobox_port_is_enabled(call, set_up.mode.number)) {
    set_up.fault = "the I/O box does not have it enabled";
    return;
  }
  set_up.usable = true;
  if (!set_up.input) {
    iobox_send_mode(call, set_up.mode);
    return;
  }
  set_up.state = ask_state(call, set_up.mode.number, set_up.question);
  if (!set_up.state) {
    set_up.fault = "the I/O box does not tell its state";
    log_iobox(kLogLevelUser, kNoInitialState, "Could not get initial IO state");
  }
}

// The state comes before the events, which say at once how the port is.
void finish_set_up(const SetUp &set_up) {
  IOPort *port = set_up.question.port;
  IoBoxBackendData *data = data_of(port);
  if (!data || data->heard != set_up.question.heard) {
    return;
  }
  if (!set_up.input) {
    data->output_value = set_up.mode.level;
    note_level(data, set_up.mode.level);
  } else if (set_up.state && still_asked(set_up.question)) {
    data->state = *set_up.state;
  }
  if (set_up.fault) {
    io_port_note_fault(port, "%s", set_up.fault);
    unfollow(data);
  } else {
    io_port_finish_setup(port);
  }
  io_port_set_events_enabled(port, set_up.usable);
  if (!set_up.fault && !monitor().signals) {
    log_iobox(G_LOG_LEVEL_WARNING, kNoHandler, "Failed to setup signal handler");
  }
}

// Signals are followed from here on, so that none is lost while the box is asked.
bool iobox_port_setup(IOPort *port, bool initial_level) {
  IoBoxBackendData *data = data_of(port);
  data->connected = false;
  data->watching = false;
  io_port_set_events_enabled(port, false);
  if (!make_proxy()) {
    io_port_note_fault(port, "there is no proxy of %s", kService);
    return false;
  }
  data->connected = true;
  data->state = SUPERVISED_STATE_UNDEFINED;
  data->heard = std::make_shared<std::atomic<unsigned>>(0U);
  follow(port);
  SetUp set_up;
  set_up.work = std::make_shared<PortWork>(port);
  set_up.patience = shared_patience();
  set_up.question = {port, data->heard, 0};
  set_up.mode = {io_port_get_number(port), initial_level, mode_word(port)};
  set_up.input = io_port_input(port);
  monitor().worker.queue([set_up](GCancellable *cancellable) mutable {
    ask_box(set_up, cancellable);
    post_to_main_loop([set_up] { finish_set_up(set_up); });
  });
  return false;  // not yet
}

// --- Supervision: the box judges the line by itself, so the ranges are only kept ---

bool is_supervisable(IOPort * /*port*/) {
  return true;
}

bool set_supervised(IOPort *port, bool /*supervised*/) {
  iobox_set_mode(port);
  return true;
}

SupervisedRanges get_supervised_ranges(IOPort *port) {
  return io_port_range_list(port);
}

bool set_supervised_ranges(IOPort *port, SupervisedRanges ranges, GError ** /*error*/) {
  io_port_store_range_list(port, std::move(ranges));
  return true;
}

// --- State ---

// A plain input has no use for the tamper states: a cut line reads inactive, a shorted one active.
std::uint32_t get_state(IOPort *port) {
  const IoBoxBackendData *data = data_of(port);
  if (!data->connected) {
    return 0;
  }
  const auto state = static_cast<std::uint32_t>(data->state.load());
  if (io_port_supervised_input(port)) {
    return state;
  }
  switch (state) {
    case SUPERVISED_STATE_CUT:
      return 0;
    case SUPERVISED_STATE_SHORT:
      return 1;
    default:
      return state;
  }
}

bool get_supervised_readout(IOPort *port, SupervisedRangeState *state, std::uint32_t *level,
                            GError ** /*error*/) {
  *state = static_cast<SupervisedRangeState>(get_state(port));
  *level = 0;
  return true;
}

void start_watch(IOPort *port) {
  data_of(port)->watching = true;
}

// An output has the level that the box is told, not the state that the line had as an input.
void set_direction(IOPort *port, bool input) {
  if (!input) {
    note_level(data_of(port), data_of(port)->output_value);
  }
  iobox_set_mode(port);
}

}  // namespace

IoBoxBackendData::~IoBoxBackendData() {
  unfollow(this);
}

void iobox_handle_signal(IOPort *port, const char *signal, GVariant *parameters) {
  if (std::string_view(signal) != "IOStateChanged" ||
      !g_variant_is_of_type(parameters, G_VARIANT_TYPE("(is)"))) {
    return;
  }
  gint32 number = 0;
  const char *word = nullptr;
  g_variant_get(parameters, "(i&s)", &number, &word);
  if (number != io_port_get_number(port)) {
    return;
  }
  if (const auto &heard = data_of(port)->heard) {
    ++*heard;
  }
  take_state(port, iobox_state_to_portd_state(word));
}

extern constexpr PortFunctions kIoBoxBackend = {
    .make_record = make_backend_record<IoBoxBackendData>,
    .setup = iobox_port_setup,
    .is_supervisable = is_supervisable,
    .set_supervised = set_supervised,
    .get_supervised_ranges = get_supervised_ranges,
    .set_supervised_ranges = set_supervised_ranges,
    .get_supervised_readout = get_supervised_readout,
    .get_state = get_state,
    .set_state = drive,
    .start_watch = start_watch,
    .set_direction = set_direction,
};
