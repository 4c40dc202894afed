// The IIO converters without hardware, and the timer triggers of the kernel.
#pragma once

#include <string>

#include "base/unique-fd.h"
#include "support/kernel-module.h"

class MockIio {
 public:
  // Parameters of the module, such as "endian=be realbits=10".
  explicit MockIio(const std::string &parameters = "");
  ~MockIio();
  MockIio(const MockIio &) = delete;
  MockIio &operator=(const MockIio &) = delete;

  static void set_value(int channel, int value, int device = 0);
  static std::string folder(int device = 0);  // in sysfs
  static std::string node(int device = 0);    // in /dev
  // An attribute below events/ of a channel, such as "thresh_rising_en".
  static int event_attribute(int channel, const std::string &name, int device = 0);
  // The one descriptor for events, when nobody has it; an invalid one otherwise.
  static UniqueFd take_events(int device = 0);
  // The next reads of raw values fail.
  static void fail_reads(int count);
  static int reads_to_fail();
  // How many scans the buffers were given since forget_scans().
  static int scans();
  static void forget_scans();
  // Takes all converters away, and brings them back.
  static void unplug();
  static void plug();

 private:
  KernelModule module_;
};

// The timer trigger that the documents of the tests name. Goes when this goes, whoever made it.
class TimerTrigger {
 public:
  static constexpr const char *kName = "portd-timer";

  TimerTrigger() = default;
  ~TimerTrigger();
  TimerTrigger(const TimerTrigger &) = delete;
  TimerTrigger &operator=(const TimerTrigger &) = delete;

  static void make();
  static std::string folder();  // in sysfs
  static std::string frequency();
};
