#include "dbus/state-calls.h"

#include <memory>
#include <mutex>
#include <set>
#include <string_view>
#include <utility>
#include <vector>

#include "base/glib-ptr.h"
#include "base/source.h"
#include "dbus/with-port.h"
#include "settings/param.h"

namespace {

// A state is no setting, so that storing the settings of a port whose state was set hardly ever
// changes the file. A burst of calls stores them at its begin, now and then, and at its end.
constexpr guint kSavePause = 100;  // milliseconds

constexpr guint kPauseMs = 1;
constexpr gint64 kPauseUs = kPauseMs * G_TIME_SPAN_MILLISECOND;

using MessagePtr = GObjectPtr<GDBusMessage>;

struct Call {
  guint32 port;
  bool active;
  MessagePtr message;  // none where no answer is wanted
};

// Calls that came one after another, with nothing between them.
struct Batch {
  std::vector<Call> calls;
  bool hastened = false;  // served without a pause
};
using BatchPtr = std::shared_ptr<Batch>;

struct StateCalls {
  // Of the main thread.
  GObjectPtr<GDBusConnection> connection;
  guint filter = 0;
  std::set<std::shared_ptr<IOPort>> unsaved;  // their settings are still to be stored
  Source save_pause;

  // The connection's thread takes calls, the main thread serves them.
  std::mutex lock;  // for what follows; GLib's own are taken under it
  const char *path = nullptr;
  const char *interface = nullptr;
  BatchPtr growing;       // takes further calls; none after another message
  gint64 last_begun = 0;  // when the latest batch began, in microseconds
};

// Never destroyed: the connection's thread outlives everything else.
StateCalls &state_calls() {
  static auto *const instance = new StateCalls;
  return *instance;
}

// --- On the connection's thread ---

bool is_set_state(GDBusMessage *message) {
  const StateCalls &calls = state_calls();
  GVariant *arguments = g_dbus_message_get_body(message);
  return g_dbus_message_get_message_type(message) == G_DBUS_MESSAGE_TYPE_METHOD_CALL && arguments &&
         g_strcmp0(g_dbus_message_get_member(message), "SetState") == 0 &&
         g_strcmp0(g_dbus_message_get_interface(message), calls.interface) == 0 &&
         g_strcmp0(g_dbus_message_get_path(message), calls.path) == 0 &&
         g_variant_is_of_type(arguments, G_VARIANT_TYPE("(ub)"));
}

Call call_of(MessagePtr message) {
  Call call{};
  gboolean active = FALSE;
  g_variant_get(g_dbus_message_get_body(message.get()), "(ub)", &call.port, &active);
  call.active = active != FALSE;
  if ((g_dbus_message_get_flags(message.get()) & G_DBUS_MESSAGE_FLAGS_NO_REPLY_EXPECTED) == 0) {
    call.message = std::move(message);
  }
  return call;
}

gboolean serve_batch(gpointer user_data);

void release_batch(gpointer holder) {
  delete static_cast<BatchPtr *>(holder);
}

// A source that is attached before the library's for the next message is served before that, too.
void hasten(const BatchPtr &batch) {
  if (!std::exchange(batch->hastened, true)) {
    g_idle_add_full(G_PRIORITY_DEFAULT, serve_batch, new BatchPtr(batch), release_batch);
  }
}

// Waking the main loop costs more than serving a call. One that nobody waits for, hard on the heels
// of others, is served a little later with those that come meanwhile.
BatchPtr new_batch() {
  auto batch = std::make_shared<Batch>();
  const gint64 now = g_get_monotonic_time();
  if (now - std::exchange(state_calls().last_begun, now) > kPauseUs) {
    hasten(batch);
  } else {
    g_timeout_add_full(G_PRIORITY_DEFAULT, kPauseMs, serve_batch, new BatchPtr(batch),
                       release_batch);
  }
  return batch;
}

void add_call(BatchPtr &batch, Call call) {
  if (!batch) {
    batch = new_batch();
  }
  if (call.message) {
    hasten(batch);
  }
  batch->calls.push_back(std::move(call));
}

void end_batch(BatchPtr &batch) {
  if (batch) {
    hasten(batch);
    batch.reset();
  }
}

GDBusMessage *take_call(GDBusConnection * /*connection*/, GDBusMessage *message, gboolean incoming,
                        gpointer /*user_data*/) {
  if (!incoming) {
    return message;
  }
  StateCalls &calls = state_calls();
  const std::lock_guard lock(calls.lock);
  if (!is_set_state(message)) {
    end_batch(calls.growing);
    return message;
  }
  add_call(calls.growing, call_of(MessagePtr(message)));
  return nullptr;
}

// --- On the main thread ---

void send(GDBusMessage *answer) {
  if (const auto &connection = state_calls().connection) {
    g_dbus_connection_send_message(connection.get(), answer, G_DBUS_SEND_MESSAGE_FLAGS_NONE,
                                   nullptr, nullptr);
  }
}

void refuse(GDBusMessage *call, IOControlError code, const char *text) {
  if (call) {
    const Error error(g_error_new_literal(io_control_error_quark(), code, text));
    const GCharPtr name(g_dbus_error_encode_gerror(error.get()));
    send(MessagePtr(g_dbus_message_new_method_error_literal(call, name.get(), text)).get());
  }
}

// Once the port has no calls to other services under way. Other callers are not held up.
void answer_when_idle(IOPort *port, MessagePtr call) {
  if (call) {
    io_port_when_idle(port, [call = std::shared_ptr<GDBusMessage>(std::move(call))] {
      send(MessagePtr(g_dbus_message_new_method_reply(call.get())).get());
    });
  }
}

void save_unsaved() {
  for (const auto &port : std::exchange(state_calls().unsaved, {})) {
    io_port_when_idle(port.get(), [port] { param_request_save(port.get(), kSettingsFile); });
  }
}

gboolean on_save_pause_over(gpointer /*user_data*/) {
  StateCalls &calls = state_calls();
  if (calls.unsaved.empty()) {
    calls.save_pause.forget();
    return G_SOURCE_REMOVE;
  }
  save_unsaved();
  return G_SOURCE_CONTINUE;
}

void save_now_or_soon() {
  StateCalls &calls = state_calls();
  if (!calls.save_pause && !calls.unsaved.empty()) {
    save_unsaved();
    calls.save_pause = Source(g_timeout_add(kSavePause, on_save_pause_over, nullptr));
  }
}

void serve(Call &call) {
  IOPortRef port = find_ioport(call.port);
  if (!port) {
    return refuse(call.message.get(), IO_CONTROL_ERROR_NO_PORT, "No such port.");
  }
  if (!io_port_set_state(port.get(), call.active)) {
    return refuse(call.message.get(), IO_CONTROL_ERROR_NOT_OUTPUT, "Port not output.");
  }
  answer_when_idle(port.get(), std::move(call.message));
  state_calls().unsaved.insert(std::move(port));
}

// Whatever comes later goes into another batch.
std::vector<Call> take_calls(const BatchPtr *holder) {
  StateCalls &calls = state_calls();
  const std::lock_guard lock(calls.lock);
  const BatchPtr &batch = *holder;
  if (calls.growing == batch) {
    calls.growing.reset();
  }
  return std::exchange(batch->calls, {});
}

gboolean serve_batch(gpointer user_data) {
  for (Call &call : take_calls(static_cast<const BatchPtr *>(user_data))) {
    serve(call);
  }
  save_now_or_soon();
  return G_SOURCE_REMOVE;
}

}  // namespace

void state_calls_start(GDBusConnection *connection, const char *path, const char *interface) {
  StateCalls &calls = state_calls();
  {
    const std::lock_guard lock(calls.lock);
    calls.path = path;
    calls.interface = interface;
  }
  calls.connection = gobject_reference(connection);
  calls.filter = g_dbus_connection_add_filter(connection, take_call, nullptr, nullptr);
}

void state_calls_stop() {
  StateCalls &calls = state_calls();
  if (calls.connection) {
    g_dbus_connection_remove_filter(calls.connection.get(), calls.filter);
    calls.connection.reset();
  }
  calls.save_pause.reset();
  save_unsaved();
  const std::lock_guard lock(calls.lock);
  calls.growing.reset();
}
