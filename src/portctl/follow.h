// The daemon's ports kept up to date while it lives, goes away and comes back. Main loop only.
#pragma once

#include <cstdint>
#include <map>
#include <string>

#include "portctl/ports.h"

// The arguments of the signal PortChanged.
struct Change {
  int port = -1;
  bool is_virtual = false;
  bool hidden = false;
  bool input = false;
  bool reported = false;  // by a client, instead of read from hardware
  bool active = false;
  bool active_low = false;
};

// A sent event: which declaration, and all its keys.
struct SentEvent {
  std::uint32_t id = 0;
  std::string type;  // "" for the built-in ones
  GVariant *keys = nullptr;
};

// What follows ports overrides what it wants to hear of. Every call comes from the main loop, after
// ports() has been brought up to date.
class Follower {
 public:
  explicit Follower(Bus &bus) : bus_(bus) {}
  Follower(const Follower &) = delete;
  Follower &operator=(const Follower &) = delete;
  virtual ~Follower();

  // Subscribes. The first on_up() or on_down() follows from the main loop.
  void start();

 protected:
  virtual void on_up() = 0;    // the daemon serves; also after a restart
  virtual void on_down() = 0;  // the daemon has gone, or was not there
  virtual void on_change(const Change &change, Port &port) = 0;
  virtual void on_sequence_done(int number, const Port *port) = 0;
  virtual void on_event(const SentEvent & /*event*/) {}

  Bus &bus() { return bus_; }
  Ports &ports() { return ports_; }
  Port *find(int number);
  // Asks for everything again; false when the daemon does not answer.
  bool fetch();

 private:
  static void appeared(GDBusConnection *connection, const char *name, const char *owner,
                       gpointer data);
  static void vanished(GDBusConnection *connection, const char *name, gpointer data);
  static void on_control_signal(GDBusConnection *connection, const char *sender, const char *path,
                                const char *interface, const char *member, GVariant *arguments,
                                gpointer data);
  static void on_producer_signal(GDBusConnection *connection, const char *sender, const char *path,
                                 const char *interface, const char *member, GVariant *arguments,
                                 gpointer data);
  static gboolean on_retry(gpointer data);
  void subscribe();
  void connect_daemon();
  void handle_change(GVariant *arguments);
  void handle_sequence(GVariant *arguments);
  void handle_sent(GVariant *arguments);
  void handle_declared(std::uint32_t id, GVariant *entry);
  void fetch_declarations();

  Bus &bus_;
  Ports ports_;
  std::map<std::uint32_t, std::string> event_types_;
  guint control_ = 0;
  guint producer_ = 0;
  guint watch_ = 0;
  guint retry_ = 0;
};
