// The life of the daemon: start-up, main loop, shutdown.
#pragma once

// Runs the daemon until SIGTERM and returns its exit status: 0, or 1 when the settings file could
// not be read. Only the first argument is looked at: "--disable_legacy_interface" turns the legacy
// configuration bridge off.
int daemon_run(int argc, char **argv);
