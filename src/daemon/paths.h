// Where the daemon finds its files. The settings file is named in settings/param.h.
#pragma once

inline constexpr const char *kHardwareDescription = "/usr/share/portd/conf.xml";
inline constexpr const char *kHardwareFragments = "/etc/portd.d/";
// Left by the system once after an upgrade from older firmware: settings to take over.
inline constexpr const char *kLegacyExport = "/tmp/portd_ioport.conf";
inline constexpr const char *kEarlierSettings = "/etc/dynamic/portd/params.conf";
