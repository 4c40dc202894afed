// A client of the daemon on the system bus.
#pragma once

#include <gio/gio.h>

#include <string>
#include <utility>
#include <vector>

#include "base/glib-ptr.h"

struct PortChange {
  int number = -1;
  bool input = false;
  bool virtual_trigger = false;
  bool state = false;
};

struct Readout {
  std::string state;  // or "error: " and the daemon's message
  unsigned int level = 0;

  bool operator==(const Readout &) const = default;
};

class Client {
 public:
  Client();
  Client(const Client &) = delete;
  Client &operator=(const Client &) = delete;
  ~Client();

  // "" or the error, as "NAME: message".
  std::string set_state(unsigned int port, bool active);
  std::string set_direction(unsigned int port, const char *direction);
  std::string set_activelow(unsigned int port, bool input, bool activelow);
  std::string start_sequence(unsigned int port, const std::vector<std::pair<bool, int>> &steps);
  std::string set_supervised(unsigned int port, bool supervised);
  std::string set_range(unsigned int port, const char *state, unsigned int lower,
                        unsigned int upper);
  std::string refresh();

  bool state(unsigned int port);
  Readout readout(unsigned int port);
  std::vector<std::string> drop(const std::string &id);
  // The identifiers of all ports in service.
  std::vector<std::string> ports();
  bool answers();

  // What PortChanged said since the last call of forget_changes(), in order, as far as the main
  // loop has run.
  const std::vector<PortChange> &changes() const { return changes_; }
  int count_changes(int port) const;
  // -1: none yet.
  int last_reported(int port) const;
  int sequences_done() const { return sequences_done_; }
  // Takes in everything that the daemon has said up to now.
  void catch_up();
  void forget_changes();

  // The answer to a call on the control interface; empty after an error, which is then in `error`.
  GVariantPtr call(const char *method, GVariant *arguments, std::string *error = nullptr);
  GVariantPtr call_supervised(const char *method, GVariant *arguments,
                              std::string *error = nullptr);

 private:
  static void on_signal(GDBusConnection *bus, const char *sender, const char *path,
                        const char *interface, const char *signal, GVariant *arguments,
                        gpointer user_data);
  GVariantPtr call_on(const char *interface, const char *path, const char *method,
                      GVariant *arguments, std::string *error);

  GObjectPtr<GDBusConnection> bus_;
  guint subscription_ = 0;
  std::vector<PortChange> changes_;
  int sequences_done_ = 0;
};
