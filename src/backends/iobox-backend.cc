#include "backends/iobox-backend.h"

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "backends/iobox-calls.h"
#include "base/log.h"
#include "base/main-queue.h"
#include "base/signal-handler.h"
#include "base/timeout-budget.h"
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
  std::vector<IOPort *> ports;          // those that follow the box
  std::weak_ptr<TimeoutBudget> budget;  // of the set-ups that are under way
  Worker worker{"I/O box"};             // last: its jobs end before what they use goes
};

Monitor &monitor() {
  static Monitor instance;
  return instance;
}

// For a call that waits as long as the bus allows. On the worker's thread.
IoBoxCall with_default_timeout(GCancellable *cancellable) {
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

// Any thread. Modes are sent in the order of the calls.
void iobox_set_mode(IOPort *port) {
  IoBoxBackendData *data = data_of(port);
  if (!data->connected) {
    return;
  }
  const auto work = std::make_shared<PortWork>(port);
  const std::lock_guard lock(data->mode_lock);
  monitor().worker.queue([work, mode = mode_of(port)](GCancellable *cancellable) {
    iobox_send_mode(with_default_timeout(cancellable), mode);
  });
}

void store_level(IoBoxBackendData *data, std::int32_t level) {
  data->state = level > 0 ? SUPERVISED_STATE_CLOSED : SUPERVISED_STATE_OPEN;
}

// Any thread. The level counts from now on, however long the box takes.
void drive(IOPort *port, std::int32_t level) {
  IoBoxBackendData *data = data_of(port);
  store_level(data, level);
  data->output_value = level;
  iobox_set_mode(port);
}

// --- States from the box ---

void update_state(IOPort *port, SupervisedRangeState state) {
  IoBoxBackendData *data = data_of(port);
  const auto now = static_cast<std::int32_t>(state);
  if (data->state.exchange(now) != now && data->watching) {
    io_port_report_line(port, state);
  }
}

// A query for the state of an input. While it is under way the port may be set up again or become
// an output, and a signal may overtake the reply: when one has arrived, the reply is out of date.
struct Query {
  IOPort *port = nullptr;
  IoBoxSignalCount signal_count;  // also tells one set-up of the port from the next
  unsigned count_before = 0;
};

bool is_current(const Query &query) {
  const IoBoxBackendData *data = data_of(query.port);
  return data && data->signal_count == query.signal_count &&
         *query.signal_count == query.count_before;
}

std::optional<SupervisedRangeState> query_state(const IoBoxCall &call, int number, Query &query) {
  query.count_before = *query.signal_count;
  return iobox_query_state(call, number);
}

void on_proxy_signal(GDBusProxy * /*proxy*/, const char * /*sender*/, const char *signal,
                     GVariant *parameters, gpointer /*user_data*/) {
  for (IOPort *port : std::vector<IOPort *>(monitor().ports)) {
    iobox_handle_signal(port, signal, parameters);
  }
}

// --- After a restart of the service, which then knows no modes ---

void resend_mode(IOPort *port) {
  const auto work = std::make_shared<PortWork>(port);
  Query query = {port, data_of(port)->signal_count, 0};
  const std::lock_guard lock(data_of(port)->mode_lock);
  monitor().worker.queue([work, query, mode = mode_of(port),
                          input = io_port_input(port)](GCancellable *cancellable) mutable {
    const IoBoxCall call = with_default_timeout(cancellable);
    iobox_send_mode(call, mode);
    const auto state = input ? query_state(call, mode.number, query) : std::nullopt;
    if (state) {
      post_to_main_loop([work, query, state] {
        if (is_current(query) && io_port_input(query.port)) {
          update_state(query.port, *state);
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
      resend_mode(port);
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

// Set-ups that wait behind each other, at start or in a refresh, share one time budget.
std::shared_ptr<TimeoutBudget> shared_budget() {
  auto budget = monitor().budget.lock();
  if (!budget) {
    budget = std::make_shared<TimeoutBudget>();
    monitor().budget = budget;
  }
  return budget;
}

// A port that is being set up, on its way to the worker and back.
struct SetUp {
  std::shared_ptr<PortWork> work;
  std::shared_ptr<TimeoutBudget> budget;
  Query query;
  IoBoxMode mode{};
  bool input = false;
  const char *fault = nullptr;                // what keeps the port out of service
  bool usable = false;                        // the port's events are on
  std::optional<SupervisedRangeState> state;  // of an input
};

// On the worker's thread.
void query_box(SetUp &set_up, GCancellable *cancellable) {
  const IoBoxCall call = {monitor().proxy.get(), cancellable, set_up.budget.get()};
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
  set_up.state = query_state(call, set_up.mode.number, set_up.query);
  if (!set_up.state) {
    set_up.fault = "the I/O box does not tell its state";
    log_iobox(kLogLevelUser, kNoInitialState, "Could not get initial IO state");
  }
}

// The state comes before the events, which are sent with it at once.
void finish_set_up(const SetUp &set_up) {
  IOPort *port = set_up.query.port;
  IoBoxBackendData *data = data_of(port);
  if (!data || data->signal_count != set_up.query.signal_count) {
    return;
  }
  if (!set_up.input) {
    data->output_value = set_up.mode.level;
    store_level(data, set_up.mode.level);
  } else if (set_up.state && is_current(set_up.query)) {
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
  data->signal_count = std::make_shared<std::atomic<unsigned>>(0U);
  follow(port);
  SetUp set_up;
  set_up.work = std::make_shared<PortWork>(port);
  set_up.budget = shared_budget();
  set_up.query = {port, data->signal_count, 0};
  set_up.mode = {io_port_get_number(port), initial_level, mode_word(port)};
  set_up.input = io_port_input(port);
  monitor().worker.queue([set_up](GCancellable *cancellable) mutable {
    query_box(set_up, cancellable);
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

// The level of an output is the one that was sent, not the state of the line as an input.
void set_direction(IOPort *port, bool input) {
  if (!input) {
    store_level(data_of(port), data_of(port)->output_value);
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
  if (const auto &signal_count = data_of(port)->signal_count) {
    ++*signal_count;
  }
  update_state(port, iobox_state_to_portd_state(word));
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
