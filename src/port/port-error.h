// The two error domains of the daemon's interfaces, as the port layer sees them: a domain and a
// code. Which D-Bus error name a code travels under is the affair of the interfaces.
#pragma once

#include <glib.h>

enum IOControlError {
  IO_CONTROL_ERROR_GENERIC = 0,
  IO_CONTROL_ERROR_NO_PORT = 1,
  IO_CONTROL_ERROR_BUSY = 2,
  IO_CONTROL_ERROR_NOT_OUTPUT = 3,
  IO_CONTROL_ERROR_NOT_INPUT = 4,
  IO_CONTROL_ERROR_NOT_CONFIGURABLE = 5,
  IO_CONTROL_ERROR_INCORRECT_PORT_TYPE = 6,
};

enum IOSupervisedError {
  IO_SUPERVISED_ERROR_GENERIC = 0,
  IO_SUPERVISED_ERROR_NO_PORT = 1,
  IO_SUPERVISED_ERROR_NOT_SUPERVISABLE = 2,
  IO_SUPERVISED_ERROR_NOT_SUPERVISED = 3,
  IO_SUPERVISED_ERROR_BAD_RANGE = 4,
};

inline constexpr const char *kIOControlErrorQuark = "io-control-error-quark";
inline constexpr const char *kIOSupervisedErrorQuark = "io-supervised-error-quark";

// Any thread.
GQuark io_control_error_quark();
GQuark io_supervised_error_quark();
