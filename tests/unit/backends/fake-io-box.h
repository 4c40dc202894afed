// The service that looks after I/O boxes, without a bus: whoever makes a proxy in this program
// talks to it. A box is connected, and all its ports are enabled and open.
#pragma once

#include <cstddef>

struct FakeIoBox {
  bool present = true;  // false: no proxy can be made
};

// The one of the process.
FakeIoBox &fake_io_box();

// Proxies that nobody has freed.
std::size_t io_box_proxies();
// Signals a new state of a port, "closed" for one, to every proxy.
void io_box_signals(int number, const char *state);
