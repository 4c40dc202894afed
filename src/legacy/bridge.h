// The bridge to older configuration tools: whether it is up, and its life. The tools see the ports
// as objects, one a port up to the number of the first virtual input, and always one for port 0.
// Main thread.
//
// Tools that find neither the bus, nor the objects, nor their name have no daemon to speak to, so
// these three failures end it. A bus that goes away later, or SIGTERM while the bus does not
// answer, leaves the bridge down instead: the daemon ends in order then.
#pragma once

// Objects and files stand and fall together. On unless the daemon was started without them.
bool legacy_interface_enabled();
// Before anything has been served.
void legacy_interface_disable();

// Puts the objects of the ports in service on the system bus, announces the counts and owns the
// name. They must not be there already.
void iocontrol_conf_legacy_dbus_create();
// Withdraws name and objects, which must be there.
void iocontrol_conf_legacy_dbus_destroy();

// Has objects and files name exactly the ports in service again. Nothing while the bridge is off.
void legacy_interface_renew();
