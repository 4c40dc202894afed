// A backend that is in no table of the daemon, made as HACKING says: it is all that the loader and
// the port layer need.
#include <fstream>
#include <sstream>

#include "hwdesc/hwdesc.h"
#include "port/ioport-private.h"
#include "support/port-fixture.h"
#include "support/temp-dir.h"

extern const PortFunctions kToyBackend;

namespace {

constexpr auto kToyKind = static_cast<BackendKind>(BACKEND_CHECK + 1);

class ToyBackend : public PortFixture {
 protected:
  ToyBackend() { io_port_register_backend({"toy", kToyKind, &kToyBackend}); }

  // Port 1, "toy", as the hardware description makes it.
  IOPortRef load(const std::string &file) const {
    const std::string document = dir.write(
        "description",
        "<ports><port name='toy' optional='true'><port_type type='input'/><port_no nbr='1'/>"
        "<properties ioport='true'/>"
        "<backend name='toy'><file path='" +
            file + "'/></backend></port></ports>");
    EXPECT_TRUE(hwdesc_load_file(document));
    return port_registry_get_by_id("toy");
  }
  // Lets the port look at its file once.
  static void look() { g_main_context_iteration(nullptr, TRUE); }

  const TempDir dir;
};

TEST_F(ToyBackend, IsKnownToTheLoaderByItsWord) {
  const auto port = load("/dev/null");
  EXPECT_EQ(port->backend, kToyKind);
  EXPECT_TRUE(io_port_has_backend(port.get()));
}

TEST_F(ToyBackend, ServesAPortOfTheDescription) {
  const auto port = load(dir.write("file", "0"));
  ASSERT_TRUE(io_port_setup(port.get()));
  io_port_set_watch(port.get());
  dir.write("file", "1");
  look();
  EXPECT_TRUE(io_port_get_state(port.get()));
  EXPECT_EQ(listener.heard(), Lines{"changed 1 on"});
}

TEST_F(ToyBackend, DoesNothingWhereItHasNoOperation) {
  const auto port = load(dir.write("file", "1"));
  ASSERT_TRUE(io_port_setup(port.get()));
  EXPECT_FALSE(io_port_set_state(port.get(), true));
  EXPECT_TRUE(log.took_warning("Set state on incorrect port"));
  EXPECT_FALSE(io_port_set_direction(port.get(), false));
  EXPECT_FALSE(io_port_set_supervised(port.get(), true));
  EXPECT_FALSE(io_port_get_state(port.get()));
}

TEST_F(ToyBackend, ComesBackFromADropWithItsAttributes) {
  const auto port = load(dir.write("file", "1"));
  ASSERT_TRUE(io_port_setup(port.get()));
  io_port_drop(port.get());
  ASSERT_TRUE(io_port_setup(port.get()));
  io_port_set_watch(port.get());
  look();
  EXPECT_TRUE(io_port_get_state(port.get()));
}

TEST_F(ToyBackend, IsTheOneThatIsPrintedInHacking) {
  std::ifstream document(PORTD_HACKING);
  std::ifstream source(PORTD_TOY_BACKEND);
  std::ostringstream indented;
  for (std::string line; std::getline(source, line);) {
    indented << (line.empty() ? "" : "       ") << line << "\n";
  }
  std::ostringstream text;
  text << document.rdbuf();
  EXPECT_NE(text.str().find(indented.str()), std::string::npos);
}

}  // namespace
