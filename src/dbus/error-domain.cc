#include "dbus/error-domain.h"

#include <gio/gio.h>

#include <iterator>

#include "port/port-error.h"

namespace {

constexpr GDBusErrorEntry kControlErrors[] = {
    {IO_CONTROL_ERROR_GENERIC, "com.kelv.IOControl.Error.Generic"},
    {IO_CONTROL_ERROR_NO_PORT, "com.kelv.IOControl.Error.No_port"},
    {IO_CONTROL_ERROR_BUSY, "com.kelv.IOControl.Error.Busy"},
    {IO_CONTROL_ERROR_NOT_OUTPUT, "com.kelv.IOControl.Error.Not_output"},
    {IO_CONTROL_ERROR_NOT_INPUT, "com.kelv.IOControl.Error.Not_input"},
    {IO_CONTROL_ERROR_NOT_CONFIGURABLE, "com.kelv.IOControl.Error.Not_configurable"},
    {IO_CONTROL_ERROR_INCORRECT_PORT_TYPE, "com.kelv.IOControl.Error.Incorrect_Port_Type"},
};

// Fixed: the last three lack the ".Error" of the others.
constexpr GDBusErrorEntry kSupervisedErrors[] = {
    {IO_SUPERVISED_ERROR_GENERIC, "com.kelv.IOSupervised.Error.Generic"},
    {IO_SUPERVISED_ERROR_NO_PORT, "com.kelv.IOSupervised.Error.No_port"},
    {IO_SUPERVISED_ERROR_NOT_SUPERVISABLE, "com.kelv.IOSupervised.Not_supervisable"},
    {IO_SUPERVISED_ERROR_NOT_SUPERVISED, "com.kelv.IOSupervised.Not_supervised"},
    {IO_SUPERVISED_ERROR_BAD_RANGE, "com.kelv.IOSupervised.Bad_supervised_range"},
};

}  // namespace

void io_error_domains_register() {
  static gsize control_quark = 0;
  static gsize supervised_quark = 0;
  g_dbus_error_register_error_domain(kIOControlErrorQuark, &control_quark, kControlErrors,
                                     std::size(kControlErrors));
  g_dbus_error_register_error_domain(kIOSupervisedErrorQuark, &supervised_quark, kSupervisedErrors,
                                     std::size(kSupervisedErrors));
}
