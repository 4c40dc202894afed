// What becomes of the announcements' handles when the library refuses.
#include "legacy/announcer.h"

#include <gio/gio.h>

#include "fixture.h"

namespace {

struct Library {
  bool refuses_to_declare = false;
  bool refuses_to_undeclare = false;
  std::vector<std::string> calls;
};

Library &library() {
  static Library instance;
  return instance;
}

gboolean refuse(GError **error) {
  g_set_error_literal(error, G_IO_ERROR, G_IO_ERROR_FAILED, "The fake refuses");
  return FALSE;
}

}  // namespace

// The linker's option --wrap gives the calls and the real functions these names.
gboolean fake_declare(ConfigurationEvent *handle, const gchar *interface, const gchar *path,
                      const gchar *changed_interface,
                      GError **error) asm("__wrap_configuration_event_declare");
gboolean real_declare(ConfigurationEvent *handle, const gchar *interface, const gchar *path,
                      const gchar *changed_interface,
                      GError **error) asm("__real_configuration_event_declare");
gboolean fake_undeclare(ConfigurationEvent *handle, const gchar *interface, const gchar *path,
                        const gchar *changed_interface,
                        GError **error) asm("__wrap_configuration_event_undeclare");
gboolean real_undeclare(ConfigurationEvent *handle, const gchar *interface, const gchar *path,
                        const gchar *changed_interface,
                        GError **error) asm("__real_configuration_event_undeclare");
void fake_event_free(ConfigurationEvent *handle) asm("__wrap_configuration_event_free");
void real_event_free(ConfigurationEvent *handle) asm("__real_configuration_event_free");
void fake_producer_free(EventProducer *producer) asm("__wrap_event_producer_free");
void real_producer_free(EventProducer *producer) asm("__real_event_producer_free");

gboolean fake_declare(ConfigurationEvent *handle, const gchar *interface, const gchar *path,
                      const gchar *changed_interface, GError **error) {
  library().calls.emplace_back("declare");
  return library().refuses_to_declare
             ? refuse(error)
             : real_declare(handle, interface, path, changed_interface, error);
}

gboolean fake_undeclare(ConfigurationEvent *handle, const gchar *interface, const gchar *path,
                        const gchar *changed_interface, GError **error) {
  library().calls.emplace_back("undeclare");
  return library().refuses_to_undeclare
             ? refuse(error)
             : real_undeclare(handle, interface, path, changed_interface, error);
}

void fake_event_free(ConfigurationEvent *handle) {
  library().calls.emplace_back("free event");
  real_event_free(handle);
}

void fake_producer_free(EventProducer *producer) {
  library().calls.emplace_back("free producer");
  real_producer_free(producer);
}

namespace {

using Calls = std::vector<std::string>;

class AnnouncerTest : public LegacyTest {
 protected:
  AnnouncerTest() { library() = {}; }

  LegacyAnnouncer announcer_;
};

TEST_F(AnnouncerTest, gives_its_handles_back_in_the_order_of_their_dependence) {
  legacy_announcer_start(announcer_);
  legacy_announcer_stop(announcer_);
  EXPECT_EQ(library().calls, (Calls{"declare", "undeclare", "free event", "free producer"}));
}

TEST_F(AnnouncerTest, keeps_what_the_library_may_still_use) {
  library().refuses_to_undeclare = true;
  legacy_announcer_start(announcer_);
  ConfigurationEvent *event = announcer_.event.get();
  EventProducer *producer = announcer_.producer.get();
  legacy_announcer_stop(announcer_);
  EXPECT_FALSE(announcer_.event);
  EXPECT_FALSE(announcer_.producer);
  EXPECT_EQ(library().calls, (Calls{"declare", "undeclare"}));
  EXPECT_TRUE(log().empty());
  real_event_free(event);
  real_producer_free(producer);
}

TEST_F(AnnouncerTest, goes_on_without_a_declaration) {
  library().refuses_to_declare = true;
  legacy_announcer_start(announcer_);
  EXPECT_TRUE(announcer_.event);
  EXPECT_TRUE(log().empty());
  legacy_announce_counts(announcer_);
  EXPECT_TRUE(log().took_containing(G_LOG_LEVEL_WARNING, "Could not announce NbrOfInputs: "));
  EXPECT_TRUE(log().took_containing(G_LOG_LEVEL_WARNING, "Could not announce NbrOfOutputs: "));
}

}  // namespace
