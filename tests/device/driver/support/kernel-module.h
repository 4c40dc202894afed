// A module of the guest's kernel, loaded while this lives.
#pragma once

#include <string>

class KernelModule {
 public:
  // For example "mock-iio" and "endian=be realbits=10".
  explicit KernelModule(std::string name, const std::string &parameters = "");
  KernelModule(const KernelModule &) = delete;
  KernelModule &operator=(const KernelModule &) = delete;
  ~KernelModule();

  // Before its time, as when the hardware goes away. The errno of a failure, 0 otherwise.
  int unload();

 private:
  std::string name_;
  bool loaded_ = false;
};
