// The objects through which older configuration tools see the ports: one a port, up to the number
// of the first virtual input, and always one for port 0. Main thread.
//
// Tools that find neither the bus, nor the objects, nor their name have no daemon to speak to, so
// these three failures end it.
#pragma once

// Puts the objects of the ports in service on the system bus, announces the counts and owns the
// name. They must not be there already.
void iocontrol_conf_legacy_dbus_create();

// Withdraws name and objects, which must be there.
void iocontrol_conf_legacy_dbus_destroy();
