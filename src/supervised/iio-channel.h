// One channel of a converter that watches thresholds: its attributes as the hardware description
// names them, its level, and the files of its thresholds. Main thread unless said otherwise.
#pragma once

#include <atomic>
#include <cstdint>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "port/ioport.h"
#include "supervised/iio-thresholds.h"

struct IioChannel {
  // --- From the hardware description ---
  std::string driver;                           // name of the device
  std::optional<std::string> channel_name;      // "voltage" and the channel unless given
  std::optional<std::string> chan_extend_name;  // between the channel and the attribute
  std::uint32_t channel = 0;
  ThresholdRules rules;
  // In microseconds. The kernel takes it in seconds: its sysfs documentation of industrial I/O says
  // so for in_<type>_integration_time ("integration time in seconds"), and its drivers parse the
  // text as seconds with six decimals.
  std::int32_t integration_time = 0;
  // For all channels of the device, as the kernel takes them.
  std::optional<std::string> shared_samplefreq;
  std::optional<std::string> shared_thresh_either_period;

  // --- From set-up on ---
  int device = -1;
  ThresholdFiles files;
  // What an action thread reads the level by, while the main thread may find the device elsewhere.
  // Nothing else is locked while the lock is held.
  std::mutex raw_path_lock;
  std::string raw_path;                 // none before the first set-up
  std::atomic<std::int32_t> value = 0;  // last read; an action thread may read one too
};

// Applies an attribute of the "device" section. False: it says nothing of the channel.
bool iio_channel_set_property(IioChannel *channel, std::string_view key, const char *value);
// Every attribute file that iio_channel_open() opens or writes.
std::vector<std::string> iio_channel_attributes(const IioChannel &channel, int device);
// Opens the channel's files on that device and writes what the device's channels share. What was
// open before stays when that fails: false, with a message.
bool iio_channel_open(IioChannel *channel, int device, IOPort *port);
// Reads the level into `value`. False, with a message and an error, when it can't be read. Any
// thread.
bool iio_channel_read(IioChannel *channel, GError **error);
// Whether the level can be read now. Without a message.
bool iio_channel_is_readable(IioChannel *channel);
