#include "fixture.h"

#include "base/glib-ptr.h"
#include "daemon/backends.h"
#include "port/port-registry.h"
#include "support/port-builder.h"

LegacyTest::LegacyTest() {
  backends_register();
}

LegacyTest::~LegacyTest() {
  port_registry_drop_all();
}

IOPort *LegacyTest::add_port(int number, PortType type) {
  const std::string id = "port" + std::to_string(number);
  const auto port = PortBuilder().number(number).id(id.c_str()).type(type).registered();
  IOPort *registered = port.get();
  return registered;
}

std::string read_file(const std::string &path) {
  char *contents = nullptr;
  gsize length = 0;
  if (!g_file_get_contents(path.c_str(), &contents, &length, nullptr)) {
    ADD_FAILURE() << "no file " << path;
    return {};
  }
  const GCharPtr text(contents);
  return {contents, length};
}

std::string input_name(const IOPort *port) {
  std::optional<std::string> input;
  std::optional<std::string> output;
  io_port_get_names(port, &input, &output);
  return input.value_or("(unset)");
}

std::string output_name(const IOPort *port) {
  std::optional<std::string> input;
  std::optional<std::string> output;
  io_port_get_names(port, &input, &output);
  return output.value_or("(unset)");
}
