// Programming errors end the daemon and name the expression that failed. Few: each test forks.
#include "support/fake-supervised.h"
#include "support/port-fixture.h"

namespace {

class ProgrammingErrorDeathTest : public PortFixture {};

TEST_F(ProgrammingErrorDeathTest, NoPortAtAll) {
  EXPECT_DEATH(io_port_setup(nullptr), "assertion failed: \\(port != NULL\\)");
  EXPECT_DEATH(io_port_get_state(nullptr), "assertion failed: \\(ioport\\)");
  EXPECT_DEATH(io_port_is_supervisable(nullptr), "'port' should not be NULL");
}

TEST_F(ProgrammingErrorDeathTest, NoBackend) {
  const IOPortRef port(io_port_new());
  EXPECT_DEATH(io_port_setup(port.get()), "assertion failed: \\(port->functions != NULL\\)");
  EXPECT_DEATH(io_port_input(port.get()), "'port->functions' should not be NULL");
  EXPECT_DEATH(io_port_is_supervisable(port.get()), "'port->functions' should not be NULL");
}

TEST_F(ProgrammingErrorDeathTest, NowhereToPutTheAnswer) {
  const auto port = PortBuilder().build();
  SupervisedRangeState state = SUPERVISED_STATE_OPEN;
  std::uint32_t level = 0;
  EXPECT_DEATH(io_port_get_supervised_ranges(port.get(), nullptr), "'ranges' should not be NULL");
  EXPECT_DEATH(io_port_get_supervised_readout(port.get(), nullptr, &level, nullptr),
               "'state' should not be NULL");
  EXPECT_DEATH(io_port_get_supervised_readout(port.get(), &state, nullptr, nullptr),
               "'level' should not be NULL");
}

TEST_F(ProgrammingErrorDeathTest, AStateThatIsNone) {
  EXPECT_DEATH(supervised_range_state2string(static_cast<SupervisedRangeState>(5)),
               "supervised_range_state2string.*assertion failed");
}

}  // namespace
