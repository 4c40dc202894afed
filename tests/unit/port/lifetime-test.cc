// How long a port lives, what drives it, and how it leaves service and comes back.
#include "port/ioport-private.h"
#include "support/fake-supervised.h"
#include "support/port-fixture.h"
#include "support/temp-dir.h"

namespace {

constexpr auto kUnknownKind = static_cast<BackendKind>(42);

class PortLifetime : public PortFixture {};
class PortBackend : public PortFixture {};
class DroppedPort : public PortFixture {};

TEST_F(PortLifetime, LastsUntilTheLastReferenceGoes) {
  IOPortRef port = PortBuilder().event(event_for_inputs("alarm")).build();
  io_port_ref(port.get());
  IOPortRef second(port.get());
  port.reset();
  EXPECT_EQ(listener.heard(), Lines{});
  EXPECT_EQ(io_port_get_number(second.get()), 1);
  second.reset();
  EXPECT_EQ(listener.heard(), Lines{"undeclare alarm"});
}

TEST_F(PortLifetime, OfNoPortIsNobodysConcern) {
  io_port_ref(nullptr);
  io_port_unref(nullptr);
}

TEST_F(PortLifetime, EndsQuietlyForAPortWithoutABackend) {
  const IOPortRef port(io_port_new());
  io_port_drop(port.get());
  EXPECT_EQ(io_port_backend_data(port.get()), nullptr);
}

// --- The backend of a port ---

TEST_F(PortBackend, IsChosenByItsKind) {
  const IOPortRef port(io_port_new());
  for (const BackendKind kind : {BACKEND_VIRTUAL, BACKEND_SYSFS, BACKEND_NULL, BACKEND_CHECK}) {
    io_port_set_backend(port.get(), kind);
    EXPECT_EQ(port->backend, kind);
    EXPECT_TRUE(io_port_has_backend(port.get())) << kind;
  }
}

TEST_F(PortBackend, OfAnUnknownKindIsNone) {
  for (const int number : {10, 42, -1, INT32_MAX, INT32_MIN}) {
    const IOPortRef port(io_port_new());
    const auto kind = static_cast<BackendKind>(number);
    io_port_set_backend(port.get(), kind);
    EXPECT_FALSE(io_port_has_backend(port.get())) << kind;
    EXPECT_EQ(port->backend, kind);
  }
}

TEST_F(PortBackend, ThatServesNothingReadsInactiveAndEnduresEveryRequest) {
  static constexpr PortFunctions nothing{};
  io_port_register_backend({"nothing", BACKEND_NULL, &nothing});
  const auto port = PortBuilder()
                        .backend(BACKEND_NULL)
                        .configurable_output()
                        .property("device", "path", "/dev/null")
                        .set_up();
  EXPECT_TRUE(io_port_is_set_up(port.get()));
  EXPECT_EQ(io_port_backend_data(port.get()), nullptr);
  EXPECT_TRUE(io_port_set_state(port.get(), true));
  EXPECT_FALSE(io_port_get_state(port.get()));
  EXPECT_TRUE(io_port_set_direction(port.get(), true));
  io_port_set_watch(port.get());
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, false));
  EXPECT_FALSE(io_port_set_supervised(port.get(), true));
  io_port_drop(port.get());
  EXPECT_TRUE(io_port_setup(port.get()));
  backends_register();
}

TEST_F(PortBackend, ThatIsChosenSecondReplacesTheRecordOfTheFirst) {
  const IOPortRef port(io_port_new());
  io_port_set_backend(port.get(), BACKEND_CHECK);
  io_port_set_backend_property(port.get(), "device", "setup", "fail");
  io_port_set_backend(port.get(), BACKEND_VIRTUAL);
  ASSERT_NE(io_port_backend_data(port.get()), nullptr);
  EXPECT_EQ(dynamic_cast<CheckBackendData *>(io_port_backend_data(port.get())), nullptr);
  EXPECT_TRUE(io_port_setup(port.get()));
}

TEST_F(PortBackend, ThatIsChosenSecondDoesNotGetThePropertiesOfTheFirst) {
  const IOPortRef port(io_port_new());
  io_port_set_backend(port.get(), BACKEND_SYSFS);
  io_port_set_backend_property(port.get(), "device", "setup", "fail");
  io_port_set_backend(port.get(), BACKEND_CHECK);
  EXPECT_TRUE(check_record(port).properties.empty());
  ASSERT_TRUE(io_port_setup(port.get()));
  io_port_drop(port.get());
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_TRUE(check_record(port).properties.empty());
}

TEST_F(PortBackend, ThatIsReplacedByNoneLeavesNoRecord) {
  const IOPortRef port(io_port_new());
  io_port_set_backend(port.get(), BACKEND_CHECK);
  io_port_set_backend(port.get(), kUnknownKind);
  EXPECT_FALSE(io_port_has_backend(port.get()));
  EXPECT_EQ(io_port_backend_data(port.get()), nullptr);
}

TEST_F(PortBackend, ThatIsChosenAgainKeepsItsRecord) {
  const IOPortRef port(io_port_new());
  io_port_set_backend(port.get(), BACKEND_CHECK);
  io_port_set_backend_property(port.get(), "section", "key", "value");
  io_port_set_backend(port.get(), BACKEND_CHECK);
  EXPECT_EQ(check_record(port).properties.size(), 1U);
}

TEST_F(PortBackend, IsToldItsPropertiesAsTheyCome) {
  const auto port = PortBuilder().property("s", "a", "1").property("t", "b", "2").build();
  const std::list<CheckProperty> newest_first = {{"t", "b", "2"}, {"s", "a", "1"}};
  EXPECT_EQ(check_record(port).properties, newest_first);
}

TEST_F(PortBackend, ThatIsMissingLosesItsPropertiesWithAWarning) {
  const IOPortRef port(io_port_new());
  io_port_set_id(port.get(), "relay1");
  io_port_set_backend_property(port.get(), "input", "pin", "3");
  EXPECT_TRUE(log.took_warning("Port relay1 has no backend: input pin is ignored"));
}

TEST_F(PortBackend, IsSetUpWithTheOutputsSenseAsItsLevel) {
  register_fake_supervised();
  const auto plain = PortBuilder().backend(kFakeSupervisedKind).output().set_up();
  EXPECT_EQ(fake_record(plain).calls, Lines{"setup low"});
  const auto inverted = PortBuilder().backend(kFakeSupervisedKind).output().activelow().set_up();
  EXPECT_EQ(fake_record(inverted).calls, Lines{"setup high"});
  backends_register();
}

TEST_F(PortBackend, ThatFailsLeavesThePortOutOfService) {
  const auto port = PortBuilder().output().property("any", "setup", "fail").build();
  EXPECT_FALSE(io_port_setup(port.get()));
  EXPECT_FALSE(io_port_is_set_up(port.get()));
  EXPECT_FALSE(check_record(port).setup_ok);
  EXPECT_FALSE(io_port_set_state(port.get(), true));
  EXPECT_TRUE(log.took_warning("Set state on incorrect port"));
}

// --- Dropping and coming back ---

TEST_F(DroppedPort, ReadsInactiveAndRefusesToBeDriven) {
  const auto port = PortBuilder().output().set_up();
  ASSERT_TRUE(io_port_set_state(port.get(), true));
  io_port_drop(port.get());
  EXPECT_FALSE(io_port_is_set_up(port.get()));
  EXPECT_FALSE(io_port_get_state(port.get()));
  EXPECT_FALSE(io_port_set_state(port.get(), false));
  EXPECT_TRUE(log.took_warning("Set state on incorrect port"));
  EXPECT_FALSE(io_port_is_busy(port.get()));
}

TEST_F(DroppedPort, HasNoEventsDeclared) {
  IoEvent siren;
  siren.name = "siren";
  const auto port = PortBuilder().output().event(siren).set_up();
  io_port_declare_events(port.get());
  listener.heard();
  io_port_drop(port.get());
  EXPECT_EQ(listener.heard(), Lines{"undeclare siren"});
}

TEST_F(DroppedPort, TakesSettingsWithoutTouchingItsBackend) {
  const auto port = PortBuilder().configurable_output().set_up();
  io_port_drop(port.get());
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, false));
  EXPECT_TRUE(io_port_set_direction(port.get(), true));
  EXPECT_TRUE(io_port_set_activelow(port.get(), true, true));
  EXPECT_TRUE(io_port_get_activelow(port.get(), false));
  EXPECT_TRUE(io_port_input(port.get()));
}

TEST_F(DroppedPort, MayBeDroppedAgain) {
  const auto port = PortBuilder().set_up();
  io_port_drop(port.get());
  io_port_drop(port.get());
  EXPECT_TRUE(io_port_setup(port.get()));
}

TEST_F(DroppedPort, ComesBackWithWhatTheDocumentSaidOfIt) {
  const auto port = PortBuilder().property("s", "a", "1").property("t", "b", "2").set_up();
  const auto before = check_record(port).properties;
  io_port_drop(port.get());
  ASSERT_TRUE(io_port_setup(port.get()));
  EXPECT_EQ(check_record(port).properties, before);
  EXPECT_TRUE(check_record(port).setup_ok);
  io_port_drop(port.get());
  ASSERT_TRUE(io_port_setup(port.get()));
  EXPECT_EQ(check_record(port).properties, before);
}

TEST_F(DroppedPort, ThatCouldNotBeSetUpFailsAgain) {
  const auto port = PortBuilder().property("any", "setup", "fail").build();
  EXPECT_FALSE(io_port_setup(port.get()));
  io_port_drop(port.get());
  EXPECT_FALSE(io_port_setup(port.get()));
}

TEST_F(DroppedPort, OfASysfsFileComesBackReadingTheFile) {
  const TempDir dir;
  const std::string file = dir.write("flag", "1\n");
  const auto port = PortBuilder()
                        .backend(BACKEND_SYSFS)
                        .property("device", "path", file.c_str())
                        .property("device", "timeout", "1000")
                        .set_up();
  io_port_set_watch(port.get());
  io_port_drop(port.get());
  EXPECT_EQ(g_main_context_find_source_by_user_data(nullptr, port.get()), nullptr);
  EXPECT_TRUE(io_port_setup(port.get()));
  io_port_set_watch(port.get());
  EXPECT_NE(g_main_context_find_source_by_user_data(nullptr, port.get()), nullptr);
}

TEST_F(DroppedPort, ThatIsVirtualComesBackInactive) {
  const auto port = PortBuilder().backend(BACKEND_VIRTUAL).output().set_up();
  io_port_set_virtual(port.get(), true);
  io_port_drop(port.get());
  EXPECT_FALSE(io_port_get_state(port.get()));
  ASSERT_TRUE(io_port_setup(port.get()));
  EXPECT_FALSE(io_port_get_state(port.get()));
  io_port_set_virtual(port.get(), true);
  EXPECT_TRUE(io_port_get_state(port.get()));
}

TEST_F(DroppedPort, ThatIsVirtualStoresNothing) {
  const auto port = PortBuilder().backend(BACKEND_VIRTUAL).output().set_up();
  io_port_drop(port.get());
  EXPECT_TRUE(io_port_set_virtual(port.get(), true));
  ASSERT_TRUE(io_port_setup(port.get()));
  EXPECT_FALSE(io_port_get_state(port.get()));
}

TEST_F(DroppedPort, IsNotWatched) {
  const auto port =
      PortBuilder().backend(BACKEND_SYSFS).property("device", "path", "/dev/null").set_up();
  io_port_drop(port.get());
  io_port_set_watch(port.get());
  EXPECT_EQ(g_main_context_find_source_by_user_data(nullptr, port.get()), nullptr);
}

TEST_F(DroppedPort, CanNotBeSupervised) {
  register_fake_supervised();
  const auto port = PortBuilder().backend(kFakeSupervisedKind).set_up();
  io_port_drop(port.get());
  EXPECT_FALSE(io_port_is_supervisable(port.get()));
  EXPECT_FALSE(io_port_set_supervised(port.get(), true));
  ASSERT_TRUE(io_port_setup(port.get()));
  EXPECT_TRUE(io_port_is_supervisable(port.get()));
  backends_register();
}

TEST_F(DroppedPort, TellsItsBackendWhatComesToIt) {
  const auto port = PortBuilder().set_up();
  io_port_drop(port.get());
  io_port_set_backend_property(port.get(), "section", "key", "value");
  ASSERT_TRUE(io_port_setup(port.get()));
  EXPECT_EQ(check_record(port).properties, (std::list<CheckProperty>{{"section", "key", "value"}}));
}

TEST_F(DroppedPort, CanBeGivenAnotherBackend) {
  const auto port = PortBuilder().set_up();
  io_port_drop(port.get());
  io_port_set_backend(port.get(), BACKEND_VIRTUAL);
  EXPECT_TRUE(io_port_setup(port.get()));
}

TEST_F(DroppedPort, IsFreedWithoutReleasingItsBackendTwice) {
  IOPortRef port = PortBuilder().set_up();
  io_port_drop(port.get());
  port.reset();
}

}  // namespace
