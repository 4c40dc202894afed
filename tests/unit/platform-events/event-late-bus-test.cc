// A process that starts before its bus.
#include <gio/gio.h>
#include <gtest/gtest.h>

#include "owners.h"
#include "private-bus.h"
#include "watcher.h"

namespace {

std::string the_address;

bool the_current = false;

void read_current(Inspectable *values, gpointer /*user_data*/) {
  inspectable_set_bool(values, "state", the_current);
}

// The library has found out that there is no bus when it says so.
void note_log(const gchar * /*domain*/, GLogLevelFlags /*level*/, const gchar * /*text*/,
              gpointer user_data) {
  ++*static_cast<int *>(user_data);
}

TEST(EventLateBus, DeclarationsAreAnnouncedWhenTheBusComes) {
  int logged = 0;
  const guint handler = g_log_set_handler("portd", G_LOG_LEVEL_INFO, note_log, &logged);
  const ProducerPtr producer(event_producer_new("some"));
  const DeclarationPtr plain = port_declaration(1);
  const DeclarationPtr property = port_declaration(2);
  event_declaration_set_property(property.get(), "state", read_current, nullptr);
  const guint32 first = event_producer_declare(producer.get(), plain.get());
  const guint32 gone = event_producer_declare(producer.get(), plain.get());
  event_producer_declare(producer.get(), property.get());
  ASSERT_TRUE(wait_until([&logged] { return logged == 1; }));
  EXPECT_TRUE(send_state(producer.get(), first, true));
  EXPECT_TRUE(event_producer_undeclare(producer.get(), gone));
  the_current = true;

  const PrivateBus bus(the_address);
  Watcher watcher(the_address, "com.kelv.Event.Producer");
  ASSERT_TRUE(wait_until([&watcher] { return watcher.count("Declared") == 2; }));
  EXPECT_TRUE(send_state(producer.get(), first, false));
  const GObjectPtr<GDBusConnection> shared(g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, nullptr));
  g_dbus_connection_set_exit_on_close(shared.get(), FALSE);
  EXPECT_NE(watcher.list(g_dbus_connection_get_unique_name(shared.get()), "some"), nullptr);
  const auto heard = watcher.signals();
  ASSERT_EQ(heard.size(), 3U);
  EXPECT_NE(heard[0].find("(1, {'type': <''>, 'keys': <{'port': <1>, 'state': <true>}>"),
            std::string::npos)
      << heard[0];
  EXPECT_NE(heard[1].find("(3, {'type': <''>, 'keys': <{'port': <2>, 'state': <true>}>"),
            std::string::npos)
      << heard[1];
  EXPECT_EQ(heard[2], "Sent (1, {'port': <1>, 'state': <false>})");
  EXPECT_EQ(logged, 1);
  g_log_remove_handler("portd", handler);
}

}  // namespace

int main(int argc, char **argv) {
  the_address = point_system_bus_at_nothing();
  testing::InitGoogleTest(&argc, argv);
  return RUN_ALL_TESTS();
}
