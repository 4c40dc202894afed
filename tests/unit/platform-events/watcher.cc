#include "watcher.h"

#include <algorithm>
#include <cstdlib>
#include <mutex>

namespace {

constexpr gint64 kDeadlineSeconds = 30;

gboolean on_deadline(gpointer user_data) {
  *static_cast<bool *>(user_data) = true;
  return G_SOURCE_CONTINUE;
}

// Guards what all watchers have heard. Not one per watcher, since a lock that reached the
// connection's thread by way of GIO would be new memory to ThreadSanitizer.
std::mutex the_lock;

using Log = std::shared_ptr<std::vector<Heard>>;

void drop_log(gpointer user_data) {
  const std::lock_guard guard(the_lock);
  delete static_cast<Log *>(user_data);
}

void keep(std::vector<Heard> &log, GDBusMessage *message) {
  const auto type = g_dbus_message_get_message_type(message);
  GVariant *body = g_dbus_message_get_body(message);
  const bool reply = type == G_DBUS_MESSAGE_TYPE_METHOD_RETURN;
  const char *path = g_dbus_message_get_path(message);
  if (!body || (!reply && (type != G_DBUS_MESSAGE_TYPE_SIGNAL ||
                           g_str_has_prefix(path, "/org/freedesktop/")))) {
    return;
  }
  log.push_back({path ? path : "", reply ? "Reply" : g_dbus_message_get_member(message),
                 GVariantPtr(g_variant_ref(body))});
}

GDBusMessage *on_message(GDBusConnection * /*connection*/, GDBusMessage *message, gboolean incoming,
                         gpointer user_data) {
  if (incoming) {
    const std::lock_guard guard(the_lock);
    keep(**static_cast<Log *>(user_data), message);
    g_main_context_wakeup(nullptr);
  }
  return message;
}

struct Reply {
  bool there = false;
  GVariantPtr value;
};

void on_reply(GObject *source, GAsyncResult *result, gpointer user_data) {
  auto *reply = static_cast<Reply *>(user_data);
  Error error;
  reply->value.reset(g_dbus_connection_call_finish(G_DBUS_CONNECTION(source), result, error.out()));
  reply->there = true;
}

}  // namespace

bool wait_until(const std::function<bool()> &condition) {
  bool late = false;
  const guint deadline = g_timeout_add_seconds(guint{kDeadlineSeconds}, on_deadline, &late);
  while (!condition() && !late) {
    g_main_context_iteration(nullptr, TRUE);
  }
  g_source_remove(deadline);
  return condition();
}

std::string print(GVariant *value) {
  if (!value) {
    return "nothing";
  }
  const GCharPtr text(g_variant_print(value, FALSE));
  return text.get();
}

Watcher::Watcher(const std::string &address, const std::string &interface) {
  Error error;
  connection_.reset(g_dbus_connection_new_for_address_sync(
      address.c_str(),
      static_cast<GDBusConnectionFlags>(G_DBUS_CONNECTION_FLAGS_AUTHENTICATION_CLIENT |
                                        G_DBUS_CONNECTION_FLAGS_MESSAGE_BUS_CONNECTION),
      nullptr, nullptr, error.out()));
  if (!connection_) {
    g_printerr("No connection to the private bus: %s\n", error.message());
    std::abort();
  }
  const std::string rule = "type='signal',interface='" + interface + "'";
  const GVariantPtr added(g_dbus_connection_call_sync(
      connection_.get(), "org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus",
      "AddMatch", g_variant_new("(s)", rule.c_str()), nullptr, G_DBUS_CALL_FLAGS_NONE, -1, nullptr,
      error.out()));
  const std::lock_guard guard(the_lock);
  heard_ = std::make_shared<std::vector<Heard>>();
  auto *log = new Log(heard_);
  filter_ = g_dbus_connection_add_filter(connection_.get(), on_message, log, drop_log);
}

Watcher::~Watcher() {
  g_dbus_connection_remove_filter(connection_.get(), filter_);
  g_dbus_connection_close_sync(connection_.get(), nullptr, nullptr);
}

GVariantPtr Watcher::list(const std::string &owner, const std::string &producer) {
  Reply reply;
  g_dbus_connection_call(connection_.get(), owner.c_str(), ("/com/kelv/Event/" + producer).c_str(),
                         "com.kelv.Event.Producer", "List", nullptr, G_VARIANT_TYPE("(a(ua{sv}))"),
                         G_DBUS_CALL_FLAGS_NONE, -1, nullptr, on_reply, &reply);
  wait_until([&reply] { return reply.there; });
  return reply.value ? GVariantPtr(g_variant_get_child_value(reply.value.get(), 0)) : nullptr;
}

bool Watcher::wait_for(const std::string &owner, const std::string &producer) {
  const gint64 deadline = g_get_monotonic_time() + kDeadlineSeconds * G_USEC_PER_SEC;
  while (!list(owner, producer)) {
    if (g_get_monotonic_time() > deadline) {
      return false;
    }
  }
  return true;
}

std::vector<std::string> Watcher::signals() const {
  std::vector<std::string> texts;
  for_each([&texts](const Heard &heard) {
    if (!heard.path.empty()) {
      texts.push_back(heard.text());
    }
  });
  return texts;
}

void Watcher::for_each(const std::function<void(const Heard &)> &visit) const {
  const std::lock_guard guard(the_lock);
  std::for_each(heard_->begin(), heard_->end(), visit);
}

std::size_t Watcher::count(const std::string &what) const {
  std::size_t count = 0;
  for_each([&](const Heard &heard) { count += heard.what == what ? 1 : 0; });
  return count;
}
