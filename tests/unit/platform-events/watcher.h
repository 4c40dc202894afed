// Another service on the bus, which hears the signals and asks for the declarations.
#pragma once

#include <gio/gio.h>

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "base/glib-ptr.h"

// Runs the default main context until the condition holds. False: it did not within the deadline.
bool wait_until(const std::function<bool()> &condition);

// The text form of a value, without type annotations that its type does not need.
std::string print(GVariant *value);

// A signal, or the reply to a method call.
struct Heard {
  std::string path;  // of the object; empty for a reply
  std::string what;  // the signal's name, or "Reply"
  GVariantPtr value;

  std::string text() const { return what + " " + print(value.get()); }
};

class Watcher {
 public:
  // Watches the interface. Everything that is sent after this is heard.
  Watcher(const std::string &address, const std::string &interface);
  ~Watcher();
  Watcher(const Watcher &) = delete;
  Watcher &operator=(const Watcher &) = delete;

  // Calls List of a producer at the unique name `owner`, running the default main context until the
  // reply is there. "a(ua{sv})", or null for an error reply. All that `owner` sent before the reply
  // has been heard then.
  GVariantPtr list(const std::string &owner, const std::string &producer);

  // Calls List until the producer's object is there. False: it did not come within the deadline.
  bool wait_for(const std::string &owner, const std::string &producer);

  // What was heard up to now, in the order in which it came over the wire.
  std::vector<std::string> signals() const;
  void for_each(const std::function<void(const Heard &)> &visit) const;
  std::size_t count(const std::string &what) const;

 private:
  GObjectPtr<GDBusConnection> connection_;
  guint filter_ = 0;
  std::shared_ptr<std::vector<Heard>> heard_;  // shared with the connection's thread
};
