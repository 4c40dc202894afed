// The connector interface: which of the ports that sense a connector are plugged in.
#pragma once

#include <gio/gio.h>

inline constexpr const char *kConnectorName = "com.kelv.PCD.Connector";

// Exports the object on the connection of the control interface. Main thread.
void connector_export(GDBusConnection *connection);
void connector_withdraw();
