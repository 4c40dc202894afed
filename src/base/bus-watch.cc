#include "base/bus-watch.h"

#include <optional>
#include <utility>

#include "base/main-queue.h"

struct OwnerWatch::State : std::enable_shared_from_this<State> {
  Changed changed;
  GObjectPtr<GDBusConnection> connection;
  std::string owner;
  std::optional<std::string> notified;  // what `changed` was last called with

  void update(GDBusConnection *now_connection, const char *now_owner) {
    connection = now_connection ? gobject_reference(now_connection) : nullptr;
    owner = now_owner;
    // Deferred: a name that changes its owner vanishes and appears in the same dispatch.
    post_to_main_loop([watch = weak_from_this()] {
      if (const auto state = watch.lock()) {
        state->notify();
      }
    });
  }

  void notify() {
    if (notified != owner) {
      notified = owner;
      changed(connection.get(), owner);
    }
  }

  static void on_appeared(GDBusConnection *connection, const char * /*name*/, const char *owner,
                          gpointer state) {
    static_cast<State *>(state)->update(connection, owner);
  }

  static void on_vanished(GDBusConnection *connection, const char * /*name*/, gpointer state) {
    static_cast<State *>(state)->update(connection, "");
  }
};

OwnerWatch::OwnerWatch(const char *name, Changed changed) : state_(std::make_shared<State>()) {
  state_->changed = std::move(changed);
  id_ = g_bus_watch_name(G_BUS_TYPE_SYSTEM, name, G_BUS_NAME_WATCHER_FLAGS_AUTO_START,
                         State::on_appeared, State::on_vanished, state_.get(), nullptr);
}

OwnerWatch::~OwnerWatch() {
  g_bus_unwatch_name(id_);
}

namespace {

void on_signal(GDBusConnection * /*connection*/, const char * /*sender*/, const char *object_path,
               const char * /*interface*/, const char * /*member*/, GVariant *parameters,
               gpointer handler) {
  (*static_cast<SignalSubscription::Handler *>(handler))(object_path, parameters);
}

void delete_handler(gpointer handler) {
  delete static_cast<SignalSubscription::Handler *>(handler);
}

}  // namespace

SignalSubscription::SignalSubscription(GDBusConnection *connection, const std::string &sender,
                                       const char *interface, const char *member, Handler handler)
    : connection_(gobject_reference(connection)),
      id_(g_dbus_connection_signal_subscribe(connection, sender.c_str(), interface, member, nullptr,
                                             nullptr, G_DBUS_SIGNAL_FLAGS_NONE, on_signal,
                                             new Handler(std::move(handler)), delete_handler)) {}

SignalSubscription::SignalSubscription(SignalSubscription &&other) noexcept
    : connection_(std::move(other.connection_)), id_(std::exchange(other.id_, 0)) {}

SignalSubscription &SignalSubscription::operator=(SignalSubscription &&other) noexcept {
  reset();
  connection_ = std::move(other.connection_);
  id_ = std::exchange(other.id_, 0);
  return *this;
}

void SignalSubscription::reset() {
  if (id_ != 0) {
    g_dbus_connection_signal_unsubscribe(connection_.get(), std::exchange(id_, 0));
  }
  connection_.reset();
}
