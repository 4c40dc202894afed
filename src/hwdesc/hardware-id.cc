#include "hwdesc/hardware-id.h"

#include <memory>

#include "base/glib-ptr.h"
#include "base/log.h"
#include "base/main-queue.h"
#include "base/timeout-budget.h"
#include "base/worker.h"

namespace {

constexpr const char *kService = "com.kelv.PolicyKitSystem";
constexpr const char *kObject = "/com/kelv/PolicyKitSystem";

using Value = std::optional<std::string>;

// Kept over the look-ups of all documents: making a proxy asks for the properties of the service,
// which takes as long as a call when the service hangs. The worker uses what stands before it.
struct PolicyService {
  GObjectPtr<GDBusProxy> proxy;
  TimeoutBudget budget;
  Worker worker{"Hardware id"};
};
std::unique_ptr<PolicyService> service;

// A service that hangs shows here already.
void make_proxy(PolicyService &policy, GCancellable *cancellable) {
  const std::int64_t begun = g_get_monotonic_time();
  Error error;
  policy.proxy.reset(g_dbus_proxy_new_for_bus_sync(G_BUS_TYPE_SYSTEM, G_DBUS_PROXY_FLAGS_NONE,
                                                   nullptr, kService, kObject, kService,
                                                   cancellable, error.out()));
  policy.budget.spend(g_get_monotonic_time() - begun);
  if (!policy.proxy) {
    log_user("Failed to setup proxy: %s", error.message());
  }
}

Value ask(PolicyService &policy, const std::string &parameter, GCancellable *cancellable) {
  const std::int64_t begun = g_get_monotonic_time();
  Error error;
  const GVariantPtr reply(g_dbus_proxy_call_sync(
      policy.proxy.get(), "ReadBootblockParam", g_variant_new("(s)", parameter.c_str()),
      G_DBUS_CALL_FLAGS_NONE, policy.budget.timeout_ms(), cancellable, error.out()));
  policy.budget.spend(g_get_monotonic_time() - begun);
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

Value look_up(PolicyService &policy, const std::string &parameter, GCancellable *cancellable) {
  if (!policy.proxy) {
    make_proxy(policy, cancellable);
  }
  return policy.proxy ? ask(policy, parameter, cancellable) : std::nullopt;
}

}  // namespace

std::optional<std::string> read_hardware_id(const char *parameter) {
  if (!service) {
    service = std::make_unique<PolicyService>();
  }
  Value result;
  bool over = !service->worker.queue([&, name = std::string(parameter)](GCancellable *cancellable) {
    result = look_up(*service, name, cancellable);
    post_to_main_loop([&over] { over = true; });
  });
  serve_main_loop_until([&] { return over; });
  return result;
}

void release_hardware_id_service() {
  service.reset();
}
