// The state that the event library's producers and its side of the bus share.
#pragma once

#include <gio/gio.h>

#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "base/glib-ptr.h"
#include "platform/host/event-keys.h"

struct EventSignal {
  const char *name;
  GVariantPtr parameters;
};

struct LiveDeclaration {
  EventDeclaration declaration;
  guint64 sends = 0;
};

using LiveDeclarations = std::map<guint32, LiveDeclaration>;

struct EventProducer : std::enable_shared_from_this<EventProducer> {
  std::string path;
  guint users = 0;
  guint32 last_id = 0;
  LiveDeclarations declarations;

  guint registration = 0;           // of the object; 0: none
  bool on_bus = false;              // signals go out as they come
  std::vector<EventSignal> queued;  // until there is a connection
  bool signals_lost = false;        // signals were lost, so the declarations must be announced
};

inline void destroy_source(GSource *source) {
  g_source_destroy(source);
  g_source_unref(source);
}

struct EventLibrary {
  // Guards everything below and every producer. Signals go out under it, so that their order is the
  // order of what happened; property callbacks are never called under it.
  std::mutex lock;
  std::map<std::string, std::shared_ptr<EventProducer>, std::less<>> producers;  // by object path

  GObjectPtr<GDBusConnection> connection;
  bool connecting = false;
  bool missing = false;  // the last attempt to connect failed
  // Brings what is left to do with the bus to the main thread.
  std::unique_ptr<GSource, GlibDeleter<destroy_source>> wake;
};

using EventLock = std::unique_lock<std::mutex>;

EventLibrary &event_library();
