#include "daemon/daemon.h"

#include <fcntl.h>
#include <glib-unix.h>
#include <sys/resource.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdint>
#include <cstdio>
#include <optional>
#include <string>
#include <string_view>

#include "base/glib-ptr.h"
#include "base/heap.h"
#include "base/log.h"
#include "base/main-queue.h"
#include "base/source.h"
#include "base/termination.h"
#include "base/worker.h"
#include "daemon/backends.h"
#include "daemon/paths.h"
#include "daemon/privileges.h"
#include "daemon/watchdog.h"
#include "dbus/connector.h"
#include "dbus/iocontrol-state.h"
#include "dbus/iosupervised.h"
#include "dbus/system-bus.h"
#include "events/event.h"
#include "events/manual-triggers.h"
#include "events/trigger-ports.h"
#include "hwdesc/hwdesc.h"
#include "legacy/bridge.h"
#include "legacy/mappings.h"
#include "platform/kv-log.h"
#include "port/ioport.h"
#include "port/port-registry.h"
#include "settings/param-legacy.h"
#include "settings/param.h"
#include "settings/storage-writer.h"

namespace {

// A little less than what the daemon has to end.
constexpr std::int64_t kStorageTimeoutUs = 4'000'000;
constexpr guint kStartSeconds = 1;

struct Daemon {
  GMainLoopPtr loop;
  bool ending = false;
  Source sigterm;
  Source sighup;
};

void read_arguments(int argc, char **argv) {
  if (argc > 1 && std::string_view(argv[1]) == "--disable_legacy_interface") {
    legacy_interface_disable();
  }
}

// A file or a connection that is opened later must not become the log.
void open_standard_descriptors() {
  for (const int fd : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    if (fcntl(fd, F_GETFD) < 0 && errno == EBADF) {
      // The lowest number that is free, so the one that is looked for.
      (void)open("/dev/null", O_RDWR);
    }
  }
}

// Both signals arrive as main-loop sources, so logging and quitting are safe here.
gboolean on_sighup(gpointer /*user_data*/) {
  log_info("Got SIGHUP");
  return G_SOURCE_CONTINUE;
}

// Start-up may be waiting for a service, with the loop not running yet.
gboolean on_sigterm(gpointer user_data) {
  log_info("Got SIGTERM");
  auto *daemon = static_cast<Daemon *>(user_data);
  daemon->ending = true;
  Worker::stop_all();
  g_main_loop_quit(daemon->loop.get());
  return G_SOURCE_CONTINUE;
}

// Messages may bring descriptors along, and every device takes one: none of them is to keep the
// settings from being saved.
void raise_descriptor_limit() {
  rlimit limit{};
  if (getrlimit(RLIMIT_NOFILE, &limit) == 0 && limit.rlim_cur < limit.rlim_max) {
    limit.rlim_cur = limit.rlim_max;
    (void)setrlimit(RLIMIT_NOFILE, &limit);
  }
}

bool install_signal_sources(Daemon &daemon) {
  // A log reader or a client that goes away must not take the daemon along.
  (void)std::signal(SIGPIPE, SIG_IGN);
  daemon.sigterm = Source(g_unix_signal_add(SIGTERM, on_sigterm, &daemon));
  daemon.sighup = Source(g_unix_signal_add(SIGHUP, on_sighup, nullptr));
  return termination_watch();
}

void load_hardware_description() {
  backends_register();
  hwdesc_load_file(kHardwareDescription);
  legacy_remove_unfinished();
  hwdesc_load_directory(kHardwareFragments);
  hwdesc_finish();
}

void apply_settings() {
  port_registry_for_each([](IOPort *port) { param_get_conf_vals(port); });
  param_free_configuration();
}

// Settings of an earlier version. Read before the settings file, which therefore wins.
void merge_earlier_settings() {
  if (param_read_configuration(kEarlierSettings)) {
    apply_settings();
    unlink(kEarlierSettings);
  }
}

bool read_settings() {
  param_remove_unfinished(kSettingsFile);
  if (!param_read_configuration(kSettingsFile)) {
    log_warning("Could not read configuration file\n");
    return false;
  }
  apply_settings();
  return true;
}

bool exists(const char *path) {
  return access(path, F_OK) == 0 || errno != ENOENT;
}

// What could be read counts, and older firmware can't be told of the rest.
void import_legacy_export(const std::string &text) {
  Error ignored;
  param_import_parhand_text(text, ignored.out());
}

// Once before the settings are stored and, for a file that this start has made, once after: what
// root leaves behind, the service account must be able to read and replace.
void store_settings(const std::optional<std::string> &legacy_export) {
  const bool existed = exists(kSettingsFile);
  if (existed) {
    param_chown_to_service_user(kSettingsFile);
  }
  if (legacy_export) {
    import_legacy_export(*legacy_export);
  }
  port_registry_assign_default_names();
  param_save_all(kSettingsFile);
  if (!existed && exists(kSettingsFile)) {
    param_chown_to_service_user(kSettingsFile);
  }
}

// Everything that needs root. False: the settings file can't be read.
bool set_up_ports() {
  load_hardware_description();
  // Read once: who may write its folder could put another file there meanwhile.
  const auto legacy_export = param_read_parhand(kLegacyExport);
  if (legacy_export) {
    merge_earlier_settings();
  }
  if (!read_settings()) {
    return false;
  }
  store_settings(legacy_export);
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

gboolean on_started(gpointer /*user_data*/) {
  heap_trim();
  return G_SOURCE_REMOVE;
}

// From here on as the service account.
void start_services() {
  io_events_start();
  iocontrol_state_start();
  connector_start();
  iosupervised_start();
  if (legacy_interface_enabled()) {
    iocontrol_conf_legacy_dbus_create();
  }
  port_registry_arm_watches();
  port_registry_declare_events();
  port_registry_log_service();
  start_manual_triggers();
  // When the documents are forgotten and the events have left for the bus.
  g_timeout_add_seconds(kStartSeconds, on_started, nullptr);
}

// What storage has not taken by then is lost.
void finish_saving(std::int64_t deadline_us) {
  if (!storage_writer_finish(deadline_us)) {
    log_warning("Storage does not respond: the latest settings are lost");
    _exit(0);  // a return would wait for the thread's files, or take away what it uses
  }
}

void shut_down(Daemon &daemon) {
  const std::int64_t deadline_us = g_get_monotonic_time() + kStorageTimeoutUs;
  // Calls to other services were cancelled: answers their callers, saves their settings.
  run_posted_work();
  if (legacy_interface_enabled()) {
    iocontrol_conf_legacy_dbus_destroy();
  }
  iosupervised_stop();
  iocontrol_state_stop();
  connector_stop();
  manual_trigger_clear();
  manual_trigger_stop();
  daemon.sigterm.reset();
  daemon.sighup.reset();
  port_registry_drop_all();
  io_events_stop();
  system_bus_flush();
  finish_saving(deadline_us);
}

}  // namespace

int daemon_run(int argc, char **argv) {
  open_standard_descriptors();
  read_arguments(argc, argv);
  // Each line of the output is to be seen when it is written.
  (void)std::setvbuf(stdout, nullptr, _IOLBF, 0);
  kv_log_stdout();
  raise_descriptor_limit();
  Daemon daemon;
  daemon.loop.reset(g_main_loop_new(nullptr, FALSE));
  if (!install_signal_sources(daemon)) {
    return 1;
  }
  if (!set_up_ports()) {
    port_registry_drop_all();
    return 1;
  }
  if (daemon.ending) {
    port_registry_drop_all();
    return 0;
  }
  drop_privileges();
  start_services();
  const Watchdog watchdog;
  g_main_loop_run(daemon.loop.get());
  shut_down(daemon);
  return 0;
}
