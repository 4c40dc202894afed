// Giving up root.
#pragma once

// Becomes the service account, user and group "pcd". The first step that fails is said on standard
// error and ends the attempt; the daemon then carries on with the identity that it has. Main
// thread; GLib's own threads change with it.
void drop_privileges();
