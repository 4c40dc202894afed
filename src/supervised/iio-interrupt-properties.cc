#include "supervised/iio-interrupt-properties.h"

#include <string_view>

#include "supervised/iio-interrupt-data.h"
#include "supervised/range-property.h"
#include "supervised/supervised-pins.h"

namespace {

PendingRange pending_range;

// In adc mode the ranges stay out of the port and are taken as they come.
void apply_range(IioIntSupervisedData *data, IOPort *port, const char *key, const char *value) {
  if (!data->adc_mode) {
    range_property_apply(&pending_range, port, key, value);
    return;
  }
  if (const auto upper = pending_range_take(&pending_range, key, value)) {
    const char *state = pending_range.state ? pending_range.state->c_str() : nullptr;
    data->own_ranges.push_back({supervised_range_string2state(state), *upper, pending_range.lower});
    pending_range = {};
  }
}

bool apply_text(IioIntSupervisedData *data, std::string_view key, const char *value) {
  if (key == "driver") {
    data->driver = value;
  } else if (key == "channel_name") {
    data->channel_name = value;
  } else if (key == "chan_extend_name") {
    data->chan_extend_name = value;
  } else if (key == "shared_samplefreq") {
    data->shared_samplefreq = value;
  } else if (key == "shared_thresh_either_period") {
    data->shared_thresh_either_period = value;
  } else {
    return false;
  }
  return true;
}

bool apply_number(IioIntSupervisedData *data, std::string_view key, const char *value) {
  if (key == "channel") {
    data->channel = property_unsigned(value);
  } else if (key == "hysteresis") {
    data->rules.hysteresis = property_unsigned(value);
  } else if (key == "lower_limit") {
    data->lower_limit = property_signed(value);
  } else if (key == "upper_limit") {
    data->upper_limit = property_signed(value);
  } else if (key == "limit_timeout") {
    data->limit_timeout = property_unsigned(value);
  } else if (key == "bitshift") {
    data->rules.bitshift = property_signed(value);
  } else if (key == "integration_time") {
    data->integration_time = property_signed(value);
  } else {
    return false;
  }
  return true;
}

void apply_switch(IioIntSupervisedData *data, std::string_view key, std::string_view value) {
  if (key == "one_threshold") {
    data->rules.one_threshold = value == "true";
  } else if (key == "mode") {
    data->adc_mode = value == "adc";
  } else if (key == "cache_ad_value") {
    data->cache_ad_value = value != "false";
  } else if (key == "pullup_when_supervised") {
    data->pullup_when_supervised = value == "true";
  }
}

}  // namespace

void iio_interrupt_set_property(IOPort *port, const char *section, const char *key,
                                const char *value) {
  auto *data = io_port_make_backend_data<IioIntSupervisedData>(port);
  if (supervised_set_pin_property(port, section, key, value)) {
    return;
  }
  if (std::string_view(section) == "range") {
    apply_range(data, port, key, value);
  } else if (std::string_view(section) == "device" && !apply_text(data, key, value) &&
             !apply_number(data, key, value)) {
    apply_switch(data, key, value);
  }
}
