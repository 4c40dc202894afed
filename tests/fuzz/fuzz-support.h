// What the fuzz targets share.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

#include "port/ioport.h"

// A file in a folder of the process's own, replaced for every input.
class InputFile {
 public:
  InputFile();
  ~InputFile();
  InputFile(const InputFile &) = delete;
  InputFile &operator=(const InputFile &) = delete;

  void write(const std::uint8_t *data, std::size_t size);
  const std::string &path() const { return path_; }

 private:
  std::string folder_;
  std::string path_;
};

// Backends registered, no bus to reach, log messages dropped. Once.
void fuzz_initialise();
// Puts a port of the device into the registry.
void fuzz_add_port(int number, const char *id, PortType type, BackendKind backend);
// An input, an output and a configurable port, numbered from 0.
void fuzz_add_port_of_each_type();
// Reads a settings file into all ports. False: it is none.
bool fuzz_apply_settings(const std::string &path);
// Calls what clients can call on every port, but sets up only backends that own no hardware: a
// fuzzed document names whatever path it likes.
void fuzz_exercise_ports();
