// Owners for what the event libraries hand out, and short ways to fill it in.
#pragma once

#include <memory>

#include "base/glib-ptr.h"
#include "platform/configuration-event.h"
#include "platform/event.h"

using ProducerPtr = std::unique_ptr<EventProducer, GlibDeleter<event_producer_free>>;
using DeclarationPtr = std::unique_ptr<EventDeclaration, GlibDeleter<event_declaration_free>>;
using EventPtr = std::unique_ptr<Event, GlibDeleter<event_free>>;
using ConfigurationEventPtr =
    std::unique_ptr<ConfigurationEvent, GlibDeleter<configuration_event_free>>;

// The keys "port" (an int) and "state" (a bool).
inline DeclarationPtr port_declaration(gint32 port) {
  DeclarationPtr declaration(event_declaration_new());
  event_declaration_add_key(declaration.get(), "port", EVENT_KEY_INT);
  event_declaration_add_key(declaration.get(), "state", EVENT_KEY_BOOL);
  inspectable_set_int(event_declaration_get_inspectable(declaration.get()), "port", port);
  return declaration;
}

inline bool send_state(EventProducer *producer, guint32 id, bool state) {
  const EventPtr event(event_producer_prepare_event(producer, id));
  return inspectable_set_bool(event_get_inspectable(event.get()), "state", state) &&
         event_producer_send_event(producer, event.get(), nullptr);
}
