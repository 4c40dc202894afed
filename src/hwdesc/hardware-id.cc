#include "hwdesc/hardware-id.h"

#include <memory>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "base/patience.h"

namespace {

constexpr const char *kService = "com.kelv.PolicyKitSystem";
constexpr const char *kObject = "/com/kelv/PolicyKitSystem";

// Kept over the look-ups of all documents: making a proxy asks for the properties of the service,
// which takes as long as a call when the service hangs.
struct PolicyService {
  GObjectPtr<GDBusProxy> proxy;
  Patience patience;
};
std::unique_ptr<PolicyService> service;

// A service that hangs shows here already.
GObjectPtr<GDBusProxy> make_proxy(Patience &patience) {
  const std::int64_t begun = g_get_monotonic_time();
  Error error;
  GObjectPtr<GDBusProxy> proxy(
      g_dbus_proxy_new_for_bus_sync(G_BUS_TYPE_SYSTEM, G_DBUS_PROXY_FLAGS_NONE, nullptr, kService,
                                    kObject, kService, nullptr, error.out()));
  if (!proxy) {
    log_user("Failed to setup proxy: %s", error.message());
    return proxy;
  }
  patience.note_failure(proxy_owner(proxy.get()), begun, g_get_monotonic_time());
  return proxy;
}

GVariantPtr ask(PolicyService &policy, const char *parameter) {
  Error error;
  GVariantPtr reply = call_with_patience(policy.patience, policy.proxy.get(), "ReadBootblockParam",
                                         g_variant_new("(s)", parameter), error.out());
  if (!reply) {
    log_info("Failed to request policykit system: %s", error.message());
  } else if (!g_variant_is_of_type(reply.get(), G_VARIANT_TYPE("(s)"))) {
    log_info("Failed to request policykit system: %s", "the answer is not a single string");
    reply.reset();
  }
  return reply;
}

}  // namespace

std::optional<std::string> read_hardware_id(const char *parameter) {
  if (!service) {
    service = std::make_unique<PolicyService>();
  }
  if (!service->proxy) {
    service->proxy = make_proxy(service->patience);
  }
  const GVariantPtr reply = service->proxy ? ask(*service, parameter) : nullptr;
  if (!reply) {
    return std::nullopt;
  }
  const char *value = nullptr;
  g_variant_get(reply.get(), "(&s)", &value);
  return value;
}

void release_hardware_id_service() {
  service.reset();
}
