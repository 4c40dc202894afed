// Tells older configuration tools that the number of inputs and outputs has changed. Main thread.
#pragma once

#include <memory>

#include "base/glib-ptr.h"
#include "platform/configuration-event.h"
#include "platform/event.h"

struct LegacyAnnouncer {
  std::unique_ptr<EventProducer, GlibDeleter<event_producer_free>> producer;
  std::unique_ptr<ConfigurationEvent, GlibDeleter<configuration_event_free>> event;
};

// The one that the daemon announces with. Until it is started, and after it is stopped, announcing
// does nothing.
LegacyAnnouncer &legacy_announcer();

// Makes the announcements known. What fails is passed over: the tools then read old counts.
void legacy_announcer_start(LegacyAnnouncer &announcer);
// Announces the inputs, then the outputs. Whatever port has changed, tools watch the first object.
void legacy_announce_counts(const LegacyAnnouncer &announcer);
void legacy_announcer_stop(LegacyAnnouncer &announcer);
