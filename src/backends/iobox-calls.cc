#include "backends/iobox-calls.h"

#include <algorithm>
#include <iterator>
#include <string>
#include <string_view>

#include "base/glib-ptr.h"
#include "base/timeout-budget.h"

namespace {

constexpr IoBoxPlace kCallFailed = {"iobox_dbus_call", 44};
constexpr IoBoxPlace kBadWord = {"iobox_state_to_portd_state", 67};
constexpr IoBoxPlace kNoConnectionStatus = {"iobox_port_setup", 180};
constexpr IoBoxPlace kNoPortStatus = {"iobox_port_setup", 193};

struct StateWord {
  std::string_view word;
  SupervisedRangeState state;
};

constexpr StateWord kStateWords[] = {
    {"closed", SUPERVISED_STATE_CLOSED},
    {"cut", SUPERVISED_STATE_CUT},
    {"short", SUPERVISED_STATE_SHORT},
    {"open", SUPERVISED_STATE_OPEN},
};

// Null when there was no answer, which is logged.
GVariantPtr iobox_dbus_call(const IoBoxCall &call, const char *method, GVariant *parameters) {
  const int timeout_ms = call.budget ? call.budget->timeout_ms() : TimeoutBudget::kBusDefault;
  const std::int64_t begun = g_get_monotonic_time();
  Error error;
  GVariantPtr reply(g_dbus_proxy_call_sync(call.proxy, method, parameters, G_DBUS_CALL_FLAGS_NONE,
                                           timeout_ms, call.cancellable, error.out()));
  if (call.budget) {
    call.budget->spend(g_get_monotonic_time() - begun);
  }
  if (!reply) {
    log_iobox(kLogLevelUser, kCallFailed, "Failed to call method %s: %s", method, error.message());
  }
  return reply;
}

// The same for a reply of known type. Another one counts as no answer.
GVariantPtr call_for(const IoBoxCall &call, const char *method, GVariant *parameters,
                     const char *type) {
  GVariantPtr reply = iobox_dbus_call(call, method, parameters);
  if (reply && !g_variant_is_of_type(reply.get(), G_VARIANT_TYPE(type))) {
    log_warning("The I/O box monitor answered %s with type %s instead of %s", method,
                g_variant_get_type_string(reply.get()), type);
    reply.reset();
  }
  return reply;
}

// Unset when there was no answer.
std::optional<std::string> word_for(const IoBoxCall &call, const char *method, int number) {
  const GVariantPtr reply = call_for(call, method, g_variant_new("(i)", number), "(s)");
  if (!reply) {
    return std::nullopt;
  }
  const char *word = nullptr;
  g_variant_get(reply.get(), "(&s)", &word);
  return word;
}

}  // namespace

bool iobox_is_connected(const IoBoxCall &call) {
  const GVariantPtr reply = call_for(call, "GetIOBoxConnected", nullptr, "(b)");
  if (!reply) {
    log_iobox(kLogLevelUser, kNoConnectionStatus, "Could not get IO box connection status");
    return false;
  }
  gboolean connected = FALSE;
  g_variant_get(reply.get(), "(b)", &connected);
  return connected;
}

bool iobox_port_is_enabled(const IoBoxCall &call, int number) {
  const auto status = word_for(call, "GetIOPortStatus", number);
  if (!status) {
    log_iobox(kLogLevelUser, kNoPortStatus, "Could not get IO port status");
  }
  return status == "enabled";
}

std::optional<SupervisedRangeState> iobox_query_state(const IoBoxCall &call, int number) {
  const auto word = word_for(call, "GetIOState", number);
  return word ? std::optional(iobox_state_to_portd_state(word->c_str())) : std::nullopt;
}

void iobox_send_mode(const IoBoxCall &call, const IoBoxMode &mode) {
  iobox_dbus_call(call, "SetIOMode", g_variant_new("(iis)", mode.number, mode.level, mode.word));
}

SupervisedRangeState iobox_state_to_portd_state(const char *word) {
  const auto *const found =
      std::find_if(std::begin(kStateWords), std::end(kStateWords),
                   [&](const StateWord &entry) { return entry.word == word; });
  if (found != std::end(kStateWords)) {
    return found->state;
  }
  log_iobox(G_LOG_LEVEL_WARNING, kBadWord, "Unrecognized iobox supervised state: %s", word);
  return SUPERVISED_STATE_UNDEFINED;
}
