#include "supervised/iio-thresholds.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <string_view>

#include "base/log.h"

namespace {

constexpr std::int32_t kWidth = 32;

std::int32_t shift_left(std::uint32_t value, std::int32_t distance) {
  if (distance >= kWidth) {
    return 0;
  }
  return static_cast<std::int32_t>(distance > 0 ? value << distance : value);
}

UniqueFd open_file(const std::string &path) {
  return UniqueFd(open(path.c_str(), O_WRONLY | O_CLOEXEC));
}

// The kernel takes every write for a whole new value. Cutting the file first makes that so for any
// file.
void write_text(const UniqueFd &file, std::string_view text) {
  if (!file) {
    return;
  }
  (void)!ftruncate(file.get(), 0);
  if (pwrite(file.get(), text.data(), text.size(), 0) < 0) {
    log_critical("Failed to write sysfs: %s", g_strerror(errno));
  }
}

void write_flag(const UniqueFd &file, bool on) {
  write_text(file, on ? "1" : "0");
}

void write_flags(const ThresholdFiles &files, bool on) {
  if (files.either_enable) {
    write_flag(files.either_enable, on);
  } else {
    write_flag(files.rising_enable, on);
    write_flag(files.falling_enable, on);
  }
}

// Where the kernel has no file for one side alone, the events of the other come along.
void enable_one(const UniqueFd &side, const UniqueFd &other, const UniqueFd &either) {
  write_flag(other, false);
  write_flag(side ? side : either, true);
}

}  // namespace

ThresholdPlan plan_thresholds(const SupervisedRange &range, const ThresholdRules &rules) {
  const std::uint32_t above = range.upper + rules.hysteresis;
  const std::uint32_t below = range.lower - rules.hysteresis;
  ThresholdPlan plan;
  if (!rules.one_threshold) {
    plan = {.rising_enabled = true,
            .falling_enabled = true,
            .rising = shift_left(above, rules.bitshift),
            .falling = shift_left(below, rules.bitshift)};
  } else if (range.lower != 0) {
    plan.falling_enabled = true;
    plan.falling = static_cast<std::int32_t>(below);
  } else {
    plan.rising_enabled = true;
    plan.rising = static_cast<std::int32_t>(above);
  }
  return plan;
}

ThresholdFiles open_threshold_files(const std::string &prefix) {
  return {.rising_value = open_file(prefix + "thresh_rising_value"),
          .falling_value = open_file(prefix + "thresh_falling_value"),
          .rising_enable = open_file(prefix + "thresh_rising_en"),
          .falling_enable = open_file(prefix + "thresh_falling_en"),
          .either_enable = open_file(prefix + "thresh_either_en"),
          .one_side = false};
}

void write_threshold(const UniqueFd &file, std::int32_t value) {
  write_text(file, std::to_string(value));
}

void apply_thresholds(ThresholdFiles *files, const ThresholdPlan &plan) {
  if (plan.rising_enabled) {
    write_threshold(files->rising_value, plan.rising);
  }
  if (plan.falling_enabled) {
    write_threshold(files->falling_value, plan.falling);
  }
  files->one_side = plan.rising_enabled != plan.falling_enabled;
  if (files->one_side) {
    const bool rising = plan.rising_enabled;
    enable_one(rising ? files->rising_enable : files->falling_enable,
               rising ? files->falling_enable : files->rising_enable, files->either_enable);
  } else {
    write_flags(*files, true);
  }
}

void disable_thresholds(ThresholdFiles *files) {
  write_flags(*files, false);
  if (files->one_side) {
    write_flag(files->rising_enable, false);
    write_flag(files->falling_enable, false);
    files->one_side = false;
  }
}
