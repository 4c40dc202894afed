// The guest's device manager with the rules that the packages install.
#pragma once

#include <sys/types.h>

class DeviceManager {
 public:
  // Starts it, and has it go over the devices that are there already.
  DeviceManager();
  // Takes back what the rules have granted on files that outlive the devices of a test.
  ~DeviceManager();
  DeviceManager(const DeviceManager &) = delete;
  DeviceManager &operator=(const DeviceManager &) = delete;

  // Returns when everything that the kernel has announced so far is dealt with.
  static void settle();

 private:
  pid_t pid_ = 0;
};
