// The daemon's log. Every message starts with the daemon's log prefix, so that a device which runs
// several instances can tell them apart; a single instance has an empty one.
//
// There is no macro for GLib's error level on purpose: that level always ends the process, which is
// what base/fatal.h is for.
#pragma once

#include <glib.h>

inline constexpr const char *kLogPrefix = "";

// The first level that GLib leaves to the application; the device's log collector files it below
// debug messages.
inline constexpr auto kLogLevelUser = static_cast<GLogLevelFlags>(1 << G_LOG_LEVEL_USER_SHIFT);

#define log_at(level, format, ...) \
  g_log(G_LOG_DOMAIN, (level), "%s" format, kLogPrefix __VA_OPT__(, ) __VA_ARGS__)
#define log_critical(...) log_at(G_LOG_LEVEL_CRITICAL, __VA_ARGS__)
#define log_warning(...) log_at(G_LOG_LEVEL_WARNING, __VA_ARGS__)
#define log_info(...) log_at(G_LOG_LEVEL_INFO, __VA_ARGS__)
#define log_user(...) log_at(kLogLevelUser, __VA_ARGS__)
