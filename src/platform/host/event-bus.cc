#include "platform/host/event-bus.h"

#include "base/log.h"
#include "platform/host/event-wire.h"

namespace {

constexpr const char *kInterface = "com.kelv.Event.Producer";
constexpr const char *kIntrospection = R"xml(<node>
  <interface name="com.kelv.Event.Producer">
    <method name="List"><arg name="declarations" type="a(ua{sv})" direction="out"/></method>
    <signal name="Declared"><arg name="id" type="u"/><arg name="declaration" type="a{sv}"/></signal>
    <signal name="Undeclared"><arg name="id" type="u"/></signal>
    <signal name="Sent"><arg name="id" type="u"/><arg name="keys" type="a{sv}"/></signal>
  </interface>
</node>)xml";

// Start-up declares and sends before the main loop runs, which is where the connection arrives.
// Those signals are queued, up to this many for each producer.
constexpr std::size_t kMaxQueued = 1024;

// Nothing tells when a bus appears, so it is looked for.
constexpr guint kRetrySeconds = 1;

struct Answer {
  Inspectable values;
  guint64 sends;
};
using Answers = std::map<guint32, Answer>;

// What the property callbacks say now. The lock is not held while they run.
Answers query_properties(const EventProducer &producer, EventLock &lock) {
  LiveDeclarations asked;
  for (const auto &[id, live] : producer.declarations) {
    if (live.declaration.callback) {
      asked.emplace(id, live);
    }
  }
  lock.unlock();
  Answers answers;
  for (const auto &[id, live] : asked) {
    answers.emplace(id, Answer{query_property(live.declaration), live.sends});
  }
  lock.lock();
  return answers;
}

// An event that was sent after the callback was called has newer values.
GVariant *describe(guint32 id, const LiveDeclaration &live, const Answers &answers) {
  const auto answer = answers.find(id);
  if (answer == answers.end() || answer->second.sends != live.sends) {
    return declaration_to_variant(live.declaration);
  }
  EventDeclaration current = live.declaration;
  merge_values(current.inspectable, answer->second.values);
  return declaration_to_variant(current);
}

GVariant *describe_all(const EventProducer &producer, const Answers &answers) {
  GVariantBuilder builder;
  g_variant_builder_init(&builder, G_VARIANT_TYPE("a(ua{sv})"));
  for (const auto &[id, live] : producer.declarations) {
    g_variant_builder_add(&builder, "(u@a{sv})", id, describe(id, live, answers));
  }
  return g_variant_new("(a(ua{sv}))", &builder);
}

// The reply is sent under the lock too, so that it is in order with the signals.
void on_method_call(GDBusConnection * /*connection*/, const gchar * /*sender*/,
                    const gchar *object_path, const gchar * /*interface_name*/,
                    const gchar * /*method_name*/, GVariant * /*parameters*/,
                    GDBusMethodInvocation *invocation, gpointer /*user_data*/) {
  auto &library = event_library();
  EventLock lock(library.lock);
  const auto found = library.producers.find(object_path);
  if (found == library.producers.end()) {
    g_dbus_method_invocation_return_error(invocation, G_DBUS_ERROR, G_DBUS_ERROR_UNKNOWN_OBJECT,
                                          "No such producer");
    return;
  }
  const auto producer = found->second;
  const Answers answers = query_properties(*producer, lock);
  g_dbus_method_invocation_return_value(invocation, describe_all(*producer, answers));
}

constexpr GDBusInterfaceVTable kVtable = {
    .method_call = on_method_call, .get_property = nullptr, .set_property = nullptr, .padding = {}};

void emit(const EventLibrary &library, const EventProducer &producer, const EventSignal &signal) {
  // A failure means that the connection is closed: there is no receiver.
  g_dbus_connection_emit_signal(library.connection.get(), nullptr, producer.path.c_str(),
                                kInterface, signal.name, signal.parameters.get(), nullptr);
}

void register_object(const EventLibrary &library, EventProducer &producer) {
  const GDBusNodeInfoPtr node(g_dbus_node_info_new_for_xml(kIntrospection, nullptr));
  Error error;
  producer.registration = g_dbus_connection_register_object(
      library.connection.get(), producer.path.c_str(), node->interfaces[0], &kVtable, nullptr,
      nullptr, error.out());
  if (error) {
    log_warning("Could not export %s: %s", producer.path.c_str(), error.message());
  }
}

void announce(const EventLibrary &library, const EventProducer &producer, const Answers &answers) {
  for (const auto &[id, live] : producer.declarations) {
    emit(library, producer,
         {"Declared", GVariantPtr(g_variant_ref_sink(
                          g_variant_new("(u@a{sv})", id, describe(id, live, answers))))});
  }
}

// The object comes before the signals, so that List works for their receivers.
void connect_producer(const EventLibrary &library, EventProducer &producer, EventLock &lock) {
  register_object(library, producer);
  if (producer.signals_lost) {
    const Answers answers = query_properties(producer, lock);
    if (producer.users == 0) {
      return;
    }
    announce(library, producer, answers);
  }
  for (const auto &signal : producer.queued) {
    emit(library, producer, signal);
  }
  producer.queued.clear();
  producer.signals_lost = false;
  producer.on_bus = true;
}

void connect_producers(const EventLibrary &library, EventLock &lock) {
  std::vector<std::shared_ptr<EventProducer>> unpublished;
  for (const auto &[path, producer] : library.producers) {
    if (!producer->on_bus && producer->registration == 0) {
      unpublished.push_back(producer);
    }
  }
  for (const auto &producer : unpublished) {
    if (producer->users != 0) {
      connect_producer(library, *producer, lock);
    }
  }
}

void drop_queued(EventProducer &producer) {
  producer.queued.clear();
  producer.signals_lost = true;
}

void on_bus(GObject *source, GAsyncResult *result, gpointer user_data);

gboolean on_wake(gpointer /*user_data*/) {
  auto &library = event_library();
  EventLock lock(library.lock);
  library.wake.reset();
  if (library.connection) {
    connect_producers(library, lock);
  } else if (!library.producers.empty() && !library.connecting) {
    library.connecting = true;
    g_bus_get(G_BUS_TYPE_SYSTEM, nullptr, on_bus, nullptr);
  }
  return G_SOURCE_REMOVE;
}

// Everything that is done with the connection is done in the main thread, which List comes to.
void run_on_main(EventLibrary &library, GSource *source) {
  g_source_set_priority(source, G_PRIORITY_DEFAULT);
  g_source_set_callback(source, on_wake, nullptr, nullptr);
  g_source_attach(source, nullptr);
  library.wake.reset(source);
}

void retry_later(EventLibrary &library) {
  for (const auto &[path, producer] : library.producers) {
    drop_queued(*producer);
  }
  run_on_main(library, g_timeout_source_new_seconds(kRetrySeconds));
}

void on_bus(GObject * /*source*/, GAsyncResult *result, gpointer /*user_data*/) {
  Error error;
  GObjectPtr<GDBusConnection> connection(g_bus_get_finish(result, error.out()));
  auto &library = event_library();
  EventLock lock(library.lock);
  library.connecting = false;
  if (library.producers.empty()) {
    return;
  }
  const bool was_missing = std::exchange(library.missing, !connection);
  if (connection) {
    library.connection = std::move(connection);
    connect_producers(library, lock);
    return;
  }
  retry_later(library);
  lock.unlock();
  if (!was_missing) {
    log_info("Events are not published until there is a system bus: %s", error.message());
  }
}

}  // namespace

void event_bus_publish(EventLibrary &library, EventProducer &producer) {
  producer.signals_lost = library.missing;
  if (!library.wake && !library.connecting) {
    run_on_main(library, g_idle_source_new());
  }
}

void event_bus_withdraw(EventLibrary &library, EventProducer &producer) {
  if (producer.registration != 0) {
    g_dbus_connection_unregister_object(library.connection.get(),
                                        std::exchange(producer.registration, 0));
  }
  producer.on_bus = false;
  producer.queued.clear();
  if (library.producers.empty()) {
    library.wake.reset();
    library.connection.reset();
    library.missing = false;
  }
}

void event_bus_signal(const EventLibrary &library, EventProducer &producer, const char *name,
                      GVariant *parameters) {
  EventSignal signal{name, GVariantPtr(g_variant_ref_sink(parameters))};
  if (producer.on_bus) {
    emit(library, producer, signal);
  } else if (!producer.signals_lost) {
    producer.queued.push_back(std::move(signal));
    if (producer.queued.size() > kMaxQueued) {
      drop_queued(producer);
    }
  }
}
