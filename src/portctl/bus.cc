#include "portctl/bus.h"

#include <cstdio>
#include <cstdlib>
#include <string_view>

#include "portctl/text.h"

namespace {

// Nothing but the call itself goes over the bus: no properties (there are none), no signals.
constexpr auto kFlags = static_cast<GDBusProxyFlags>(
    G_DBUS_PROXY_FLAGS_DO_NOT_LOAD_PROPERTIES | G_DBUS_PROXY_FLAGS_DO_NOT_CONNECT_SIGNALS |
    G_DBUS_PROXY_FLAGS_DO_NOT_AUTO_START_AT_CONSTRUCTION);

struct Advice {
  std::string_view name;  // of the D-Bus error
  Status status;
  const char *text;  // what to do next, after "WHAT: "
};

constexpr const char *kStartIt =
    "the daemon is not running: start it with \"systemctl start portd\", or see "
    "\"journalctl -u portd\" for why it ended";

constexpr Advice kAdvice[] = {
    {"org.freedesktop.DBus.Error.AccessDenied", STATUS_NOT_ALLOWED,
     "not allowed: ask for membership of the group portd, or do it as root"},
    {"org.freedesktop.DBus.Error.ServiceUnknown", STATUS_NO_DAEMON, kStartIt},
    {"org.freedesktop.DBus.Error.NameHasNoOwner", STATUS_NO_DAEMON, kStartIt},
    {"org.freedesktop.DBus.Error.Spawn.ChildExited", STATUS_NO_DAEMON, kStartIt},
    {"org.freedesktop.DBus.Error.Spawn.Failed", STATUS_NO_DAEMON, kStartIt},
    {"org.freedesktop.systemd1.NoSuchUnit", STATUS_NO_DAEMON, kStartIt},
    {"org.freedesktop.DBus.Error.UnknownMethod", STATUS_NO_DAEMON,
     "the daemon does not serve this (yet): try again when it has started, or update it"},
    {"org.freedesktop.DBus.Error.NoReply", STATUS_NO_DAEMON,
     "the daemon ended or does not answer: see \"systemctl status portd\""},
    {"com.kelv.IOControl.Error.No_port", STATUS_NO_PORT,
     "there is no such I/O port: \"portctl list\" shows those in service"},
    {"com.kelv.IOSupervised.Error.No_port", STATUS_NO_PORT,
     "there is no such I/O port: \"portctl list\" shows those in service"},
    {"com.kelv.IOControl.Error.Busy", STATUS_REFUSED,
     "a sequence runs on it: try again when it has ended (\"portctl monitor\" shows the end)"},
    {"com.kelv.IOControl.Error.Not_output", STATUS_REFUSED,
     "it can't be driven now: it is an input, or its hardware is missing. \"portctl direction PORT "
     "output\" turns a configurable one, \"portctl virtual\" reports a state without driving it"},
    {"com.kelv.IOControl.Error.Not_configurable", STATUS_REFUSED,
     "its direction is fixed: only ports that \"portctl list\" calls configurable can be turned"},
    {"com.kelv.IOSupervised.Not_supervisable", STATUS_REFUSED,
     "it can't be supervised: \"portctl supervised\" lists those that can"},
    {"com.kelv.IOSupervised.Bad_supervised_range", STATUS_REFUSED,
     "the range is not taken: a state (open, closed, short, cut), then lower < upper, both below "
     "65536"},
};

std::string remote_message(const Error &error) {
  const std::unique_ptr<GError, GlibDeleter<g_error_free>> copy(g_error_copy(error.get()));
  g_dbus_error_strip_remote_error(copy.get());
  return visible(copy->message);
}

std::string remote_name(const Error &error) {
  const GCharPtr name(g_dbus_error_get_remote_error(error.get()));
  return name ? name.get() : "";
}

GDBusConnection *connect(const std::string &address, Error &error) {
  if (address.empty()) {
    return g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, error.out());
  }
  const auto flags =
      static_cast<GDBusConnectionFlags>(G_DBUS_CONNECTION_FLAGS_AUTHENTICATION_CLIENT |
                                        G_DBUS_CONNECTION_FLAGS_MESSAGE_BUS_CONNECTION);
  return g_dbus_connection_new_for_address_sync(address.c_str(), flags, nullptr, nullptr,
                                                error.out());
}

void on_closed(GDBusConnection * /*connection*/, gboolean /*by_remote*/, GError * /*error*/,
               gpointer /*data*/) {
  fail(STATUS_NO_DAEMON, "the bus has gone");
}

}  // namespace

void fail(Status status, const std::string &message) {
  std::fflush(stdout);
  std::fprintf(stderr, "portctl: %s\n", message.c_str());
  std::exit(status);
}

Failure explain(const Error &error, const std::string &what) {
  const std::string name = remote_name(error);
  const std::string subject = what.empty() ? "" : visible(what) + ": ";
  for (const auto &advice : kAdvice) {
    if (advice.name == name) {
      const bool absent = advice.status == STATUS_NO_DAEMON;
      return {advice.status, (absent ? "" : subject) + advice.text};
    }
  }
  if (error.matches(G_IO_ERROR, G_IO_ERROR_TIMED_OUT)) {
    return {STATUS_NO_DAEMON,
            subject + "the daemon does not answer: see \"systemctl status portd\""};
  }
  return {STATUS_REFUSED, subject + remote_message(error)};
}

void fail_call(const Error &error, const std::string &what) {
  const Failure failure = explain(error, what);
  fail(failure.status, failure.message);
}

bool is_absence(const Error &error) {
  return error && explain(error, "").status == STATUS_NO_DAEMON;
}

GDBusConnection *Bus::connection() {
  if (!connection_) {
    Error error;
    connection_.reset(connect(address_, error));
    if (!connection_) {
      fail(STATUS_NO_DAEMON, std::string("no connection to the ") +
                                 (address_.empty() ? "system bus" : "bus at the given address") +
                                 ": " + visible(error.message()));
    }
    g_dbus_connection_set_exit_on_close(connection_.get(), FALSE);
    g_signal_connect(connection_.get(), "closed", G_CALLBACK(on_closed), nullptr);
  }
  return connection_.get();
}

bool Bus::get_state(std::uint32_t port, gboolean *active, Error &error) {
  const GVariantPtr reply(
      g_dbus_connection_call_sync(connection(), kControlName, kControlPath, kControlName,
                                  "GetState", g_variant_new("(u)", port), G_VARIANT_TYPE("(b)"),
                                  G_DBUS_CALL_FLAGS_NONE, -1, nullptr, error.out()));
  if (reply) {
    g_variant_get(reply.get(), "(b)", active);
  }
  return reply != nullptr;
}

IOControlState *Bus::control() {
  if (!control_) {
    Error error;
    control_.reset(iocontrol_state_proxy_new_sync(connection(), kFlags, kControlName, kControlPath,
                                                  nullptr, error.out()));
    if (!control_) {
      fail_call(error, "");
    }
  }
  return control_.get();
}

IOSupervisedSupervised *Bus::supervised() {
  if (!supervised_) {
    Error error;
    supervised_.reset(iosupervised_supervised_proxy_new_sync(
        connection(), kFlags, kSupervisedName, kSupervisedPath, nullptr, error.out()));
    if (!supervised_) {
      fail_call(error, "");
    }
  }
  return supervised_.get();
}

PCDConnector *Bus::connector() {
  if (!connector_) {
    Error error;
    connector_.reset(pcd_connector_proxy_new_sync(connection(), kFlags, kConnectorName,
                                                  kConnectorPath, nullptr, error.out()));
    if (!connector_) {
      fail_call(error, "");
    }
  }
  return connector_.get();
}
