#include "port/port-error.h"

GQuark io_control_error_quark() {
  return g_quark_from_static_string(kIOControlErrorQuark);
}

GQuark io_supervised_error_quark() {
  return g_quark_from_static_string(kIOSupervisedErrorQuark);
}
