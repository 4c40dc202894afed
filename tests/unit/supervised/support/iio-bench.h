// The bench with the kernel's attribute files of industrial I/O converters.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

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
  // A converter that is sampled into a buffer: device 2 ("buffer") with its node, fed by device 5
  // ("adc") at the pace of the trigger "pulse". Its channel is 3, its samples have 12 bits.
  void make_buffered_converter() const;
  // A converter with channels 0 and 1 at level 150, its node and the FIFO of its events.
  void make_threshold_converter(int number, const char *name) const;
  void make_events(int number) const;
  int open_events(int number) const;

  // Descriptors of the process that lead to a file of the bench.
  std::size_t descriptors(const std::string &name) const;
  std::size_t descriptors() const;
  // The files of the descriptors that the main loop waits for, sorted; empty for one that is
  // closed.
  static std::vector<std::string> watched_files();
};
