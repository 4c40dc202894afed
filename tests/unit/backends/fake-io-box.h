// The service that looks after I/O boxes, without a bus: whoever makes a proxy in this program
// talks to it. A box is connected, and all its ports are enabled and open.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

// Set while nobody calls it.
struct FakeIoBox {
  bool present = true;         // false: no proxy can be made, and no call is answered
  std::string state = "open";  // of every port
  std::string hangs_in;        // calls of this method wait until they are let go or cancelled
};

// Calls for this port are answered at any time, and not kept.
inline constexpr int kSilentBoxPort = -99;

// The one of the process.
FakeIoBox &fake_io_box();

// The calls so far, which are then forgotten: "SetIOMode (1, 0, 'in')".
std::vector<std::string> io_box_calls();
// Waits until a call hangs. False: none does in a time that is long for every machine.
[[nodiscard]] bool io_box_hangs();
// Lets the calls that hang go on, and those to come.
void io_box_recovers();
// The process of the service is another one from now on.
void io_box_restarts();

// Proxies that nobody has freed.
std::size_t io_box_proxies();
// Signals a new state of a port, "closed" for one, to every proxy.
void io_box_signals(int number, const char *state);
