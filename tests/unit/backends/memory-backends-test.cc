// The backends without hardware: virtual, null and check.
#include "port/ioport-private.h"
#include "support/port-fixture.h"

namespace {

class MemoryBackends : public PortFixture {
 protected:
  static std::uint32_t level_after(const IOPortRef &port, std::int32_t level) {
    io_port_write_level(port.get(), level);
    return io_port_read_level(port.get());
  }
};

TEST_F(MemoryBackends, VirtualReadsActiveAboveZero) {
  const auto port = PortBuilder().backend(BACKEND_VIRTUAL).output().set_up();
  EXPECT_EQ(level_after(port, 1), 1U);
  EXPECT_EQ(level_after(port, 5), 1U);
  EXPECT_EQ(level_after(port, INT32_MAX), 1U);
  EXPECT_EQ(level_after(port, 0), 0U);
  EXPECT_EQ(level_after(port, -1), 0U);
  EXPECT_EQ(level_after(port, INT32_MIN), 0U);
}

TEST_F(MemoryBackends, NullReadsInactiveWhateverItIsTold) {
  const auto port = PortBuilder().backend(BACKEND_NULL).output().set_up();
  EXPECT_EQ(level_after(port, 1), 0U);
  EXPECT_TRUE(io_port_set_state(port.get(), true));
  EXPECT_FALSE(io_port_get_state(port.get()));
  EXPECT_EQ(io_port_backend_data(port.get()), nullptr);
}

TEST_F(MemoryBackends, CheckReadsBackWhatItIsTold) {
  const auto port = PortBuilder().output().set_up();
  EXPECT_EQ(level_after(port, 5), 5U);
  EXPECT_EQ(level_after(port, 0), 0U);
  EXPECT_EQ(level_after(port, -1), UINT32_MAX);
}

TEST_F(MemoryBackends, CheckRecordsNothingAtFirst) {
  const auto port = PortBuilder().build();
  const CheckBackendData &record = check_record(port);
  EXPECT_EQ(record.state, 0);
  EXPECT_FALSE(record.setup_ok);
  EXPECT_FALSE(record.watching);
  EXPECT_EQ(record.direction, 0);
  EXPECT_TRUE(record.properties.empty());
}

TEST_F(MemoryBackends, CheckFailsItsSetUpWhenToldInAnySection) {
  for (const char *section : {"device", "backend", "", "input"}) {
    const auto port =
        PortBuilder().property(section, "setup", "fail").property("x", "y", "z").build();
    EXPECT_FALSE(io_port_setup(port.get())) << section;
    EXPECT_FALSE(check_record(port).setup_ok);
  }
}

TEST_F(MemoryBackends, CheckSetsUpWithEveryOtherWord) {
  const auto port = PortBuilder()
                        .property("a", "setup", "FAIL")
                        .property("b", "Setup", "fail")
                        .property("c", "setup", "fail ")
                        .property("setup", "fail", "setup")
                        .build();
  EXPECT_TRUE(io_port_setup(port.get()));
  EXPECT_TRUE(check_record(port).setup_ok);
}

TEST_F(MemoryBackends, CheckTakesBackAGoodSetUpWhenTheNextFails) {
  const auto port = PortBuilder().set_up();
  EXPECT_TRUE(check_record(port).setup_ok);
  io_port_set_backend_property(port.get(), "any", "setup", "fail");
  EXPECT_FALSE(io_port_setup(port.get()));
  EXPECT_FALSE(check_record(port).setup_ok);
}

TEST_F(MemoryBackends, CheckKeepsCopiesOfItsProperties) {
  const IOPortRef port(io_port_new());
  io_port_set_backend(port.get(), BACKEND_CHECK);
  {
    std::string section = "s";
    std::string key = "k";
    std::string value = "v";
    io_port_set_backend_property(port.get(), section.c_str(), key.c_str(), value.c_str());
    section = key = value = "overwritten";
  }
  EXPECT_EQ(check_record(port).properties, (std::list<CheckProperty>{{"s", "k", "v"}}));
}

}  // namespace
