// Putting the objects on a connection, and the failures that end the daemon.
#include "legacy/objects.h"

#include <sys/socket.h>

#include <array>

#include "fixture.h"
#include "legacy/bridge.h"
#include "legacy/names.h"

namespace {

GObjectPtr<GDBusConnection> connect_to(int fd) {
  const GObjectPtr<GSocket> socket(g_socket_new_from_fd(fd, nullptr));
  const GObjectPtr<GSocketConnection> stream(
      g_socket_connection_factory_create_connection(socket.get()));
  return GObjectPtr<GDBusConnection>(g_dbus_connection_new_sync(
      G_IO_STREAM(stream.get()), nullptr, G_DBUS_CONNECTION_FLAGS_NONE, nullptr, nullptr, nullptr));
}

// A connection without a bus, and the client at its other end.
class Wire {
 public:
  Wire() {
    std::array<int, 2> ends{};
    socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data());
    connection_ = connect_to(ends[0]);
    client_ = connect_to(ends[1]);
  }
  ~Wire() {
    g_dbus_connection_close_sync(connection_.get(), nullptr, nullptr);
    g_dbus_connection_close_sync(client_.get(), nullptr, nullptr);
  }
  Wire(const Wire &) = delete;
  Wire &operator=(const Wire &) = delete;

  GDBusConnection *connection() const { return connection_.get(); }
  GDBusConnection *client() const { return client_.get(); }

 private:
  GObjectPtr<GDBusConnection> connection_;
  GObjectPtr<GDBusConnection> client_;
};

// The answer to a call: none as long as `done` is false.
struct Answer {
  bool done = false;
  Error error;
};

void take_answer(GObject *client, GAsyncResult *result, gpointer user_data) {
  auto &answer = *static_cast<Answer *>(user_data);
  const GVariantPtr reply(
      g_dbus_connection_call_finish(G_DBUS_CONNECTION(client), result, answer.error.out()));
  answer.done = true;
}

class ObjectsTest : public LegacyTest {
 protected:
  ObjectsTest() {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    controller_.connection.reset(G_DBUS_CONNECTION(g_object_ref(wire_.connection())));
    controller_.introspection = legacy_introspection_parse(kLegacyIntrospection);
  }

  Wire wire_;
  LegacyController controller_;
};

TEST_F(ObjectsTest, each_port_has_the_interfaces_of_its_type) {
  add_port(0, PORT_INPUT);
  add_port(1, PORT_OUTPUT);
  add_port(2, PORT_CONFIGURABLE);
  add_port(5, PORT_CONFIGURABLE);  // more than older tools know of
  add_port(-1, PORT_INPUT);
  legacy_register_objects(controller_);
  EXPECT_EQ(controller_.object_ids.size(), 2U + 2U + 3U);
  unreg_port_objects(controller_);
  EXPECT_TRUE(controller_.object_ids.empty());
}

TEST_F(ObjectsTest, unregistering_makes_room) {
  add_port(0, PORT_INPUT);
  for (int round = 0; round < 3; ++round) {
    legacy_register_objects(controller_);
    unreg_port_objects(controller_);
  }
}

TEST_F(ObjectsTest, unregistering_twice_is_told) {
  controller_.object_ids = {12345};
  testing::internal::CaptureStderr();
  unreg_port_objects(controller_);
  EXPECT_EQ(testing::internal::GetCapturedStderr(),
            "unreg_port_objects@627: Failed to unregister object\n");
}

TEST_F(ObjectsTest, object_that_is_there_already) {
  ASSERT_TRUE(iocontrol_conf_legacy_dbus_register_object(controller_, 3, LegacyInterface::kOutput));
  testing::internal::CaptureStderr();
  EXPECT_FALSE(
      iocontrol_conf_legacy_dbus_register_object(controller_, 3, LegacyInterface::kOutput));
  const std::string said = testing::internal::GetCapturedStderr();
  EXPECT_TRUE(said.starts_with("iocontrol_conf_legacy_dbus_register_object@487: Error: \""))
      << said;
  EXPECT_TRUE(said.ends_with("\" when registering DBUS object for port 3\n")) << said;
  unreg_port_objects(controller_);
}

TEST_F(ObjectsTest, method_call_gets_an_error_and_does_not_wait) {
  controller_.introspection = legacy_introspection_parse(
      "<node><interface name='com.kelv.Odd'><method name='Act'/></interface></node>");
  ASSERT_TRUE(iocontrol_conf_legacy_dbus_register_object(controller_, 0, LegacyInterface::kPort));
  constexpr int limit_ms = 10'000;
  Answer answer;
  g_dbus_connection_call(wire_.client(), nullptr, legacy_object_path(0).c_str(), "com.kelv.Odd",
                         "Act", nullptr, nullptr, G_DBUS_CALL_FLAGS_NONE, limit_ms, nullptr,
                         take_answer, &answer);
  while (!answer.done) {
    g_main_context_iteration(nullptr, TRUE);
  }
  EXPECT_TRUE(answer.error.matches(G_DBUS_ERROR, G_DBUS_ERROR_UNKNOWN_METHOD))
      << answer.error.message();
  unreg_port_objects(controller_);
}

using ObjectsDeathTest = ObjectsTest;

TEST_F(ObjectsDeathTest, registration_that_fails) {
  add_port(0, PORT_INPUT);
  ASSERT_TRUE(iocontrol_conf_legacy_dbus_register_object(controller_, 0, LegacyInterface::kInput));
  EXPECT_DEATH(legacy_register_objects(controller_), "Unable to register objects on DBus");
  unreg_port_objects(controller_);
}

TEST_F(ObjectsDeathTest, introspection_that_cannot_be_parsed) {
  EXPECT_DEATH(legacy_introspection_parse("<node><interface"),
               "Unable to register objects on DBus");
}

TEST_F(ObjectsDeathTest, no_bus) {
  EXPECT_DEATH(
      {
        g_setenv("DBUS_SYSTEM_BUS_ADDRESS", "unix:path=/nonexistent/bus", TRUE);
        iocontrol_conf_legacy_dbus_create();
      },
      "Failed to connect to system bus: ");
}

}  // namespace
