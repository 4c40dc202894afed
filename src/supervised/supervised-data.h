// What the private records of all supervised backends begin with: the pins, and how the line is
// watched.
#pragma once

#include <mutex>

#include "backends/edge-watch.h"
#include "backends/libugpio-utils.h"
#include "base/source.h"
#include "port/ioport.h"

struct SupervisedData : PortBackendData {
  GpioPinPtr io_ctrl;   // 1: the plain input path is connected
  GpioPinPtr sio_ctrl;  // 1: the line goes to the converter
  GpioPinPtr input;
  GpioPinPtr output;
  // For the pins' handles, since action threads drive the output. Nothing else is locked while it
  // is held.
  std::mutex pins_lock;
  EdgeWatch edges{pins_lock, G_IO_PRI};  // of the plain pin

  Source poll;
  // The entry of this port in what would be a table by port number. Held here it serves every
  // number, and ports that share one leave each other's alone.
  SupervisedRangeState last_state = SUPERVISED_STATE_UNDEFINED;

  bool initialised = false;  // set-up has succeeded and the port was not dropped since
};

inline SupervisedData *supervised_data(IOPort *port) {
  return static_cast<SupervisedData *>(io_port_backend_data(port));
}
