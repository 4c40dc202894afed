// A port listener that writes down what it hears, so that tests can read what a port told the world
// and in which order.
#pragma once

#include <cstddef>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "base/condition.h"
#include "port/port-listener.h"

using Lines = std::vector<std::string>;

// Fills every slot of the process's listener while it lives. One at a time.
class RecordingListener {
 public:
  RecordingListener();
  ~RecordingListener();
  RecordingListener(const RecordingListener &) = delete;
  RecordingListener &operator=(const RecordingListener &) = delete;

  // What was heard since the last call, oldest first:
  //   "declare NAME", "undeclare NAME", "redeclare NAME", "send NAME STATE",
  //   "changed NUMBER on" or "changed NUMBER off", "done NUMBER"
  Lines heard();
  // Waits until that line is among those that heard() would give now. False: it did not come in
  // a time that is long for every machine.
  [[nodiscard]] bool wait_for(std::string_view line);
  // How often the line has been heard since the listener was made.
  std::size_t times(std::string_view line);
  // The contents of every PortChanged so far.
  std::vector<PortChange> changes();
  // From now on declaring an event of that name fails.
  void refuse(std::string name);

  void record(std::string line);
  void record_change(const PortChange &change);
  bool refuses(const std::string &name);

 private:
  std::mutex lock_;
  MonotonicCondition more_;
  Lines all_;
  std::size_t told_ = 0;  // how many of the lines heard() has given already
  std::vector<PortChange> changes_;
  std::string refused_;
};
