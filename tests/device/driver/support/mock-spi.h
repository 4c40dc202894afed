// The SPI controller without hardware, and the converters on it. A converter answers a command with
// two bytes that hold a 12-bit sample.
#pragma once

#include <string>

#include "support/kernel-module.h"

class MockSpi {
 public:
  static std::string node(int device);
  static void set_sample(int device, unsigned int command, unsigned int sample);
  // Every message to the device fails with this; 0: none does.
  static void set_error(int device, int error);
  // A line for each transfer of the last message, as the controller got it.
  static std::string last_message(int device);
  static int messages(int device);
  // Waits until this many more messages have come. False: they never did.
  static bool next_messages(int device, int count);

  int unload() { return module_.unload(); }

 private:
  KernelModule module_{"mock-spi"};
};
