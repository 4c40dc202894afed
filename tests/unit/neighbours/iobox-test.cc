// Ports of an I/O box, as far as they need no bus: the record, the table, the signal.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "backends/iobox-backend.h"
#include "backends/iobox-calls.h"
#include "daemon/backends.h"
#include "port/ioport-private.h"
#include "port/port-listener.h"
#include "support/log-capture.h"

namespace {

constexpr int kNumber = 4;

std::vector<PortChange> changes;

void keep_change(const PortChange &change) {
  changes.push_back(change);
}

class IoBox : public testing::Test {
 protected:
  void SetUp() override {
    changes.clear();
    port_listener().port_changed = keep_change;
    backends_register();
    io_port_set_number(port(), kNumber);
    io_port_set_backend(port(), BACKEND_IOBOX);
    table_ = port()->functions;
  }
  void TearDown() override { port_listener() = {}; }

  IOPort *port() { return port_.get(); }
  IoBoxBackendData *data() { return static_cast<IoBoxBackendData *>(io_port_backend_data(port())); }
  // The raw level while the box reports `state`.
  std::uint32_t level_for(SupervisedRangeState state) {
    data()->connected = true;
    data()->state = state;
    return table_->get_state(port());
  }
  void signal(const char *name, GVariant *parameters) {
    const GVariantPtr owned(g_variant_ref_sink(parameters));
    iobox_handle_signal(port(), name, owned.get());
  }
  void state_changed(int number, const char *word) {
    signal("IOStateChanged", g_variant_new("(is)", number, word));
  }

  LogCapture log_;
  const IOPortRef port_{io_port_new()};
  const PortFunctions *table_ = nullptr;
};

TEST_F(IoBox, KnowsTheFourWordsForALineState) {
  EXPECT_EQ(iobox_state_to_portd_state("open"), SUPERVISED_STATE_OPEN);
  EXPECT_EQ(iobox_state_to_portd_state("closed"), SUPERVISED_STATE_CLOSED);
  EXPECT_EQ(iobox_state_to_portd_state("short"), SUPERVISED_STATE_SHORT);
  EXPECT_EQ(iobox_state_to_portd_state("cut"), SUPERVISED_STATE_CUT);
  EXPECT_TRUE(log_.empty());
}

TEST_F(IoBox, TakesAnyOtherWordForUndefinedAndSaysSo) {
  for (const char *word : {"", "Open", "undefined", "closed "}) {
    EXPECT_EQ(iobox_state_to_portd_state(word), SUPERVISED_STATE_UNDEFINED);
    EXPECT_TRUE(log_.took_warning(
        std::string("iobox_state_to_portd_state@67: Unrecognized iobox supervised state: ") +
        word));
    EXPECT_TRUE(log_.empty());
  }
}

TEST_F(IoBox, ReadsZeroWithoutAProxyWhateverTheStateIs) {
  data()->state = SUPERVISED_STATE_CLOSED;
  EXPECT_EQ(table_->get_state(port()), 0U);
}

TEST_F(IoBox, ReadsACutLineOfAPlainInputAsInactiveAndAShortedOneAsActive) {
  EXPECT_EQ(level_for(SUPERVISED_STATE_OPEN), 0U);
  EXPECT_EQ(level_for(SUPERVISED_STATE_CLOSED), 1U);
  EXPECT_EQ(level_for(SUPERVISED_STATE_SHORT), 1U);
  EXPECT_EQ(level_for(SUPERVISED_STATE_CUT), 0U);
  EXPECT_EQ(level_for(SUPERVISED_STATE_UNDEFINED), 4U);
}

TEST_F(IoBox, ReadsTheLineStateOfASupervisedInputAsItIs) {
  io_port_restore_supervised(port(), true);
  for (const auto state : {SUPERVISED_STATE_OPEN, SUPERVISED_STATE_CLOSED, SUPERVISED_STATE_SHORT,
                           SUPERVISED_STATE_CUT, SUPERVISED_STATE_UNDEFINED}) {
    EXPECT_EQ(level_for(state), static_cast<std::uint32_t>(state));
  }
}

TEST_F(IoBox, GivesTheStateAsReadoutWithoutALevel) {
  io_port_restore_supervised(port(), true);
  level_for(SUPERVISED_STATE_CUT);
  SupervisedRangeState state = SUPERVISED_STATE_OPEN;
  std::uint32_t level = 99;
  EXPECT_TRUE(io_port_get_supervised_readout(port(), &state, &level, nullptr));
  EXPECT_EQ(state, SUPERVISED_STATE_CUT);
  EXPECT_EQ(level, 0U);
}

TEST_F(IoBox, IsSupervisableAndKeepsItsRangesWhileOutOfService) {
  const SupervisedRanges ranges = {{SUPERVISED_STATE_CUT, 20, 10}, {SUPERVISED_STATE_OPEN, 5, 1}};
  EXPECT_TRUE(io_port_is_supervisable(port()));
  EXPECT_TRUE(io_port_set_supervised_ranges(port(), ranges, nullptr));
  io_port_drop(port());
  EXPECT_EQ(io_port_range_list(port()), ranges);
}

TEST_F(IoBox, TakesAnEmptyListOfRanges) {
  EXPECT_TRUE(io_port_set_supervised_ranges(port(), {{SUPERVISED_STATE_CUT, 2, 1}}, nullptr));
  EXPECT_TRUE(io_port_set_supervised_ranges(port(), {}, nullptr));
  SupervisedRanges kept;
  EXPECT_TRUE(io_port_get_supervised_ranges(port(), &kept));
  EXPECT_TRUE(kept.empty());
}

TEST_F(IoBox, RemembersWhatAnOutputWasSetToWhenTheServiceIsOutOfReach) {
  table_->set_state(port(), 1);
  EXPECT_EQ(data()->state, 1);
  EXPECT_EQ(data()->output_value, 1);
  table_->set_state(port(), -3);
  EXPECT_EQ(data()->state, 0);
  EXPECT_EQ(data()->output_value, -3);
}

TEST_F(IoBox, WithoutABusIsNotSetUpAndItsEventsAreOff) {
  data()->connected = true;
  g_setenv("DBUS_SYSTEM_BUS_ADDRESS", "unix:path=/nonexistent", TRUE);
  EXPECT_FALSE(io_port_setup(port()));
  EXPECT_TRUE(log_.took(G_LOG_LEVEL_MESSAGE,
                        "iobox_port_setup@168: Proxy for com.kelv.IOBoxMonitor not available"));
  EXPECT_TRUE(log_.empty());
  EXPECT_FALSE(data()->connected);
  EXPECT_FALSE(io_port_events_enabled(port()));
}

TEST_F(IoBox, FollowsTheSignalBeforeTheWatchButReportsNothing) {
  state_changed(kNumber, "closed");
  EXPECT_EQ(data()->state, SUPERVISED_STATE_CLOSED);
  EXPECT_TRUE(changes.empty());
}

TEST_F(IoBox, ReportsEachChangeOnceWhileWatched) {
  table_->start_watch(port());
  table_->start_watch(port());
  state_changed(kNumber, "closed");
  state_changed(kNumber, "closed");
  state_changed(kNumber, "cut");
  ASSERT_EQ(changes.size(), 2U);
  EXPECT_EQ(changes.front().number, kNumber);
}

TEST_F(IoBox, IgnoresOtherPortsOtherSignalsAndMalformedOnes) {
  table_->start_watch(port());
  state_changed(kNumber + 1, "closed");
  state_changed(-1, "closed");
  signal("IOBoxChanged", g_variant_new("(is)", kNumber, "closed"));
  signal("IOStateChanged", g_variant_new("(ss)", "4", "closed"));
  signal("IOStateChanged", g_variant_new("(us)", guint32{kNumber}, "closed"));
  signal("IOStateChanged", g_variant_new("(iss)", kNumber, "closed", "more"));
  signal("IOStateChanged", g_variant_new("(iv)", kNumber, g_variant_new_string("closed")));
  signal("IOStateChanged", g_variant_new("()"));
  EXPECT_EQ(data()->state, SUPERVISED_STATE_OPEN);
  EXPECT_TRUE(changes.empty());
  EXPECT_TRUE(log_.empty());
}

}  // namespace
