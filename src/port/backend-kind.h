// The kinds of backend that a port can have. Fixed: the numbers.
#pragma once

enum BackendKind : int {
  BACKEND_VIRTUAL = 0,  // exists in memory only: clients report its state, nothing drives it
  BACKEND_GPIO = 1,
  BACKEND_SPIADC = 2,
  BACKEND_SPI = 3,
  BACKEND_IIO = 4,
  BACKEND_IIO_INTERRUPT = 5,
  BACKEND_SYSFS = 6,
  BACKEND_IOBOX = 7,
  BACKEND_NULL = 8,
  BACKEND_CHECK = 9,
};
