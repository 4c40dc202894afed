#include "fixture.h"

#include <glib/gstdio.h>

#include "backends/backends.h"
#include "base/glib-ptr.h"
#include "port/port-registry.h"

LegacyTest::LegacyTest() {
  const GCharPtr directory(g_dir_make_tmp("legacy-test-XXXXXX", nullptr));
  directory_ = directory.get();
  backends_register();
}

LegacyTest::~LegacyTest() {
  port_registry_drop_all();
  for (const auto &file : files_) {
    g_unlink(file.c_str());
  }
  g_rmdir(directory_.c_str());
}

IOPort *LegacyTest::add_port(int number, PortType type, const char *flag) {
  IOPort *ioport = io_port_new();
  const IOPortRef ours(ioport);
  io_port_set_id(ioport, "port" + std::to_string(number));
  io_port_set_number(ioport, number);
  io_port_set_type(ioport, type);
  io_port_restore_direction(ioport, io_port_direction_input(ioport));
  io_port_set_flag(ioport, flag, "true");
  io_port_set_backend(ioport, io_port_backend_kind("check").value());
  port_registry_add(ioport);
  return ioport;
}

std::string LegacyTest::write_file(const char *name, const std::string &contents) {
  files_.push_back(path_of(name));
  g_file_set_contents(files_.back().c_str(), contents.data(), static_cast<gssize>(contents.size()),
                      nullptr);
  return files_.back();
}

std::string LegacyTest::path_of(const char *name) const {
  return directory_ + "/" + name;
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

std::string input_name(const IOPort *ioport) {
  std::optional<std::string> input;
  std::optional<std::string> output;
  io_port_get_names(ioport, &input, &output);
  return input.value_or("(unset)");
}

std::string output_name(const IOPort *ioport) {
  std::optional<std::string> input;
  std::optional<std::string> output;
  io_port_get_names(ioport, &input, &output);
  return output.value_or("(unset)");
}
