// The record of the check backend, open to the tests that read what a port told its backend.
#pragma once

#include <atomic>
#include <cstdint>
#include <list>
#include <string>

#include "port/ioport.h"

struct CheckProperty {
  std::string section;
  std::string key;
  std::string value;

  bool operator==(const CheckProperty &) const = default;
};

struct CheckBackendData : PortBackendData {
  std::atomic<std::int32_t> state = 0;  // the last value set; action threads set it too
  bool setup_ok = false;                // the result of the last set-up
  bool watching = false;
  std::int32_t direction = 0;           // the last one given: 1 input, 0 output
  std::list<CheckProperty> properties;  // newest first
};
