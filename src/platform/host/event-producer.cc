#include <string_view>

#include "platform/host/event-bus.h"
#include "platform/host/event-wire.h"

struct Event {
  std::weak_ptr<const EventProducer> producer;
  guint32 id = 0;
  Inspectable values;
};

namespace {

constexpr std::string_view kHexDigits = "0123456789abcdef";

// An element of an object path takes letters, digits and underscores only.
std::string object_path(std::string_view name) {
  std::string path = "/com/kelv/Event/";
  for (const char c : name) {
    const auto byte = static_cast<unsigned char>(c);
    if (g_ascii_isalnum(c) || c == '_') {
      path += c;
    } else {
      path += {'_', kHexDigits[byte >> 4U], kHexDigits[byte & 0xFU]};
    }
  }
  return path;
}

// After four thousand million declarations the numbers start over.
guint32 unused_id(EventProducer &producer) {
  do {
    ++producer.last_id;
  } while (producer.last_id == 0 || producer.declarations.contains(producer.last_id));
  return producer.last_id;
}

void signal_undeclared(const EventLibrary &library, EventProducer &producer, guint32 id) {
  event_bus_signal(library, producer, "Undeclared", g_variant_new("(u)", id));
}

void undeclare_all(const EventLibrary &library, EventProducer &producer) {
  for (const auto &[id, live] : producer.declarations) {
    signal_undeclared(library, producer, id);
  }
  producer.declarations.clear();
}

gboolean fail(GError **error, GIOErrorEnum code, const char *text) {
  g_set_error_literal(error, G_IO_ERROR, code, text);
  return FALSE;
}

}  // namespace

// Never destroyed: threads that outlive main() may still send.
EventLibrary &event_library() {
  static auto *const library = new EventLibrary;
  return *library;
}

EventProducer *event_producer_new(const gchar *name) {
  if (!is_name(name)) {
    return nullptr;
  }
  auto &library = event_library();
  const EventLock lock(library.lock);
  auto &producer = library.producers[object_path(name)];
  if (!producer) {
    producer = std::make_shared<EventProducer>();
    producer->path = object_path(name);
    event_bus_publish(library, *producer);
  }
  ++producer->users;
  return producer.get();
}

EventProducer *event_producer_new_full(const gchar *name, guint /*flags*/, guint /*reserved*/) {
  return event_producer_new(name);
}

void event_producer_free(EventProducer *producer) {
  if (!producer) {
    return;
  }
  auto &library = event_library();
  std::shared_ptr<EventProducer> last;
  const EventLock lock(library.lock);
  if (--producer->users != 0) {
    return;
  }
  last = producer->shared_from_this();
  library.producers.erase(producer->path);
  undeclare_all(library, *producer);
  event_bus_withdraw(library, *producer);
}

guint32 event_producer_declare(EventProducer *producer, const EventDeclaration *declaration) {
  if (!producer || !declaration) {
    return 0;
  }
  EventDeclaration copy = *declaration;
  merge_values(copy.inspectable, query_property(copy));
  auto &library = event_library();
  const EventLock lock(library.lock);
  const guint32 id = unused_id(*producer);
  event_bus_signal(library, *producer, "Declared",
                   g_variant_new("(u@a{sv})", id, declaration_to_variant(copy)));
  producer->declarations.emplace(id, LiveDeclaration{std::move(copy)});
  return id;
}

gboolean event_producer_undeclare(EventProducer *producer, guint32 id) {
  if (!producer) {
    return FALSE;
  }
  auto &library = event_library();
  const EventLock lock(library.lock);
  if (producer->declarations.erase(id) == 0) {
    return FALSE;
  }
  signal_undeclared(library, *producer, id);
  return TRUE;
}

Event *event_producer_prepare_event(EventProducer *producer, guint32 id) {
  if (!producer) {
    return nullptr;
  }
  const EventLock lock(event_library().lock);
  const auto live = producer->declarations.find(id);
  if (live == producer->declarations.end()) {
    return nullptr;
  }
  auto event = std::make_unique<Event>();
  event->producer = producer->weak_from_this();
  event->id = id;
  event->values = empty_inspectable(live->second.declaration.inspectable);
  return event.release();
}

gboolean event_producer_send_event(EventProducer *producer, const Event *event, GError **error) {
  if (!producer || !event || event->producer.lock().get() != producer) {
    return fail(error, G_IO_ERROR_INVALID_ARGUMENT, "Not an event of this producer");
  }
  auto &library = event_library();
  const EventLock lock(library.lock);
  const auto found = producer->declarations.find(event->id);
  if (found == producer->declarations.end()) {
    return fail(error, G_IO_ERROR_NOT_FOUND, "The event is no longer declared");
  }
  auto &[id, live] = *found;
  Inspectable &current = live.declaration.inspectable;
  if (!merge_values(current, event->values)) {
    return fail(error, G_IO_ERROR_INVALID_ARGUMENT, "A value is not of the type of its key");
  }
  ++live.sends;
  event_bus_signal(library, *producer, "Sent",
                   g_variant_new("(u@a{sv})", id, keys_to_variant(current)));
  return TRUE;
}

Inspectable *event_get_inspectable(Event *event) {
  return event ? &event->values : nullptr;
}

void event_free(Event *event) {
  const std::unique_ptr<Event> owned(event);
}
