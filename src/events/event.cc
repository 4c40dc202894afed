#include "events/event.h"

#include <atomic>

#include "base/assert.h"
#include "base/glib-ptr.h"
#include "base/log.h"
#include "events/event-values.h"
#include "platform/event.h"
#include "port/ioport.h"
#include "port/port-listener.h"
#include "port/port-registry.h"

namespace {

constexpr const char *kProducerName = "pcd";
constexpr const char *kPortEvent = "IOPort";
constexpr const char *kPortAny = "PortAny";
constexpr const char *kSupervisedEvent = "com.kelv.Event.Pcd.SupervisedPort";

using DeclarationPtr = std::unique_ptr<EventDeclaration, GlibDeleter<event_declaration_free>>;
using EventPtr = std::unique_ptr<Event, GlibDeleter<event_free>>;

// Made by the main thread before anything is declared, and gone after the last port.
EventProducer *producer = nullptr;
// Ports share the any-port declaration. It is made once and lives until the daemon ends.
std::atomic<guint32> port_any_id = 0;

std::string name_of(const IoEvent *event) {
  return event->name.value_or("");
}

bool is_tampered(SupervisedRangeState state) {
  return state == SUPERVISED_STATE_SHORT || state == SUPERVISED_STATE_CUT;
}

void set_supervised_values(Inspectable *values, SupervisedRangeState state) {
  inspectable_set_bool(values, "tampered", is_tampered(state));
  inspectable_set_string(values, "state", supervised_range_state2string(state));
}

// --- Current values of property events, asked for by the event library ---

// Callbacks outlive nothing: they carry the number of their port and not the port.
gpointer number_as_data(int number) {
  return GINT_TO_POINTER(number);  // NOLINT(performance-no-int-to-ptr)
}

IOPortRef port_of(gpointer user_data) {
  return port_registry_find(static_cast<std::uint32_t>(GPOINTER_TO_INT(user_data)));
}

void read_port_state(Inspectable *values, gpointer user_data) {
  if (const IOPortRef port = port_of(user_data)) {
    inspectable_set_bool(values, "state", io_port_get_state(port.get()));
  }
}

void read_any_port_state(Inspectable *values, gpointer /*user_data*/) {
  inspectable_set_bool(values, "state", port_registry_any_port_active());
}

void read_supervised_state(Inspectable *values, gpointer user_data) {
  if (const IOPortRef port = port_of(user_data)) {
    set_supervised_values(values, io_port_get_supervised_state(port.get()));
  }
}

// --- Declarations ---

void add_topics(EventDeclaration *declaration, const char *topic2, const char *topic2_nice_name) {
  const struct {
    const char *key;
    const char *value;
    const char *name_space;
  } topics[] = {
      {"topic0", "Device", "tns1"}, {"topic1", "IO", "tnskelv"}, {"topic2", topic2, "tnskelv"}};
  Inspectable *values = event_declaration_get_inspectable(declaration);
  for (const auto &topic : topics) {
    event_declaration_add_key(declaration, topic.key, EVENT_KEY_STRING);
    inspectable_set_string(values, topic.key, topic.value);
    event_declaration_set_namespace(declaration, topic.key, topic.name_space);
  }
  event_declaration_set_nice_names(declaration, "topic1", nullptr, "Input ports");
  event_declaration_set_nice_names(declaration, "topic2", nullptr, topic2_nice_name);
}

void add_port(EventDeclaration *declaration, int number, const char *name) {
  event_declaration_add_key(declaration, "port", EVENT_KEY_INT);
  inspectable_set_int(event_declaration_get_inspectable(declaration), "port", number);
  event_declaration_set_nice_names(declaration, "port", "Port", name);
  event_declaration_set_key_tag(declaration, "port", "onvif-source");
}

void add_data_key(EventDeclaration *declaration, const char *key, int type, const char *nice_name) {
  event_declaration_add_key(declaration, key, type);
  event_declaration_set_nice_names(declaration, key, nice_name, nullptr);
  event_declaration_set_key_tag(declaration, key, "onvif-data");
}

guint32 declare_port_event(int number, const char *port_name, EventPropertyCallback callback) {
  const DeclarationPtr declaration(event_declaration_new());
  add_port(declaration.get(), number, port_name);
  add_data_key(declaration.get(), "state", EVENT_KEY_BOOL, "Active");
  add_topics(declaration.get(), "Port", "Digital input port");
  event_declaration_set_property(declaration.get(), "state", callback, number_as_data(number));
  return event_producer_declare(producer, declaration.get());
}

guint32 declare_supervised(IOPort *port, const char *port_name) {
  const int number = io_port_get_number(port);
  const DeclarationPtr declaration(event_declaration_new());
  add_port(declaration.get(), number, port_name);
  add_data_key(declaration.get(), "tampered", EVENT_KEY_BOOL, "Tampered");
  add_data_key(declaration.get(), "state", EVENT_KEY_STRING, "State");
  add_topics(declaration.get(), "SupervisedPort", "Supervised input port");
  event_declaration_set_property(declaration.get(), "tampered", read_supervised_state,
                                 number_as_data(number));
  return event_producer_declare(producer, declaration.get());
}

guint32 declare_port_any() {
  constexpr int every_port = -1;
  if (port_any_id == 0) {
    port_any_id = declare_port_event(every_port, "Any", read_any_port_state);
  }
  return port_any_id;
}

// --- Events that the hardware description describes ---

// False with an error: the library refused to send. False without: there was nothing to send.
bool send_described(IOPort *port, IoEvent *event, GError **error) {
  const EventPtr prepared(event_producer_prepare_event(producer, event->id));
  if (!prepared) {
    log_warning("Failed to prepare event: %s id: %d", name_of(event).c_str(),
                static_cast<int>(event->id));
    return false;
  }
  if (!populate_event_values(port, event->keys, event_get_inspectable(prepared.get()), true,
                             nullptr)) {
    log_warning("Failed to populate event values");
    return false;
  }
  return event_producer_send_event(producer, prepared.get(), error);
}

void send_initial_state(IOPort *port, IoEvent *event) {
  Error error;
  if (!send_described(port, event, error.out())) {
    log_warning("Failed to send initial state of event %s for port %d", name_of(event).c_str(),
                io_port_get_number(port));
  }
}

bool make_property(EventDeclaration *declaration, const std::string &key) {
  if (key.empty() || event_declaration_is_property(declaration)) {
    return true;
  }
  if (!event_declaration_set_property(declaration, key.c_str(), nullptr, nullptr)) {
    log_warning("Failed to set event property: %s", key.c_str());
    return false;
  }
  return true;
}

void declare_described(IOPort *port, IoEvent *event) {
  const std::string name = name_of(event);
  const int number = io_port_get_number(port);
  if (!event_keys_are_valid(port, event->keys)) {
    return;
  }
  const DeclarationPtr declaration(event_declaration_new_from_type(name.c_str()));
  if (!declaration) {
    log_warning("Failed to create event declaration: %s for port %d", name.c_str(), number);
    return;
  }
  std::string property_key;
  if (!populate_event_values(port, event->keys,
                             event_declaration_get_inspectable(declaration.get()), false,
                             &property_key)) {
    log_warning("Failed to populate event declaration!");
    return;
  }
  if (!make_property(declaration.get(), property_key)) {
    return;
  }
  event->id = event_producer_declare(producer, declaration.get());
  if (event->id == 0) {
    log_warning("Failed to declare event %s for port %d", name.c_str(), number);
    return;
  }
  if (event_declaration_is_property(declaration.get()) && !event->declare_only) {
    send_initial_state(port, event);
  }
}

// --- Sending ---

// A supervised event repeats its last value only after a reset of its filter.
bool is_repeat(IoEvent *event, std::int32_t value) {
  const bool reset = event->filter_reset.exchange(false);
  const std::int32_t last = event->last_value.exchange(value);
  return event->supervised_input && !reset && last == value;
}

bool send_state(guint32 id, bool state, GError **error) {
  const EventPtr prepared(event_producer_prepare_event(producer, id));
  if (!prepared) {
    return false;
  }
  inspectable_set_bool(event_get_inspectable(prepared.get()), "state", state);
  return event_producer_send_event(producer, prepared.get(), error);
}

bool send_port_any(bool state, GError **error) {
  if (port_any_id == 0) {
    log_warning("PortAny event not declared");
    return false;
  }
  return send_state(port_any_id, state, error);
}

bool send_supervised(guint32 id, SupervisedRangeState state, GError **error) {
  const EventPtr prepared(event_producer_prepare_event(producer, id));
  if (!prepared) {
    return false;
  }
  set_supervised_values(event_get_inspectable(prepared.get()), state);
  return event_producer_send_event(producer, prepared.get(), error);
}

bool send_by_name(IOPort *port, IoEvent *event, std::int32_t value, GError **error) {
  if (event->name == kPortEvent) {
    return send_state(event->id, value != 0, error);
  }
  if (event->name == kPortAny) {
    return send_port_any(value != 0, error);
  }
  if (event->name == kSupervisedEvent) {
    return send_supervised(event->id, static_cast<SupervisedRangeState>(value), error);
  }
  return send_described(port, event, error);
}

void on_send_event(IOPort *port, IoEvent *event, std::int32_t value) {
  io_event_send(port, event, value);
}

}  // namespace

void io_events_start() {
  producer = event_producer_new(kProducerName);
  port_listener().declare_event = io_event_declare;
  port_listener().undeclare_event = io_event_undeclare;
  port_listener().redeclare_event = io_event_redeclare;
  port_listener().send_event = on_send_event;
}

void io_events_stop() {
  event_producer_free(producer);
  producer = nullptr;
  port_any_id = 0;
}

bool io_event_declare(IOPort *port, IoEvent *event) {
  io_event_reset_filter(event);
  if (!producer || event->id != 0 || !io_port_event_applies(port, *event)) {
    return true;
  }
  const std::string port_name = io_port_get_name(port).value_or("");
  if (event->name == kPortEvent) {
    event->id = declare_port_event(io_port_get_number(port), port_name.c_str(), read_port_state);
  } else if (event->name == kPortAny) {
    event->id = declare_port_any();
  } else if (event->name == kSupervisedEvent) {
    event->id = declare_supervised(port, port_name.c_str());
  } else {
    declare_described(port, event);
  }
  return true;
}

void io_event_undeclare(IoEvent *event) {
  if (event->name == kPortAny) {
    return;
  }
  if (const guint32 id = event->id.exchange(0)) {
    event_producer_undeclare(producer, id);
  }
}

void io_event_redeclare(IOPort *port, IoEvent *event) {
  if (event->name == kPortAny) {
    return;
  }
  io_event_undeclare(event);
  io_event_declare(port, event);
}

bool io_event_send(IOPort *port, IoEvent *event, std::int32_t value) {
  if (event->id == 0 || !producer || event->declare_only) {
    return false;
  }
  if (event->name == kSupervisedEvent) {
    value = static_cast<std::int32_t>(io_port_get_supervised_state(port));
  }
  if (is_repeat(event, value)) {
    return false;
  }
  Error error;
  const bool sent = send_by_name(port, event, value, error.out());
  if (error) {
    log_warning("Error sending event: %s", error.message());
  }
  return sent;
}

void io_event_reset_filter(IoEvent *event) {
  assert_nonnull(event);
  event->filter_reset = true;
}
