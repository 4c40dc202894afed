// Ports for tests, as the hardware description and the settings would make them.
#pragma once

#include <string>

#include "backends/check-backend.h"
#include "port/ioport.h"

// An input on the check backend, called "port", numbered 1 and flagged "ioport", until told
// otherwise.
class PortBuilder {
 public:
  PortBuilder();

  // In the role that ports of that type start with.
  PortBuilder &type(PortType type);
  PortBuilder &input();
  PortBuilder &output();
  // Configurable, in the role given.
  PortBuilder &configurable_input();
  PortBuilder &configurable_output();
  PortBuilder &number(int number);
  PortBuilder &id(const char *id);
  PortBuilder &flag(const char *name, const char *value = "true");
  PortBuilder &backend(BackendKind kind);
  PortBuilder &property(const char *section, const char *key, const char *value);
  PortBuilder &event(IoEvent event);
  PortBuilder &optional();
  // Both sides.
  PortBuilder &activelow();
  // The names of both sides.
  PortBuilder &names(const char *input, const char *output);

  IOPortRef build();
  IOPortRef set_up();
  // The same, and in the registry.
  IOPortRef registered();
  IOPortRef set_up_and_registered();

 private:
  IOPortRef port_;
};

// An event of that name that applies to the roles given.
IoEvent event_for_inputs(const char *name);
IoEvent event_for_outputs(const char *name);
IoEvent event_for_supervised_inputs(const char *name);

// What a port told its check backend.
CheckBackendData &check_record(const IOPortRef &port);
