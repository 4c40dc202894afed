#include "hwdesc/hardware-id.h"

#include "base/glib-ptr.h"
#include "base/log.h"

namespace {

constexpr const char *kService = "com.kelv.PolicyKitSystem";
constexpr const char *kObject = "/com/kelv/PolicyKitSystem";
constexpr int kDefaultTimeout = -1;

}  // namespace

std::optional<std::string> read_hardware_id(const char *parameter) {
  Error error;
  const GObjectPtr<GDBusProxy> proxy(
      g_dbus_proxy_new_for_bus_sync(G_BUS_TYPE_SYSTEM, G_DBUS_PROXY_FLAGS_NONE, nullptr, kService,
                                    kObject, kService, nullptr, error.out()));
  if (!proxy) {
    log_user("Failed to setup proxy: %s", error.message());
    return std::nullopt;
  }
  const GVariantPtr reply(
      g_dbus_proxy_call_sync(proxy.get(), "ReadBootblockParam", g_variant_new("(s)", parameter),
                             G_DBUS_CALL_FLAGS_NONE, kDefaultTimeout, nullptr, error.out()));
  if (!reply) {
    log_info("Failed to request policykit system: %s", error.message());
    return std::nullopt;
  }
  if (!g_variant_is_of_type(reply.get(), G_VARIANT_TYPE("(s)"))) {
    log_info("Failed to request policykit system: %s", "the answer is not a single string");
    return std::nullopt;
  }
  const char *value = nullptr;
  g_variant_get(reply.get(), "(&s)", &value);
  return value;
}
