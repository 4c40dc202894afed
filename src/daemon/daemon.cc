#include "daemon/daemon.h"

#include <glib-unix.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <string_view>

#include "backends/backends.h"
#include "base/glib-ptr.h"
#include "base/log.h"
#include "base/source.h"
#include "daemon/paths.h"
#include "daemon/privileges.h"
#include "dbus/iocontrol-conf-legacy-dbus.h"
#include "dbus/iocontrol-state.h"
#include "dbus/legacy-interface.h"
#include "dbus/legacy-mappings.h"
#include "events/event.h"
#include "events/manual-triggers.h"
#include "events/trigger-ports.h"
#include "hwdesc/hwdesc.h"
#include "platform/kv-log.h"
#include "port/ioport.h"
#include "port/port-registry.h"
#include "settings/param-legacy.h"
#include "settings/param.h"
#include "supervised/iosupervised.h"
#include "supervised/supervised-backends.h"

namespace {

struct Daemon {
  GMainLoopPtr loop;
  Source sigterm;
  Source sighup;
};

void read_arguments(int argc, char **argv) {
  if (argc > 1 && std::string_view(argv[1]) == "--disable_legacy_interface") {
    legacy_interface_disable();
  }
}

// Both signals arrive as main-loop sources, so logging and quitting are safe here.
gboolean on_sighup(gpointer /*user_data*/) {
  log_info("Got SIGHUP");
  return G_SOURCE_CONTINUE;
}

gboolean on_sigterm(gpointer user_data) {
  log_info("Got SIGTERM");
  g_main_loop_quit(static_cast<GMainLoop *>(user_data));
  return G_SOURCE_CONTINUE;
}

void install_signal_sources(Daemon &daemon) {
  // A log reader or a client that goes away must not take the daemon along.
  (void)std::signal(SIGPIPE, SIG_IGN);
  daemon.sigterm = Source(g_unix_signal_add(SIGTERM, on_sigterm, daemon.loop.get()));
  daemon.sighup = Source(g_unix_signal_add(SIGHUP, on_sighup, nullptr));
}

void load_hardware_description() {
  backends_register();
  supervised_backends_register();
  hwdesc_load_file(kHardwareDescription);
  legacy_remove_unfinished();
  hwdesc_load_directory(kHardwareFragments);
  hwdesc_finish();
}

void apply_settings() {
  port_registry_for_each([](IOPort *ioport) { param_get_conf_vals(ioport); });
  param_free_configuration();
}

bool legacy_export_present() {
  return g_file_test(kLegacyExport, G_FILE_TEST_IS_REGULAR);
}

// Settings of an earlier version. Read before the settings file, which therefore wins.
void merge_earlier_settings() {
  if (legacy_export_present() && param_read_configuration(kEarlierSettings)) {
    apply_settings();
    unlink(kEarlierSettings);
  }
}

bool read_settings() {
  if (!param_read_configuration(kSettingsFile)) {
    log_warning("Could not read configuration file\n");
    return false;
  }
  apply_settings();
  return true;
}

void import_legacy_export() {
  if (legacy_export_present()) {
    Error ignored;  // what could be read counts, and older firmware can't be told of the rest
    param_import_parhand(kLegacyExport, ignored.out());
  }
}

// Once before the settings are stored and, for a file that this start has made, once after: what
// root leaves behind, the service account must be able to read and replace.
void store_settings() {
  const bool existed = access(kSettingsFile, F_OK) == 0;
  if (existed) {
    param_chown_to_service_user(kSettingsFile);
  }
  import_legacy_export();
  port_registry_assign_default_names();
  param_save_all(kSettingsFile);
  if (!existed && access(kSettingsFile, F_OK) == 0) {
    param_chown_to_service_user(kSettingsFile);
  }
}

// Everything that needs root. False: the settings file can't be read.
bool bring_up_ports() {
  load_hardware_description();
  merge_earlier_settings();
  if (!read_settings()) {
    return false;
  }
  store_settings();
  port_registry_setup_all();
  if (legacy_interface_enabled()) {
    legacy_write_mappings();
  }
  return true;
}

void start_manual_triggers() {
  if (const auto first = hwdesc_first_virtual_input()) {
    manual_trigger_configure(*first);
  }
  manual_trigger_start();
}

// From here on as the service account.
void go_public() {
  io_events_start();
  iocontrol_state_start();
  iosupervised_start();
  if (legacy_interface_enabled()) {
    iocontrol_conf_legacy_dbus_create();
  }
  port_registry_arm_watches();
  port_registry_declare_events();
  start_manual_triggers();
}

void shut_down(Daemon &daemon) {
  if (legacy_interface_enabled()) {
    iocontrol_conf_legacy_dbus_destroy();
  }
  iosupervised_stop();
  iocontrol_state_stop();
  manual_trigger_clear();
  manual_trigger_stop();
  daemon.sigterm.reset();
  daemon.sighup.reset();
  port_registry_drop_all();
  io_events_stop();
  iocontrol_state_flush();
}

}  // namespace

int daemon_run(int argc, char **argv) {
  read_arguments(argc, argv);
  // Whoever collects the output is to see each line when it is written.
  (void)std::setvbuf(stdout, nullptr, _IOLBF, 0);
  kv_log_stdout();
  Daemon daemon;
  daemon.loop.reset(g_main_loop_new(nullptr, FALSE));
  install_signal_sources(daemon);
  if (!bring_up_ports()) {
    port_registry_drop_all();
    return 1;
  }
  drop_privileges();
  go_public();
  g_main_loop_run(daemon.loop.get());
  shut_down(daemon);
  return 0;
}
