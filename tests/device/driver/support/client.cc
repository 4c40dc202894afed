#include "support/client.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <string_view>

namespace {

constexpr const char *kControl = "com.kelv.IOControl.State";
constexpr const char *kControlPath = "/com/kelv/IOControl/State";
constexpr const char *kSupervised = "com.kelv.IOSupervised.Supervised";
constexpr const char *kSupervisedPath = "/com/kelv/IOSupervised/Supervised";
constexpr int kCallTimeout = 20000;  // milliseconds

std::string error_text(const GError *error) {
  const GCharPtr name(g_dbus_error_get_remote_error(error));
  std::string text = error->message;
  const std::string prefix = "GDBus.Error:" + std::string(name ? name.get() : "") + ": ";
  if (name && text.starts_with(prefix)) {
    text.erase(0, prefix.size());
  }
  return (name ? std::string(name.get()) + ": " : std::string()) + text;
}

}  // namespace

Client::Client() {
  Error error;
  bus_.reset(g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, error.out()));
  EXPECT_TRUE(bus_) << error.message();
  subscription_ = g_dbus_connection_signal_subscribe(
      bus_.get(), nullptr, kControl, nullptr, kControlPath, nullptr, G_DBUS_SIGNAL_FLAGS_NONE,
      on_signal, this, nullptr);
}

Client::~Client() {
  g_dbus_connection_signal_unsubscribe(bus_.get(), subscription_);
}

void Client::on_signal(GDBusConnection * /*bus*/, const char * /*sender*/, const char * /*path*/,
                       const char * /*interface*/, const char *signal, GVariant *arguments,
                       gpointer user_data) {
  auto *client = static_cast<Client *>(user_data);
  if (std::string_view(signal) == "ActionSequenceDone") {
    ++client->sequences_done_;
    return;
  }
  gint32 number = -1;
  gboolean input = FALSE;
  gboolean virtual_trigger = FALSE;
  gboolean state = FALSE;
  g_variant_get(arguments, "(ibbbbbb)", &number, nullptr, nullptr, &input, &virtual_trigger, &state,
                nullptr);
  client->changes_.push_back({.number = number,
                              .input = input == TRUE,
                              .virtual_trigger = virtual_trigger == TRUE,
                              .state = state == TRUE});
}

GVariantPtr Client::call_on(const char *interface, const char *path, const char *method,
                            GVariant *arguments, std::string *error) {
  Error failure;
  GVariantPtr answer(g_dbus_connection_call_sync(
      bus_.get(), interface, path, interface, method, arguments, nullptr,
      G_DBUS_CALL_FLAGS_NO_AUTO_START, kCallTimeout, nullptr, failure.out()));
  if (error) {
    *error = failure ? error_text(failure.get()) : "";
  } else {
    EXPECT_TRUE(answer) << method << ": " << failure.message();
  }
  return answer;
}

GVariantPtr Client::call(const char *method, GVariant *arguments, std::string *error) {
  return call_on(kControl, kControlPath, method, arguments, error);
}

GVariantPtr Client::call_supervised(const char *method, GVariant *arguments, std::string *error) {
  return call_on(kSupervised, kSupervisedPath, method, arguments, error);
}

std::string Client::set_state(unsigned int port, bool active) {
  std::string error;
  call("SetState", g_variant_new("(ub)", port, active ? TRUE : FALSE), &error);
  return error;
}

std::string Client::set_direction(unsigned int port, const char *direction) {
  std::string error;
  call("SetDirection", g_variant_new("(us)", port, direction), &error);
  return error;
}

std::string Client::set_activelow(unsigned int port, bool input, bool activelow) {
  std::string error;
  call("SetActive",
       g_variant_new("(ubs)", port, input ? TRUE : FALSE, activelow ? "open" : "closed"), &error);
  return error;
}

std::string Client::start_sequence(unsigned int port,
                                   const std::vector<std::pair<bool, int>> &steps) {
  GVariantBuilder sequence;
  g_variant_builder_init(&sequence, G_VARIANT_TYPE("a(bi)"));
  for (const auto &[state, time] : steps) {
    g_variant_builder_add(&sequence, "(bi)", state ? TRUE : FALSE, time);
  }
  std::string error;
  call("StartActionSequence", g_variant_new("(uba(bi))", port, FALSE, &sequence), &error);
  return error;
}

std::string Client::set_supervised(unsigned int port, bool supervised) {
  std::string error;
  call_supervised("SetSupervised", g_variant_new("(ub)", port, supervised ? TRUE : FALSE), &error);
  return error;
}

std::string Client::set_range(unsigned int port, const char *state, unsigned int lower,
                              unsigned int upper) {
  std::string error;
  call_supervised("SetSupervisedRanges", g_variant_new("(usuu)", port, state, lower, upper),
                  &error);
  return error;
}

std::string Client::refresh() {
  std::string error;
  call("RefreshIOPorts", nullptr, &error);
  return error;
}

bool Client::state(unsigned int port) {
  gboolean active = FALSE;
  if (const GVariantPtr answer = call("GetState", g_variant_new("(u)", port))) {
    g_variant_get(answer.get(), "(b)", &active);
  }
  return active == TRUE;
}

Readout Client::readout(unsigned int port) {
  std::string error;
  const GVariantPtr answer =
      call_supervised("GetSupervisedReadout", g_variant_new("(u)", port), &error);
  if (!answer) {
    return {.state = "error: " + error};
  }
  const char *state = nullptr;
  guint32 level = 0;
  g_variant_get(answer.get(), "(&su)", &state, &level);
  return {.state = state, .level = level};
}

std::vector<std::string> Client::drop(const std::string &id) {
  const char *const ids[] = {id.c_str(), nullptr};
  std::vector<std::string> dropped;
  if (const GVariantPtr answer = call("DropIOPorts", g_variant_new("(^as)", ids))) {
    const GVariantPtr list(g_variant_get_child_value(answer.get(), 0));
    for (gsize i = 0; i < g_variant_n_children(list.get()); ++i) {
      const char *entry = nullptr;
      g_variant_get_child(list.get(), i, "&s", &entry);
      dropped.emplace_back(entry);
    }
  }
  return dropped;
}

std::vector<std::string> Client::ports() {
  std::vector<std::string> names;
  const GVariantPtr answer = call("GetPortProps", nullptr);
  if (!answer) {
    return names;
  }
  const GVariantPtr list(g_variant_get_child_value(answer.get(), 1));
  for (gsize i = 0; i < g_variant_n_children(list.get()); ++i) {
    const GVariantPtr port(g_variant_get_child_value(list.get(), i));
    const char *name = nullptr;
    g_variant_get_child(port.get(), 0, "&s", &name);
    names.emplace_back(name);
  }
  return names;
}

bool Client::answers() {
  std::string control;
  std::string supervised;
  return call("GetNbrPorts", nullptr, &control) &&
         call_supervised("GetNumberOfPorts", nullptr, &supervised);
}

// Signals that were sent before an answer are there before the answer.
void Client::catch_up() {
  std::string ignored;
  call("GetNbrPorts", nullptr, &ignored);
  while (g_main_context_iteration(nullptr, FALSE) == TRUE) {
  }
}

void Client::forget_changes() {
  catch_up();
  changes_.clear();
}

int Client::count_changes(int port) const {
  return static_cast<int>(std::count_if(changes_.begin(), changes_.end(),
                                        [&](const auto &change) { return change.number == port; }));
}

int Client::last_reported(int port) const {
  const auto last = std::find_if(changes_.rbegin(), changes_.rend(),
                                 [&](const auto &change) { return change.number == port; });
  if (last == changes_.rend()) {
    return -1;
  }
  return last->state ? 1 : 0;
}
