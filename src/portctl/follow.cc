#include "portctl/follow.h"

namespace {

// The daemon owns its name a moment before it serves the objects below it.
constexpr guint kRetryMs = 100;

}  // namespace

Follower::~Follower() {
  if (retry_ != 0) {
    g_source_remove(retry_);
  }
  if (watch_ != 0) {
    g_bus_unwatch_name(watch_);
    g_dbus_connection_signal_unsubscribe(bus_.connection(), control_);
    g_dbus_connection_signal_unsubscribe(bus_.connection(), producer_);
  }
}

void Follower::start() {
  subscribe();
  watch_ =
      g_bus_watch_name_on_connection(bus_.connection(), kControlName, G_BUS_NAME_WATCHER_FLAGS_NONE,
                                     appeared, vanished, this, nullptr);
}

void Follower::subscribe() {
  control_ = g_dbus_connection_signal_subscribe(
      bus_.connection(), kControlName, kControlName, nullptr, kControlPath, nullptr,
      G_DBUS_SIGNAL_FLAGS_NONE, on_control_signal, this, nullptr);
  producer_ = g_dbus_connection_signal_subscribe(
      bus_.connection(), kControlName, kProducerInterface, nullptr, kProducerPath, nullptr,
      G_DBUS_SIGNAL_FLAGS_NONE, on_producer_signal, this, nullptr);
}

Port *Follower::find(int number) {
  for (auto &port : ports_) {
    if (port.number == number) {
      return &port;
    }
  }
  return nullptr;
}

bool Follower::fetch() {
  Error error;
  auto ports = try_fetch_ports(bus_, error);
  if (!ports && !is_absence(error)) {
    fail_call(error, "");
  }
  if (ports) {
    ports_ = std::move(*ports);
  }
  return ports.has_value();
}

void Follower::connect_daemon() {
  if (!fetch()) {
    if (retry_ == 0) {
      retry_ = g_timeout_add(kRetryMs, on_retry, this);
    }
    return;
  }
  fetch_declarations();
  on_up();
}

gboolean Follower::on_retry(gpointer data) {
  auto &self = *static_cast<Follower *>(data);
  self.retry_ = 0;
  self.connect_daemon();
  return G_SOURCE_REMOVE;
}

void Follower::appeared(GDBusConnection * /*connection*/, const char * /*name*/,
                        const char * /*owner*/, gpointer data) {
  static_cast<Follower *>(data)->connect_daemon();
}

void Follower::vanished(GDBusConnection * /*connection*/, const char * /*name*/, gpointer data) {
  auto &self = *static_cast<Follower *>(data);
  if (self.retry_ != 0) {
    g_source_remove(self.retry_);
    self.retry_ = 0;
  }
  self.event_types_.clear();
  self.on_down();
}

// Without the declarations an event has no type to show, which is no reason to show nothing.
void Follower::fetch_declarations() {
  const GVariantPtr reply(g_dbus_connection_call_sync(
      bus_.connection(), kControlName, kProducerPath, kProducerInterface, "List", nullptr,
      G_VARIANT_TYPE("(a(ua{sv}))"), G_DBUS_CALL_FLAGS_NONE, -1, nullptr, nullptr));
  if (!reply) {
    return;
  }
  const GVariantPtr list(g_variant_get_child_value(reply.get(), 0));
  for (gsize i = 0; i < g_variant_n_children(list.get()); ++i) {
    guint32 id = 0;
    GVariant *entry = nullptr;
    g_variant_get_child(list.get(), i, "(u@a{sv})", &id, &entry);
    handle_declared(id, GVariantPtr(entry).get());
  }
}

void Follower::handle_declared(std::uint32_t id, GVariant *entry) {
  const char *type = "";
  g_variant_lookup(entry, "type", "&s", &type);
  event_types_[id] = type;
}

void Follower::on_control_signal(GDBusConnection * /*connection*/, const char * /*sender*/,
                                 const char * /*path*/, const char * /*interface*/,
                                 const char *member, GVariant *arguments, gpointer data) {
  auto &self = *static_cast<Follower *>(data);
  const std::string_view name = member;
  if (name == "PortChanged" && g_variant_is_of_type(arguments, G_VARIANT_TYPE("(ibbbbbb)"))) {
    self.handle_change(arguments);
  } else if (name == "ActionSequenceDone" &&
             g_variant_is_of_type(arguments, G_VARIANT_TYPE("(i)"))) {
    self.handle_sequence(arguments);
  }
}

void Follower::handle_change(GVariant *arguments) {
  Change change;
  gboolean is_virtual = FALSE;
  gboolean hidden = FALSE;
  gboolean input = FALSE;
  gboolean reported = FALSE;
  gboolean active = FALSE;
  gboolean active_low = FALSE;
  g_variant_get(arguments, "(ibbbbbb)", &change.port, &is_virtual, &hidden, &input, &reported,
                &active, &active_low);
  change.is_virtual = is_virtual;
  change.hidden = hidden;
  change.input = input;
  change.reported = reported;
  change.active = active;
  change.active_low = active_low;
  // One that is new came back into service, or is a manual trigger.
  Port *port = find(change.port);
  if (!port && fetch()) {
    port = find(change.port);
  }
  if (!port) {
    return;
  }
  port->input = change.input;
  port->active = change.active;
  port->active_low = change.active_low;
  if (port->supervision) {
    refresh_readout(bus_, *port);
  }
  on_change(change, *port);
}

void Follower::handle_sequence(GVariant *arguments) {
  gint32 number = -1;
  g_variant_get(arguments, "(i)", &number);
  on_sequence_done(number, find(number));
}

void Follower::on_producer_signal(GDBusConnection * /*connection*/, const char * /*sender*/,
                                  const char * /*path*/, const char * /*interface*/,
                                  const char *member, GVariant *arguments, gpointer data) {
  auto &self = *static_cast<Follower *>(data);
  const std::string_view name = member;
  if (name == "Sent" && g_variant_is_of_type(arguments, G_VARIANT_TYPE("(ua{sv})"))) {
    self.handle_sent(arguments);
  } else if (name == "Declared" && g_variant_is_of_type(arguments, G_VARIANT_TYPE("(ua{sv})"))) {
    guint32 id = 0;
    GVariant *entry = nullptr;
    g_variant_get(arguments, "(u@a{sv})", &id, &entry);
    self.handle_declared(id, GVariantPtr(entry).get());
  }
}

void Follower::handle_sent(GVariant *arguments) {
  SentEvent event;
  GVariant *keys = nullptr;
  g_variant_get(arguments, "(u@a{sv})", &event.id, &keys);
  const GVariantPtr owned(keys);
  event.keys = keys;
  const auto type = event_types_.find(event.id);
  event.type = type == event_types_.end() ? "" : type->second;
  on_event(event);
}
