// The thresholds of one channel of a converter: which to set around a range of levels, and the
// kernel's attribute files that set them. Main thread.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "base/unique-fd.h"
#include "port/supervised-range.h"

struct ThresholdRules {
  std::uint32_t hysteresis = 0;  // levels beyond the range that still count as it
  std::int32_t bitshift = 0;     // from the level to the converter's code
  bool one_threshold = false;    // the converter can watch one side at a time
};

// What has to be crossed for the level to leave a range. A side that is not enabled is not written.
struct ThresholdPlan {
  bool rising_enabled = false;
  bool falling_enabled = false;
  std::int32_t rising = 0;
  std::int32_t falling = 0;

  bool operator==(const ThresholdPlan &) const = default;
};

// With one threshold, that is the lower end of the range, or the upper one for a range from 0.
ThresholdPlan plan_thresholds(const SupervisedRange &range, const ThresholdRules &rules);

// Attribute files, open for writing as long as the port is set up. None where the kernel has none.
struct ThresholdFiles {
  UniqueFd rising_value;
  UniqueFd falling_value;
  UniqueFd rising_enable;
  UniqueFd falling_enable;
  UniqueFd either_enable;
  bool one_side = false;  // the events of one side alone were enabled last
};

// The paths of all files that there may be. They begin with `prefix`.
std::vector<std::string> threshold_paths(const std::string &prefix);
// Opens the files. One that is there and can't be opened is logged.
ThresholdFiles open_threshold_files(const std::string &prefix);
// Whether thresholds can be set at all: there is one of a value and one that enables it.
bool has_thresholds(const ThresholdFiles &files);
// Writes a decimal number. False: there is no such file, or it failed, which is logged.
bool write_threshold(const UniqueFd &file, std::int32_t value);
// Sets the thresholds of a plan and enables their events. False: not all of them.
bool apply_thresholds(ThresholdFiles *files, const ThresholdPlan &plan);
void disable_thresholds(ThresholdFiles *files);
