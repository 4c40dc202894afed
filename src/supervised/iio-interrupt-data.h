// The private record of a supervised input on threshold events.
#pragma once

#include <atomic>
#include <mutex>
#include <optional>
#include <string>

#include "supervised/iio-thresholds.h"
#include "supervised/int-device.h"
#include "supervised/supervised-data.h"

inline constexpr std::int32_t kNoLimit = -1;
inline constexpr std::uint32_t kDefaultLimitTimeout = 1000;

struct IioIntSupervisedData : SupervisedData {
  // --- From the hardware description ---
  std::string driver;                           // name of the device
  std::optional<std::string> channel_name;      // "voltage" and the channel unless given
  std::optional<std::string> chan_extend_name;  // between the channel and the attribute
  std::uint32_t channel = 0;
  ThresholdRules rules;
  // Levels that thresholds can't lie beyond. There the level is read again after limit_timeout.
  std::int32_t lower_limit = kNoLimit;
  std::int32_t upper_limit = kNoLimit;
  std::uint32_t limit_timeout = kDefaultLimitTimeout;  // milliseconds
  // In microseconds. The kernel takes it in seconds: its sysfs documentation of industrial I/O says
  // so for in_<type>_integration_time ("integration time in seconds"), and its drivers parse the
  // text as seconds with six decimals.
  std::int32_t integration_time = 0;
  // Not switchable: always watched, by ranges of the document's own.
  bool adc_mode = false;
  // For all channels of the device, as the kernel takes them.
  std::optional<std::string> shared_samplefreq;
  std::optional<std::string> shared_thresh_either_period;
  bool cache_ad_value = true;  // readouts answer from the last value read
  bool pullup_when_supervised = false;

  SupervisedRanges own_ranges;  // used in adc_mode

  // --- From set-up to drop ---
  int device = -1;
  ThresholdFiles files;
  IntDevicePtr int_device;
  // What an action thread reads the level by, while the main thread may find the device elsewhere.
  // Nothing else is locked while the lock is held.
  std::mutex raw_path_lock;
  std::string raw_path;                 // none before the first set-up
  std::atomic<std::int32_t> value = 0;  // last read; an action thread may read one too
  std::atomic<bool> lost = false;       // the watch could not read it last
  Source limit_timer;
  Source recovery;
};

inline IioIntSupervisedData *iio_int_data(IOPort *port) {
  return static_cast<IioIntSupervisedData *>(io_port_backend_data(port));
}
