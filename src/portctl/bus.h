// The daemon as portctl sees it: its interfaces on a bus, and what to tell the user when a call
// fails. Main thread only. What fails here ends the program with a message and one of the
// documented exit statuses: a client of one command has nothing better to do.
#pragma once

#include <gio/gio.h>

#include <cstdint>
#include <string>

#include "base/glib-ptr.h"
#include "iocontrol-state-gen.h"
#include "iosupervised-supervised-gen.h"
#include "pcd-connector-gen.h"

// Fixed: the numbers, see portctl(1).
enum Status {
  STATUS_OK = 0,
  STATUS_REFUSED = 1,      // the daemon said no, or a checked file has mistakes
  STATUS_USAGE = 2,        // the command line makes no sense
  STATUS_NO_PORT = 3,      // no port, or several, fit the given word
  STATUS_NOT_ALLOWED = 4,  // the bus policy keeps this account from changing ports
  STATUS_NO_DAEMON = 5,    // no bus, or no daemon on it
  STATUS_TIMEOUT = 6,      // what was waited for did not come in time
};

inline constexpr const char *kControlName = "com.kelv.IOControl.State";
inline constexpr const char *kControlPath = "/com/kelv/IOControl/State";
inline constexpr const char *kSupervisedName = "com.kelv.IOSupervised.Supervised";
inline constexpr const char *kSupervisedPath = "/com/kelv/IOSupervised/Supervised";
inline constexpr const char *kConnectorName = "com.kelv.PCD.Connector";
inline constexpr const char *kConnectorPath = "/com/kelv/PCD/Connector";
inline constexpr const char *kProducerInterface = "com.kelv.Event.Producer";
inline constexpr const char *kProducerPath = "/com/kelv/Event/pcd";

// Prints "portctl: MESSAGE" to standard error and ends the program.
[[noreturn]] void fail(Status status, const std::string &message);

// The status and the words for a failed call; `what` is what was asked ("port 3").
struct Failure {
  Status status;
  std::string message;
};
Failure explain(const Error &error, const std::string &what);
[[noreturn]] void fail_call(const Error &error, const std::string &what);

// Whether the daemon is merely not there (yet): one that follows it goes on.
bool is_absence(const Error &error);

// Connects when it is first used. Which bus: the given address, or the system bus.
class Bus {
 public:
  explicit Bus(std::string address) : address_(std::move(address)) {}

  GDBusConnection *connection();
  // The one call that scripts make again and again, without the proxy, which costs a round trip
  // more.
  bool get_state(std::uint32_t port, gboolean *active, Error &error);
  IOControlState *control();
  IOSupervisedSupervised *supervised();
  PCDConnector *connector();

 private:
  std::string address_;
  GObjectPtr<GDBusConnection> connection_;
  GObjectPtr<IOControlState> control_;
  GObjectPtr<IOSupervisedSupervised> supervised_;
  GObjectPtr<PCDConnector> connector_;
};
