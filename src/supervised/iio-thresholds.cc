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

// In the order of the members of ThresholdFiles.
constexpr const char *kFiles[] = {"thresh_rising_value", "thresh_falling_value", "thresh_rising_en",
                                  "thresh_falling_en", "thresh_either_en"};

UniqueFd open_file(const std::string &path) {
  UniqueFd file(open(path.c_str(), O_WRONLY | O_CLOEXEC));
  if (!file && errno != ENOENT) {
    log_critical("Failed to open sysfs path '%s': %s", path.c_str(), g_strerror(errno));
  }
  return file;
}

// The kernel takes every write for a whole new value. Cutting the file first makes that so for any
// file. A threshold beyond what the converter can measure is refused, and can never be crossed.
bool write_text(const UniqueFd &file, std::string_view text) {
  if (!file) {
    return false;
  }
  (void)!ftruncate(file.get(), 0);
  if (pwrite(file.get(), text.data(), text.size(), 0) >= 0) {
    return true;
  }
  const bool impossible = errno == EINVAL || errno == ERANGE;
  log_critical("Failed to write sysfs: %s", g_strerror(errno));
  return impossible;
}

bool write_flag(const UniqueFd &file, bool on) {
  return write_text(file, on ? "1" : "0");
}

bool write_flags(const ThresholdFiles &files, bool on) {
  if (files.either_enable) {
    return write_flag(files.either_enable, on);
  }
  const bool rising = write_flag(files.rising_enable, on);
  return write_flag(files.falling_enable, on) && rising;
}

// Where the kernel has no file for one side alone, the events of the other come along.
bool enable_one(const UniqueFd &side, const UniqueFd &other, const UniqueFd &either) {
  (void)write_flag(other, false);
  return write_flag(side ? side : either, true);
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

std::vector<std::string> threshold_paths(const std::string &prefix) {
  std::vector<std::string> paths;
  for (const char *file : kFiles) {
    paths.push_back(prefix + file);
  }
  return paths;
}

ThresholdFiles open_threshold_files(const std::string &prefix) {
  return {.rising_value = open_file(prefix + kFiles[0]),
          .falling_value = open_file(prefix + kFiles[1]),
          .rising_enable = open_file(prefix + kFiles[2]),
          .falling_enable = open_file(prefix + kFiles[3]),
          .either_enable = open_file(prefix + kFiles[4]),
          .one_side = false};
}

bool has_thresholds(const ThresholdFiles &files) {
  return (files.rising_value && (files.rising_enable || files.either_enable)) ||
         (files.falling_value && (files.falling_enable || files.either_enable));
}

bool write_threshold(const UniqueFd &file, std::int32_t value) {
  return write_text(file, std::to_string(value));
}

bool apply_thresholds(ThresholdFiles *files, const ThresholdPlan &plan) {
  const bool rising = !plan.rising_enabled || write_threshold(files->rising_value, plan.rising);
  const bool falling = !plan.falling_enabled || write_threshold(files->falling_value, plan.falling);
  files->one_side = plan.rising_enabled != plan.falling_enabled;
  if (!files->one_side) {
    return write_flags(*files, true) && rising && falling;
  }
  const bool enabled =
      plan.rising_enabled
          ? enable_one(files->rising_enable, files->falling_enable, files->either_enable)
          : enable_one(files->falling_enable, files->rising_enable, files->either_enable);
  return enabled && rising && falling;
}

void disable_thresholds(ThresholdFiles *files) {
  (void)write_flags(*files, false);
  if (files->one_side) {
    (void)write_flag(files->rising_enable, false);
    (void)write_flag(files->falling_enable, false);
    files->one_side = false;
  }
}
