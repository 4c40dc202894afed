#include "support/port-builder.h"

#include <gtest/gtest.h>

#include <utility>

#include "port/port-registry.h"

PortBuilder::PortBuilder() : port_(io_port_new()) {
  io_port_set_backend(port_.get(), BACKEND_CHECK);
  io_port_set_number(port_.get(), 1);
  io_port_set_id(port_.get(), "port");
  io_port_set_flag(port_.get(), "ioport", "true");
}

PortBuilder &PortBuilder::type(PortType type) {
  io_port_set_type(port_.get(), type);
  io_port_restore_direction(port_.get(), io_port_direction_input(port_.get()));
  return *this;
}

PortBuilder &PortBuilder::input() {
  io_port_set_type(port_.get(), PORT_INPUT);
  return *this;
}

PortBuilder &PortBuilder::output() {
  io_port_set_type(port_.get(), PORT_OUTPUT);
  return *this;
}

PortBuilder &PortBuilder::configurable_input() {
  io_port_set_type(port_.get(), PORT_CONFIGURABLE);
  io_port_restore_direction(port_.get(), true);
  return *this;
}

PortBuilder &PortBuilder::configurable_output() {
  io_port_set_type(port_.get(), PORT_CONFIGURABLE);
  io_port_restore_direction(port_.get(), false);
  return *this;
}

PortBuilder &PortBuilder::number(int number) {
  io_port_set_number(port_.get(), number);
  return *this;
}

PortBuilder &PortBuilder::id(const char *id) {
  io_port_set_id(port_.get(), id);
  return *this;
}

PortBuilder &PortBuilder::flag(const char *name, const char *value) {
  io_port_set_flag(port_.get(), name, value);
  return *this;
}

PortBuilder &PortBuilder::backend(BackendKind kind) {
  io_port_set_backend(port_.get(), kind);
  return *this;
}

PortBuilder &PortBuilder::property(const char *section, const char *key, const char *value) {
  io_port_set_backend_property(port_.get(), section, key, value);
  return *this;
}

PortBuilder &PortBuilder::event(IoEvent event) {
  io_port_events(port_.get()).push_front(std::move(event));
  return *this;
}

PortBuilder &PortBuilder::optional() {
  io_port_set_optional(port_.get(), true);
  return *this;
}

PortBuilder &PortBuilder::activelow() {
  io_port_restore_activelow(port_.get(), true, true);
  io_port_restore_activelow(port_.get(), true, false);
  return *this;
}

PortBuilder &PortBuilder::names(const char *input, const char *output) {
  io_port_restore_name(port_.get(), input, true);
  io_port_restore_name(port_.get(), output, false);
  return *this;
}

IOPortRef PortBuilder::build() {
  return std::move(port_);
}

IOPortRef PortBuilder::set_up() {
  EXPECT_TRUE(io_port_setup(port_.get()));
  return std::move(port_);
}

IOPortRef PortBuilder::registered() {
  port_registry_add(port_.get());
  return std::move(port_);
}

IOPortRef PortBuilder::set_up_and_registered() {
  port_registry_add(port_.get());
  return set_up();
}

IoEvent event_for_inputs(const char *name) {
  IoEvent event;
  event.name = name;
  event.output = false;
  return event;
}

IoEvent event_for_outputs(const char *name) {
  IoEvent event;
  event.name = name;
  event.input = false;
  return event;
}

IoEvent event_for_supervised_inputs(const char *name) {
  IoEvent event;
  event.name = name;
  event.input = false;
  event.output = false;
  event.supervised_input = true;
  return event;
}

CheckBackendData &check_record(const IOPortRef &port) {
  return *static_cast<CheckBackendData *>(io_port_backend_data(port.get()));
}
