#include "backends/iobox-backend.h"

#include <algorithm>
#include <iterator>
#include <string_view>

#include "backends/tables.h"
#include "base/log.h"
#include "base/patience.h"

namespace {

constexpr const char *kService = "com.kelv.IOBoxMonitor";
constexpr const char *kObject = "/com/kelv/IOBoxMonitor";

// Log readers know these messages by function and line, so both are part of the text.
struct Place {
  const char *function;
  int line;
};
constexpr Place kCallFailed = {"iobox_dbus_call", 44};
constexpr Place kBadWord = {"iobox_state_to_portd_state", 67};
constexpr Place kNoProxy = {"iobox_port_setup", 168};
constexpr Place kNoConnectionStatus = {"iobox_port_setup", 180};
constexpr Place kNoPortStatus = {"iobox_port_setup", 193};
constexpr Place kNoInitialState = {"iobox_port_setup", 219};
constexpr Place kNoHandler = {"iobox_port_setup", 237};

#define log_place(level, place, format, ...) \
  log_at((level), "%s@%d: " format, (place).function, (place).line __VA_OPT__(, ) __VA_ARGS__)

struct StateWord {
  std::string_view word;
  SupervisedRangeState state;
};

constexpr StateWord kStateWords[] = {
    {"closed", SUPERVISED_STATE_CLOSED},
    {"cut", SUPERVISED_STATE_CUT},
    {"short", SUPERVISED_STATE_SHORT},
    {"open", SUPERVISED_STATE_OPEN},
};

IoBoxBackendData *data_of(IOPort *ioport) {
  return static_cast<IoBoxBackendData *>(io_port_backend_data(ioport));
}

// --- Calls of the service ---

// One for all ports: they wait for the same process.
Patience &patience() {
  static Patience instance;
  return instance;
}

// Null when there was no answer, which is logged. Any thread.
GVariantPtr iobox_dbus_call(IoBoxBackendData *data, const char *method, GVariant *parameters) {
  Error error;
  GVariantPtr reply =
      call_with_patience(patience(), data->proxy.get(), method, parameters, error.out());
  if (!reply) {
    log_place(kLogLevelUser, kCallFailed, "Failed to call method %s: %s", method, error.message());
  }
  return reply;
}

// The same for a reply of known type. Another one counts as no answer.
GVariantPtr call_for(IoBoxBackendData *data, const char *method, GVariant *parameters,
                     const char *type) {
  GVariantPtr reply = iobox_dbus_call(data, method, parameters);
  if (reply && !g_variant_is_of_type(reply.get(), G_VARIANT_TYPE(type))) {
    log_warning("The I/O box monitor answers %s with %s, not with %s", method,
                g_variant_get_type_string(reply.get()), type);
    reply.reset();
  }
  return reply;
}

const char *mode_word(const IOPort *ioport) {
  if (!io_port_input(ioport)) {
    return "out";
  }
  return io_port_supervised_input(ioport) ? "supervised_in" : "in";
}

// Any thread.
void iobox_set_mode(IOPort *ioport) {
  IoBoxBackendData *data = data_of(ioport);
  if (!data->proxy) {
    return;
  }
  const std::lock_guard lock(data->mode_lock);
  iobox_dbus_call(data, "SetIOMode",
                  g_variant_new("(iis)", io_port_get_number(ioport), data->output_value.load(),
                                mode_word(ioport)));
}

// --- Set-up ---

// The proxy leaves it to the first call to have the service started, so that the wait for that has
// a limit too.
bool make_proxy(IoBoxBackendData *data) {
  if (!data->proxy) {
    Error error;
    data->proxy.reset(g_dbus_proxy_new_for_bus_sync(
        G_BUS_TYPE_SYSTEM,
        static_cast<GDBusProxyFlags>(G_DBUS_PROXY_FLAGS_DO_NOT_LOAD_PROPERTIES |
                                     G_DBUS_PROXY_FLAGS_DO_NOT_AUTO_START_AT_CONSTRUCTION),
        nullptr, kService, kObject, kService, nullptr, error.out()));
  }
  if (!data->proxy) {
    log_place(G_LOG_LEVEL_MESSAGE, kNoProxy, "Proxy for %s not available", kService);
  }
  return static_cast<bool>(data->proxy);
}

bool box_is_connected(IoBoxBackendData *data) {
  const GVariantPtr reply = call_for(data, "GetIOBoxConnected", nullptr, "(b)");
  if (!reply) {
    log_place(kLogLevelUser, kNoConnectionStatus, "Could not get IO box connection status");
    return false;
  }
  gboolean connected = FALSE;
  g_variant_get(reply.get(), "(b)", &connected);
  return connected;
}

GVariantPtr call_with_number(IOPort *ioport, const char *method) {
  return call_for(data_of(ioport), method, g_variant_new("(i)", io_port_get_number(ioport)), "(s)");
}

bool port_is_enabled(IOPort *ioport) {
  const GVariantPtr reply = call_with_number(ioport, "GetIOPortStatus");
  if (!reply) {
    log_place(kLogLevelUser, kNoPortStatus, "Could not get IO port status");
    return false;
  }
  const char *status = nullptr;
  g_variant_get(reply.get(), "(&s)", &status);
  return std::string_view(status) == "enabled";
}

bool read_initial_state(IOPort *ioport) {
  const GVariantPtr reply = call_with_number(ioport, "GetIOState");
  if (!reply) {
    log_place(kLogLevelUser, kNoInitialState, "Could not get initial IO state");
    return false;
  }
  const char *word = nullptr;
  g_variant_get(reply.get(), "(&s)", &word);
  data_of(ioport)->state = iobox_state_to_portd_state(word);
  return true;
}

void drive(IOPort *ioport, std::int32_t level) {
  IoBoxBackendData *data = data_of(ioport);
  data->state = level > 0 ? SUPERVISED_STATE_CLOSED : SUPERVISED_STATE_OPEN;
  data->output_value = level;
  iobox_set_mode(ioport);
}

void on_proxy_signal(GDBusProxy * /*proxy*/, const char * /*sender*/, const char *signal,
                     GVariant *parameters, gpointer user_data) {
  iobox_handle_signal(static_cast<IOPort *>(user_data), signal, parameters);
}

// Once per proxy: a port that is set up again keeps the handler that it has.
void follow_signals(IOPort *ioport) {
  IoBoxBackendData *data = data_of(ioport);
  if (!data->handler) {
    data->handler =
        SignalHandler(data->proxy.get(), "g-signal", G_CALLBACK(on_proxy_signal), ioport);
  }
  if (!data->handler) {
    log_place(G_LOG_LEVEL_WARNING, kNoHandler, "Failed to setup signal handler");
  }
}

bool iobox_port_setup(IOPort *ioport, bool initial_level) {
  IoBoxBackendData *data = data_of(ioport);
  data->connected = false;
  io_port_set_events_enabled(ioport, false);
  if (!make_proxy(data)) {
    return false;
  }
  data->connected = true;
  data->state = SUPERVISED_STATE_UNDEFINED;
  if (!box_is_connected(data) || !port_is_enabled(ioport)) {
    return false;
  }
  io_port_set_events_enabled(ioport, true);
  if (!io_port_input(ioport)) {
    drive(ioport, initial_level);
  } else if (!read_initial_state(ioport)) {
    return false;
  }
  follow_signals(ioport);
  return true;
}

// --- Supervision: the box judges the line by itself, so the ranges are only kept ---

bool is_supervisable(IOPort * /*ioport*/) {
  return true;
}

bool set_supervised(IOPort *ioport, bool /*supervised*/) {
  iobox_set_mode(ioport);
  return true;
}

SupervisedRanges get_supervised_ranges(IOPort *ioport) {
  return io_port_range_list(ioport);
}

bool set_supervised_ranges(IOPort *ioport, SupervisedRanges ranges, GError ** /*error*/) {
  io_port_store_range_list(ioport, std::move(ranges));
  return true;
}

// --- State ---

// A plain input has no use for the tamper states: a cut line reads inactive, a shorted one active.
std::uint32_t get_state(IOPort *ioport) {
  const IoBoxBackendData *data = data_of(ioport);
  if (!data->connected) {
    return 0;
  }
  const auto state = static_cast<std::uint32_t>(data->state.load());
  if (io_port_supervised_input(ioport)) {
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

bool get_supervised_readout(IOPort *ioport, SupervisedRangeState *state, std::uint32_t *level,
                            GError ** /*error*/) {
  *state = static_cast<SupervisedRangeState>(get_state(ioport));
  *level = 0;
  return true;
}

void start_watch(IOPort *ioport) {
  data_of(ioport)->watching = true;
}

void set_direction(IOPort *ioport, bool /*input*/) {
  iobox_set_mode(ioport);
}

void set_property(IOPort * /*ioport*/, const char * /*section*/, const char * /*key*/,
                  const char * /*value*/) {}

void free_data(IOPort *ioport) {
  io_port_set_backend_data(ioport, nullptr);
}

constexpr PortFunctions kFunctions = {
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
    .set_property = set_property,
    .free = free_data,
};

}  // namespace

SupervisedRangeState iobox_state_to_portd_state(const char *word) {
  const auto *const found =
      std::find_if(std::begin(kStateWords), std::end(kStateWords),
                   [&](const StateWord &entry) { return entry.word == word; });
  if (found != std::end(kStateWords)) {
    return found->state;
  }
  log_place(G_LOG_LEVEL_WARNING, kBadWord, "Unrecognized iobox supervised state: %s", word);
  return SUPERVISED_STATE_UNDEFINED;
}

void iobox_handle_signal(IOPort *ioport, const char *signal, GVariant *parameters) {
  if (std::string_view(signal) != "IOStateChanged" ||
      !g_variant_is_of_type(parameters, G_VARIANT_TYPE("(is)"))) {
    return;
  }
  gint32 number = 0;
  const char *word = nullptr;
  g_variant_get(parameters, "(i&s)", &number, &word);
  if (number != io_port_get_number(ioport)) {
    return;
  }
  IoBoxBackendData *data = data_of(ioport);
  const std::int32_t state = iobox_state_to_portd_state(word);
  if (data->state.exchange(state) != state && data->watching) {
    io_port_report_state(ioport, io_port_get_state(ioport));
  }
}

const PortFunctions *iobox_backend_functions(IOPort *ioport) {
  io_port_make_backend_data<IoBoxBackendData>(ioport);
  return &kFunctions;
}
