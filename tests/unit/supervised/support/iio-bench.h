// The bench with the kernel's attribute files of industrial I/O converters.
#pragma once

#include "support/bench.h"

class IioBench : public Bench {
 protected:
  IioBench();
  ~IioBench() override;

  // A device's attribute files, as the kernel would have them.
  void make_device(int number, const char *name) const;
  std::string attribute(int device, const std::string &name) const;
  // The device's character device: a FIFO whose other end the test has.
  void make_node(int number) const;
  int open_node(int number) const;

  // The state and level of a readout, or its error.
  static std::string readout(const IOPortRef &port);
  // Descriptors of the process that lead to a file of the bench.
  std::size_t descriptors(const std::string &name) const;
  std::size_t descriptors() const;
};
