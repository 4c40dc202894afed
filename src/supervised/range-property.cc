#include "supervised/range-property.h"

#include <string_view>

#include "base/glib-ptr.h"
#include "base/log.h"

namespace {

constexpr int kDecimal = 10;

}  // namespace

std::uint32_t property_unsigned(const char *text) {
  return static_cast<std::uint32_t>(g_ascii_strtoull(text, nullptr, kDecimal));
}

std::int32_t property_signed(const char *text) {
  return static_cast<std::int32_t>(g_ascii_strtoll(text, nullptr, kDecimal));
}

std::optional<std::uint32_t> pending_range_take(PendingRange *pending, const char *key,
                                                const char *value) {
  const std::string_view name = key;
  if (name == "state") {
    pending->state = value;
  } else if (name == "lower") {
    pending->lower = property_unsigned(value);
  } else if (name == "upper") {
    return property_unsigned(value);
  }
  return std::nullopt;
}

void range_property_apply(PendingRange *pending, IOPort *port, const char *key, const char *value) {
  const auto upper = pending_range_take(pending, key, value);
  if (!upper) {
    return;
  }
  const char *state = pending->state ? pending->state->c_str() : nullptr;
  Error error;
  if (!io_port_set_supervised_range(port, state, pending->lower, *upper, error.out())) {
    log_critical("Failed to configure port: %s\n", error.message());
  }
  *pending = {};
}
