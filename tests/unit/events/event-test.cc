// What the events of a port tell the event library.
#include "events/event.h"

#include <gtest/gtest.h>

#include "daemon/backends.h"
#include "events/event-values.h"
#include "events/fake-event-library.h"
#include "port/port-listener.h"
#include "port/port-registry.h"
#include "support/fake-supervised.h"
#include "support/log-capture.h"
#include "support/port-builder.h"

namespace {

constexpr const char *kSupervisedEvent = "com.kelv.Event.Pcd.SupervisedPort";

IoEvent named(const char *name) {
  IoEvent event;
  event.name = name;
  return event;
}

IoEvent supervised_event() {
  IoEvent event = named(kSupervisedEvent);
  event.input = false;
  event.output = false;
  event.supervised_input = true;
  return event;
}

IoEventKey key(const char *name, const char *value, const char *type) {
  IoEventKey key;
  key.name = name;
  key.value = value;
  key.type = type;
  return key;
}

IoEventKey property_key(const char *name, const char *value, const char *type) {
  IoEventKey property = key(name, value, type);
  property.property = true;
  return property;
}

class Events : public testing::Test {
 protected:
  Events() {
    fake_event_library() = {};
    backends_register();
    register_fake_supervised();
    io_events_start();
  }
  ~Events() override {
    port_registry_drop_all();
    io_events_stop();
    port_listener() = {};
    EXPECT_EQ(library.producers, 0);
  }

  static IoEvent &first_event(const IOPortRef &port) { return io_port_events(port.get()).front(); }
  // A port whose first event is declared already.
  static IOPortRef declared(PortBuilder &builder) {
    IOPortRef port = builder.set_up_and_registered();
    io_port_declare_events(port.get());
    fake_event_library().take_calls();
    return port;
  }

  FakeEventLibrary &library = fake_event_library();
  LogCapture log;
};

TEST_F(Events, ThePortEventIsDeclaredWithAllThatDescribesIt) {
  const auto port = PortBuilder().number(3).names("Gate", "").event(named("IOPort")).set_up();
  EXPECT_TRUE(io_event_declare(port.get(), &first_event(port)));
  const FakeDeclaration &declaration = library.declared.at(1);
  EXPECT_EQ(declaration.type, "");
  const std::map<std::string, std::string> keys = {{"port", "int 3"},
                                                   {"state", "bool"},
                                                   {"topic0", "string Device"},
                                                   {"topic1", "string IO"},
                                                   {"topic2", "string Port"}};
  EXPECT_EQ(declaration.keys, keys);
  const std::map<std::string, std::string> names = {{"port", "Port|Gate"},
                                                    {"state", "Active|"},
                                                    {"topic1", "|Input ports"},
                                                    {"topic2", "|Digital input port"}};
  EXPECT_EQ(declaration.nice_names, names);
  const std::map<std::string, std::string> spaces = {
      {"topic0", "tns1"}, {"topic1", "tnskelv"}, {"topic2", "tnskelv"}};
  EXPECT_EQ(declaration.namespaces, spaces);
  const std::map<std::string, std::string> tags = {{"port", "onvif-source"},
                                                   {"state", "onvif-data"}};
  EXPECT_EQ(declaration.tags, tags);
  EXPECT_EQ(declaration.property, "state");
}

TEST_F(Events, ThePropertyOfThePortEventIsThePortsLogicalState) {
  PortBuilder builder;
  const auto port = declared(builder.number(3).event(named("IOPort")));
  EXPECT_EQ(library.read(1, "state"), "bool 0");
  io_port_set_activelow(port.get(), true, true);
  EXPECT_EQ(library.read(1, "state"), "bool 1");
}

TEST_F(Events, ThePropertyOfAPortThatIsGoneIsLeftAlone) {
  PortBuilder builder;
  const auto port = declared(builder.number(3).id("gone").event(named("IOPort")));
  port_registry_remove_by_id("gone");
  EXPECT_EQ(library.read(1, "state"), "");
}

TEST_F(Events, ADeclaredEventIsNotDeclaredAgain) {
  PortBuilder builder;
  const auto port = declared(builder.event(named("IOPort")));
  io_event_declare(port.get(), &first_event(port));
  EXPECT_EQ(library.take_calls(), FakeLines{});
}

TEST_F(Events, AnEventThatDoesNotApplyIsNotDeclared) {
  const auto port = PortBuilder().output().event(event_for_inputs("IOPort")).set_up();
  EXPECT_TRUE(io_event_declare(port.get(), &first_event(port)));
  EXPECT_EQ(library.take_calls(), FakeLines{});
}

TEST_F(Events, PortsShareTheAnyPortDeclarationAndUndeclaringKeepsIt) {
  const auto first = PortBuilder().event(named("PortAny")).set_up();
  const auto second = PortBuilder().number(2).event(named("PortAny")).set_up();
  io_event_declare(first.get(), &first_event(first));
  io_event_declare(second.get(), &first_event(second));
  io_event_undeclare(&first_event(first));
  io_event_undeclare(&first_event(second));
  io_event_redeclare(first.get(), &first_event(first));
  EXPECT_EQ(library.take_calls(), FakeLines{"declare 1"});
  EXPECT_EQ(library.declared.at(1).keys.at("port"), "int -1");
  EXPECT_EQ(library.declared.at(1).nice_names.at("port"), "Port|Any");
  EXPECT_EQ(first_event(first).id, first_event(second).id);
}

TEST_F(Events, TheAnyPortPropertyIsActiveWhileAnyPortIs) {
  PortBuilder one;
  PortBuilder two;
  const auto first = declared(one.number(1).event(named("PortAny")));
  const auto second = declared(two.number(2).event(named("PortAny")));
  EXPECT_EQ(library.read(1, "state"), "bool 0");
  io_port_set_activelow(second.get(), true, true);
  EXPECT_EQ(library.read(1, "state"), "bool 1");
}

TEST_F(Events, TheSupervisedEventTellsStateAndTampering) {
  PortBuilder builder;
  const auto port = builder.backend(kFakeSupervisedKind).event(supervised_event()).set_up();
  io_port_restore_supervised(port.get(), true);
  port_registry_add(port.get());
  io_event_declare(port.get(), &first_event(port));
  EXPECT_EQ(library.declared.at(1).property, "tampered");
  EXPECT_EQ(library.declared.at(1).keys.at("topic2"), "string SupervisedPort");
  library.take_calls();
  const std::pair<SupervisedRangeState, const char *> lines[] = {
      {SUPERVISED_STATE_OPEN, "send 1 state=string open tampered=bool 0"},
      {SUPERVISED_STATE_CLOSED, "send 1 state=string closed tampered=bool 0"},
      {SUPERVISED_STATE_SHORT, "send 1 state=string short tampered=bool 1"},
      {SUPERVISED_STATE_CUT, "send 1 state=string cut tampered=bool 1"},
      {SUPERVISED_STATE_UNDEFINED, "send 1 state=string undefined tampered=bool 0"}};
  for (const auto &[state, line] : lines) {
    fake_record(port).line = state;
    EXPECT_TRUE(io_event_send(port.get(), &first_event(port), 0));
    EXPECT_EQ(library.take_calls(), FakeLines{line});
  }
  fake_record(port).line = SUPERVISED_STATE_CUT;
  EXPECT_EQ(library.read(1, "state"), "string cut");
  EXPECT_EQ(library.read(1, "tampered"), "bool 1");
}

TEST_F(Events, ASupervisedEventSaysTheSameStateOnceUntilItsFilterIsReset) {
  IoEvent event = named("IOPort");
  event.supervised_input = true;
  PortBuilder builder;
  const auto port = declared(builder.event(event));
  EXPECT_TRUE(io_event_send(port.get(), &first_event(port), 1));
  EXPECT_FALSE(io_event_send(port.get(), &first_event(port), 1));
  EXPECT_TRUE(io_event_send(port.get(), &first_event(port), 0));
  EXPECT_FALSE(io_event_send(port.get(), &first_event(port), 0));
  io_event_reset_filter(&first_event(port));
  EXPECT_TRUE(io_event_send(port.get(), &first_event(port), 0));
  EXPECT_FALSE(io_event_send(port.get(), &first_event(port), 0));
}

TEST_F(Events, DeclaringAnewResetsTheRepeatFilter) {
  IoEvent event = named("IOPort");
  event.supervised_input = true;
  PortBuilder builder;
  const auto port = declared(builder.event(event));
  EXPECT_TRUE(io_event_send(port.get(), &first_event(port), 1));
  io_event_declare(port.get(), &first_event(port));
  EXPECT_TRUE(io_event_send(port.get(), &first_event(port), 1));
}

TEST_F(Events, AnOrdinaryEventMayRepeatItself) {
  PortBuilder builder;
  const auto port = declared(builder.event(named("IOPort")));
  EXPECT_TRUE(io_event_send(port.get(), &first_event(port), 1));
  EXPECT_TRUE(io_event_send(port.get(), &first_event(port), 1));
}

TEST_F(Events, AnEventThatIsNotDeclaredIsNotSent) {
  const auto port = PortBuilder().event(named("IOPort")).set_up();
  EXPECT_FALSE(io_event_send(port.get(), &first_event(port), 1));
}

TEST_F(Events, AnEventThatIsOnlyDeclaredIsNeverSentNotEvenItsFirstState) {
  IoEvent event = named("type");
  event.declare_only = true;
  event.keys.push_front(property_key("v", "PORT_STATUS", "bool"));
  const auto port = PortBuilder().event(event).set_up();
  io_event_declare(port.get(), &first_event(port));
  EXPECT_EQ(library.take_calls(), FakeLines{"declare 1"});
  EXPECT_FALSE(io_event_send(port.get(), &first_event(port), 1));
}

TEST_F(Events, ADescribedPropertySendsItsFirstStateAtOnce) {
  IoEvent event = named("type");
  event.keys.push_front(key("door", "7", "int"));
  event.keys.push_front(property_key("v", "PORT_STATUS", "bool"));
  const auto port = PortBuilder().event(event).set_up();
  io_event_declare(port.get(), &first_event(port));
  EXPECT_EQ(library.take_calls(), (FakeLines{"declare 1", "send 1 v=bool 0"}));
  EXPECT_EQ(library.declared.at(1).property, "v");
  EXPECT_EQ(library.declared.at(1).keys, (std::map<std::string, std::string>{{"door", "int 7"}}));
}

TEST_F(Events, ADescribedEventWithoutPropertySendsNothingWhenItIsDeclared) {
  IoEvent event = named("type");
  event.keys.push_front(key("door", "7", "int"));
  const auto port = PortBuilder().event(event).set_up();
  io_event_declare(port.get(), &first_event(port));
  EXPECT_EQ(library.take_calls(), FakeLines{"declare 1"});
}

TEST_F(Events, TheLastPropertyKeyInTheListBecomesTheProperty) {
  IoEvent event = named("type");
  event.declare_only = true;
  event.keys.push_back(property_key("first", "PORT_STATUS", "bool"));
  event.keys.push_back(property_key("last", "PORT_STATUS", "bool"));
  const auto port = PortBuilder().event(event).set_up();
  io_event_declare(port.get(), &first_event(port));
  EXPECT_EQ(library.declared.at(1).property, "last");
}

TEST_F(Events, FailuresToDeclareAreLoggedAndLeaveTheEventUndeclared) {
  IoEvent event = named("type");
  event.keys.push_front(key("k", "7", "int"));
  event.keys.push_front(property_key("p", "PORT_STATUS", "bool"));
  const auto port = PortBuilder().number(4).event(event).set_up();
  const auto declare = [&] { return io_event_declare(port.get(), &first_event(port)); };

  library.refused_type = "type";
  EXPECT_TRUE(declare());
  EXPECT_TRUE(log.took_warning("Failed to create event declaration: type for port 4"));
  library.refused_type.clear();

  library.refused_key = "k";
  EXPECT_TRUE(declare());
  EXPECT_TRUE(log.took_warning("populating event key value failed - Key: k Val: 7 Type: int"));
  EXPECT_TRUE(log.took_warning("Failed to populate event declaration!"));
  library.refused_key.clear();

  library.refuses_property = true;
  EXPECT_TRUE(declare());
  EXPECT_TRUE(log.took_warning("Failed to set event property: p"));
  library.refuses_property = false;

  library.refuses_declarations = true;
  EXPECT_TRUE(declare());
  EXPECT_TRUE(log.took_warning("Failed to declare event type for port 4"));
  EXPECT_EQ(first_event(port).id, 0U);
  EXPECT_EQ(library.take_calls(), FakeLines{});
}

TEST_F(Events, AFirstStateThatCantBeSentIsLogged) {
  IoEvent event = named("type");
  event.keys.push_front(property_key("p", "PORT_STATUS", "bool"));
  const auto port = PortBuilder().number(4).event(event).set_up();
  library.send_error = "no";
  io_event_declare(port.get(), &first_event(port));
  EXPECT_TRUE(log.took_warning("Failed to send initial state of event type for port 4"));
  EXPECT_NE(first_event(port).id, 0U);
}

TEST_F(Events, FailuresToSendAreLogged) {
  IoEvent event = named("type");
  event.keys.push_front(property_key("p", "PORT_STATUS", "bool"));
  PortBuilder builder;
  const auto port = declared(builder.event(event));

  library.send_error = "the bus is full";
  EXPECT_FALSE(io_event_send(port.get(), &first_event(port), 1));
  EXPECT_TRUE(log.took_warning("Error sending event: the bus is full"));
  library.send_error = nullptr;

  library.refuses_events = true;
  EXPECT_FALSE(io_event_send(port.get(), &first_event(port), 1));
  EXPECT_TRUE(log.took_warning("Failed to prepare event: type id: 1"));
  library.refuses_events = false;

  library.refused_key = "p";
  EXPECT_FALSE(io_event_send(port.get(), &first_event(port), 1));
  EXPECT_TRUE(log.took_warning("populating event key value failed - Key: p Val: 0 Type: bool"));
  EXPECT_TRUE(log.took_warning("Failed to populate event values"));
}

TEST_F(Events, ANewNameIsDeclaredAnew) {
  PortBuilder builder;
  const auto port = declared(builder.event(named("IOPort")));
  io_port_set_input_name(port.get(), "New");
  EXPECT_EQ(library.take_calls(), (FakeLines{"undeclare 1", "declare 2"}));
  EXPECT_EQ(library.declared.at(2).nice_names.at("port"), "Port|New");
}

TEST_F(Events, ANewNameOfAPortWhoseEventsAreOffDeclaresNothing) {
  PortBuilder builder;
  const auto port = declared(builder.event(named("IOPort")));
  io_port_set_events_enabled(port.get(), false);
  EXPECT_EQ(library.take_calls(), FakeLines{"undeclare 1"});
  io_port_set_input_name(port.get(), "New");
  EXPECT_EQ(library.take_calls(), FakeLines{});
  io_port_set_events_enabled(port.get(), true);
  EXPECT_EQ(library.take_calls(), FakeLines{"declare 2"});
}

TEST_F(Events, AFreedPortWithdrawsItsEvents) {
  PortBuilder builder;
  declared(builder.id("gone").event(named("IOPort")));
  EXPECT_EQ(library.declared.size(), 1U);
  port_registry_remove_by_id("gone");
  EXPECT_EQ(library.declared.size(), 0U);
}

// --- Values ---

class EventValues : public Events {
 protected:
  // What a key of that word and type gets on a port, as "TYPE VALUE".
  std::string value_of(const IOPortRef &port, const char *word, const char *type) {
    IoEvent event = named("type");
    event.keys.push_front(key("k", word, type));
    EXPECT_TRUE(event_keys_are_valid(port.get(), event.keys));
    const auto declaration = event_declaration_new();
    std::string property;
    EXPECT_TRUE(populate_event_values(
        port.get(), event.keys, event_declaration_get_inspectable(declaration), false, &property));
    const guint32 id = event_producer_declare(nullptr, declaration);
    event_declaration_free(declaration);
    return library.declared.at(id).keys.at("k");
  }
};

TEST_F(EventValues, OfAPortStateTakeTheFormOfTheirType) {
  const auto off = PortBuilder().set_up();
  const auto on = PortBuilder().activelow().set_up();
  EXPECT_EQ(value_of(off, "PORT_STATUS", "int"), "int 0");
  EXPECT_EQ(value_of(on, "PORT_STATUS", "bool"), "bool 1");
  EXPECT_EQ(value_of(off, "PORT_STATUS", "string"), "string false");
  EXPECT_EQ(value_of(on, "PORT_STATUS", "string"), "string true");
  EXPECT_EQ(value_of(off, "PORT_ACTIVE", "string"), "string inactive");
  EXPECT_EQ(value_of(on, "PORT_ACTIVE", "string"), "string active");
  EXPECT_EQ(value_of(on, "PORT_ACTIVE", "int"), "int 1");
}

TEST_F(EventValues, OfALineStateTakeTheFormOfTheirType) {
  const auto port = PortBuilder().backend(kFakeSupervisedKind).set_up();
  fake_record(port).line = SUPERVISED_STATE_CUT;
  EXPECT_EQ(value_of(port, "PORT_SUPERVISED_STATUS", "int"), "int 3");
  EXPECT_EQ(value_of(port, "PORT_SUPERVISED_STATUS", "string"), "string cut");
  EXPECT_EQ(value_of(port, "PORT_SUPERVISED_STATUS", "bool"), "bool 0");
  fake_record(port).line = SUPERVISED_STATE_CLOSED;
  EXPECT_EQ(value_of(port, "PORT_SUPERVISED_STATUS", "bool"), "bool 1");
}

TEST_F(EventValues, OfLiteralsAreTakenAsTheyStandButForBooleans) {
  const auto port = PortBuilder().set_up();
  EXPECT_EQ(value_of(port, "yes", "bool"), "bool 0");
  EXPECT_EQ(value_of(port, "true", "bool"), "bool 1");
  EXPECT_EQ(value_of(port, "1", "bool"), "bool 1");
  EXPECT_EQ(value_of(port, "True", "bool"), "bool 0");
  EXPECT_EQ(value_of(port, "12", "int"), "int 12");
  EXPECT_EQ(value_of(port, "0.5", "double"), "double 0.5");
  EXPECT_EQ(value_of(port, "any text", "string"), "string any text");
}

TEST_F(EventValues, NiceNamesMayStandForThePortsName) {
  IoEvent event = named("type");
  event.keys.push_front(key("k", "1", "int"));
  event.keys.front().key_nice_name = "PORT_NAME";
  event.keys.front().value_nice_name = "Value";
  const auto port = PortBuilder().names("Gate", "").event(event).set_up();
  io_event_declare(port.get(), &first_event(port));
  EXPECT_EQ(library.declared.at(1).nice_names.at("k"), "Gate|Value");
}

TEST_F(EventValues, ARefusedNiceNameIsLoggedWithBothNames) {
  IoEvent event = named("type");
  event.keys.push_front(key("k", "1", "int"));
  event.keys.front().key_nice_name = "Key name";
  event.keys.front().value_nice_name = "Value name";
  const auto port = PortBuilder().event(event).set_up();
  library.refused_key = "k";
  io_event_declare(port.get(), &first_event(port));
  EXPECT_TRUE(log.took_warning(
      "Failed to set value nice name. Key: Key name KNN: Key name VNN: Value name"));
  EXPECT_TRUE(log.took_warning("Failed to populate event declaration!"));
}

TEST_F(EventValues, AKeyThatIsOfNoUseCostsTheEventAndNotTheDaemon) {
  const IoEventKey bad[] = {key("k", "PORT_STATUS", "double"), key("k", "1", "float"),
                            property_key("k", "PORT_ACTIVE", "double"), IoEventKey{}};
  for (const auto &bad_key : bad) {
    IoEvent event = named("type");
    event.keys.push_front(bad_key);
    const auto port = PortBuilder().event(event).set_up();
    EXPECT_TRUE(io_event_declare(port.get(), &first_event(port)));
    EXPECT_EQ(first_event(port).id, 0U);
    log.forget();
  }
}

class EventValuesDeathTest : public EventValues {
 protected:
  // Declares an event that has this key.
  static void declare(const IoEventKey &key) {
    const auto port = PortBuilder().set_up();
    const auto declaration = event_declaration_new();
    std::string property;
    populate_event_values(port.get(), {key}, event_declaration_get_inspectable(declaration), false,
                          &property);
    event_declaration_free(declaration);
  }
};

TEST_F(EventValuesDeathTest, PopulatingADoubleWithAStateIsAProgrammingError) {
  EXPECT_DEATH(declare(key("k", "PORT_STATUS", "double")), "populate_port_status");
}

TEST_F(EventValuesDeathTest, AnUnknownKeyTypeIsAProgrammingError) {
  EXPECT_DEATH(declare(key("k", "1", "float")), "populate_event_values");
}

}  // namespace
