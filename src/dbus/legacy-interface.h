// Whether older configuration tools are served at all: their objects and their files stand and fall
// together. On unless the daemon was started without them. Main thread.
#pragma once

bool legacy_interface_enabled();
// Before anything has been served.
void legacy_interface_disable();
