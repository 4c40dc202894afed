// What the port layer may expect of every backend. A backend is put under the contract with one
// line in kBackends.
#include <algorithm>
#include <string>
#include <vector>

#include "backends/tables.h"
#include "support/port-fixture.h"

namespace {

enum class Serves { plain, supervised };

struct BackendUnderTest {
  const char *word;  // in the hardware description
  MakePortFunctions make;
  int kind;
  Serves serves = Serves::plain;
  PortType type = PORT_CONFIGURABLE;  // that it can be set up as
  bool sets_up = true;                // on a host without the device's hardware
  // What it must be told before it can be set up.
  std::vector<CheckProperty> properties = {};
};

const std::vector<CheckProperty> kReadableFile = {{"device", "path", "/dev/null"},
                                                  {"device", "timeout", "1"}};

const BackendUnderTest kBackends[] = {
    {"virtual", virtual_backend_functions, 0},
    {"sysfs", sysfs_backend_functions, 6, Serves::plain, PORT_INPUT, true, kReadableFile},
    {"null", null_backend_functions, 8},
    {"check", check_backend_functions, 9},
};

// Printed by GoogleTest in place of the bytes of the struct.
void PrintTo(const BackendUnderTest &backend,  // NOLINT(readability-identifier-naming)
             std::ostream *out) {
  *out << backend.word;
}

class Backend : public PortFixture, public testing::WithParamInterface<BackendUnderTest> {
 protected:
  ~Backend() override { log.forget(); }  // what a backend says of odd orders is its own affair

  static IOPortRef described() {
    PortBuilder builder;
    builder.backend(GetParam().kind);
    for (const auto &property : GetParam().properties) {
      builder.property(property.section.c_str(), property.key.c_str(), property.value.c_str());
    }
    auto port = builder.build();
    io_port_set_type(port.get(), GetParam().type);
    return port;
  }
  static const PortFunctions &table() {
    const IOPortRef port(io_port_new());
    const PortFunctions *functions = GetParam().make(port.get());
    io_port_set_backend_data(port.get(), nullptr);
    return *functions;
  }
  static bool is_watched(const IOPort *port) {
    return g_main_context_find_source_by_user_data(nullptr, const_cast<IOPort *>(port)) != nullptr;
  }
};

// GoogleTest takes letters, digits and underscores.
std::string word_of(const testing::TestParamInfo<BackendUnderTest> &backend) {
  std::string word = backend.param.word;
  std::replace(word.begin(), word.end(), '-', '_');
  return word;
}

INSTANTIATE_TEST_SUITE_P(Every, Backend, testing::ValuesIn(kBackends), word_of);

// --- The table ---

TEST_P(Backend, IsKnownByItsWordAndKind) {
  EXPECT_EQ(io_port_backend_kind(GetParam().word), GetParam().kind);
  const auto port = described();
  EXPECT_TRUE(io_port_has_backend(port.get()));
  EXPECT_EQ(io_port_get_backend(port.get()), GetParam().kind);
}

TEST_P(Backend, ServesWhatEveryPortNeeds) {
  EXPECT_NE(table().setup, nullptr);
  EXPECT_NE(table().get_state, nullptr);
  EXPECT_NE(table().set_state, nullptr);
  EXPECT_NE(table().start_watch, nullptr);
  EXPECT_NE(table().set_direction, nullptr);
  EXPECT_NE(table().set_property, nullptr);
  EXPECT_NE(table().free, nullptr);
}

TEST_P(Backend, OffersSupervisionOnlyWhereItHasIt) {
  const bool offers = GetParam().serves == Serves::supervised;
  EXPECT_EQ(table().is_supervisable != nullptr, offers);
  EXPECT_EQ(table().set_supervised != nullptr, offers);
  EXPECT_EQ(table().get_supervised_ranges != nullptr, offers);
  EXPECT_EQ(table().set_supervised_ranges != nullptr, offers);
  EXPECT_EQ(table().get_supervised_readout != nullptr, offers);
  if (!offers) {
    EXPECT_EQ(table().drop, nullptr);
  }
}

TEST_P(Backend, HasOneTableForAllItsPorts) {
  EXPECT_EQ(&table(), &table());
}

TEST_P(Backend, GivesEachPortARecordOfItsOwnOnce) {
  const auto one = described();
  const auto two = described();
  const PortBackendData *record = io_port_backend_data(one.get());
  if (record) {
    EXPECT_NE(record, io_port_backend_data(two.get()));
  }
  GetParam().make(one.get());
  EXPECT_EQ(io_port_backend_data(one.get()), record);
}

// --- A port that nothing was told about ---

TEST_P(Backend, ReadsInactiveBeforeSetUp) {
  const auto port = PortBuilder().backend(GetParam().kind).build();
  EXPECT_FALSE(io_port_get_state(port.get()));
}

TEST_P(Backend, EnduresEveryRequestOnFreshData) {
  const auto port = PortBuilder().backend(GetParam().kind).build();
  (void)table().get_state(port.get());
  table().set_state(port.get(), 1);
  table().set_state(port.get(), 0);
  table().set_direction(port.get(), true);
  table().set_direction(port.get(), false);
  table().start_watch(port.get());
}

TEST_P(Backend, CanBeFreedFresh) {
  auto port = PortBuilder().backend(GetParam().kind).build();
  port.reset();
}

TEST_P(Backend, EnduresASetUpThatWasToldNothing) {
  for (const PortType type : {PORT_INPUT, PORT_OUTPUT, PORT_CONFIGURABLE}) {
    const auto port = PortBuilder().backend(GetParam().kind).build();
    io_port_set_type(port.get(), type);
    (void)io_port_setup(port.get());
    (void)io_port_get_state(port.get());
    io_port_set_watch(port.get());
  }
}

TEST_P(Backend, EnduresAttributesThatItDoesNotKnow) {
  const auto port = described();
  for (const char *section : {"", "backend", "device", "input", "no-such-section"}) {
    for (const char *value : {"", "-1", "true", "99999999999999999999", "\xC3\xA5"}) {
      io_port_set_backend_property(port.get(), section, "no-such-key", value);
      io_port_set_backend_property(port.get(), section, "", value);
    }
  }
  EXPECT_EQ(io_port_setup(port.get()), GetParam().sets_up);
}

TEST_P(Backend, EnduresAttributesAfterSetUp) {
  const auto port = described();
  (void)io_port_setup(port.get());
  for (const auto &property : GetParam().properties) {
    io_port_set_backend_property(port.get(), property.section.c_str(), property.key.c_str(),
                                 property.value.c_str());
  }
  (void)io_port_get_state(port.get());
}

// --- In service ---

TEST_P(Backend, SetsUpAndCanBeSetUpAgain) {
  const auto port = described();
  EXPECT_EQ(io_port_setup(port.get()), GetParam().sets_up);
  EXPECT_EQ(io_port_setup(port.get()), GetParam().sets_up);
  EXPECT_EQ(io_port_is_set_up(port.get()), GetParam().sets_up);
}

TEST_P(Backend, ServesAPortFromSetUpToItsEnd) {
  const auto port = described();
  (void)io_port_setup(port.get());
  io_port_set_watch(port.get());
  EXPECT_FALSE(io_port_get_state(port.get()));
  if (GetParam().type == PORT_CONFIGURABLE) {
    EXPECT_TRUE(io_port_set_direction(port.get(), false));
    (void)io_port_set_state(port.get(), true);
    EXPECT_TRUE(io_port_set_activelow(port.get(), true, false));
    EXPECT_TRUE(io_port_set_direction(port.get(), true));
  }
}

TEST_P(Backend, WatchesAPortOnceHoweverOftenItIsArmed) {
  auto port = described();
  (void)io_port_setup(port.get());
  io_port_set_watch(port.get());
  io_port_set_watch(port.get());
  io_port_set_watch(port.get());
  const IOPort *gone = port.get();
  port.reset();
  EXPECT_FALSE(is_watched(gone));
}

TEST_P(Backend, EndsItsWatchWhenThePortIsDropped) {
  const auto port = described();
  (void)io_port_setup(port.get());
  io_port_set_watch(port.get());
  io_port_drop(port.get());
  EXPECT_FALSE(is_watched(port.get()));
  g_main_context_iteration(nullptr, FALSE);
}

TEST_P(Backend, BringsADroppedPortBack) {
  const auto port = described();
  for (int i = 0; i < 3; ++i) {
    EXPECT_EQ(io_port_setup(port.get()), GetParam().sets_up);
    io_port_set_watch(port.get());
    io_port_drop(port.get());
    io_port_drop(port.get());
    EXPECT_FALSE(io_port_get_state(port.get()));
  }
  EXPECT_EQ(io_port_setup(port.get()), GetParam().sets_up);
}

TEST_P(Backend, FreesADroppedPortOnce) {
  auto port = described();
  (void)io_port_setup(port.get());
  io_port_drop(port.get());
  port.reset();
}

TEST_P(Backend, MakesWayForAnotherAndTakesThePortBack) {
  const auto port = described();
  (void)io_port_setup(port.get());
  io_port_set_watch(port.get());
  const int other = GetParam().kind == kCheckKind ? kVirtualKind : kCheckKind;
  io_port_set_backend(port.get(), other);
  EXPECT_FALSE(is_watched(port.get()));
  EXPECT_TRUE(io_port_setup(port.get()));
  io_port_set_backend(port.get(), GetParam().kind);
  (void)table().get_state(port.get());
}

}  // namespace
