#include "legacy/announcer.h"

#include <cstdint>
#include <string>

#include "base/log.h"
#include "legacy/names.h"
#include "port/port-registry.h"

namespace {

constexpr const char *kName = "portd";
constexpr unsigned kConsumers = 3;

std::string watched_path() {
  return legacy_object_path(0);
}

void announce(ConfigurationEvent *event, const char *property, std::uint32_t count) {
  const std::string path = watched_path();
  configuration_event_initialize_change_string(event);
  configuration_event_append_escaped_pair_to_change_string(event, property,
                                                           std::to_string(count).c_str());
  Error error;
  if (!configuration_event_send(event, kLegacyService, path.c_str(), kLegacyService, path.c_str(),
                                kConsumers, error.out())) {
    log_warning("Could not announce %s: %s", property, error.message());
  }
}

}  // namespace

LegacyAnnouncer &legacy_announcer() {
  static LegacyAnnouncer announcer;
  return announcer;
}

void legacy_announcer_start(LegacyAnnouncer &announcer) {
  announcer.producer.reset(event_producer_new_full(kName, 0, 0));
  announcer.event.reset(configuration_event_new(kName, announcer.producer.get(), 0));
  if (announcer.event) {
    configuration_event_declare(announcer.event.get(), kLegacyService, watched_path().c_str(),
                                kLegacyService, nullptr);
  }
}

void legacy_announce_counts(const LegacyAnnouncer &announcer) {
  if (announcer.event) {
    announce(announcer.event.get(), "NbrOfInputs", port_registry_count_inputs());
    announce(announcer.event.get(), "NbrOfOutputs", port_registry_count_outputs());
  }
}

// What can't be withdrawn may still be in use by the library, so it has to stay.
void legacy_announcer_stop(LegacyAnnouncer &announcer) {
  if (!announcer.event ||
      configuration_event_undeclare(announcer.event.get(), kLegacyService, watched_path().c_str(),
                                    kLegacyService, nullptr)) {
    announcer.event.reset();
    announcer.producer.reset();
  } else {
    (void)announcer.event.release();
    (void)announcer.producer.release();
  }
}
