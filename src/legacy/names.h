// The names under which older configuration tools find the ports.
#pragma once

#include <string>

// The bus name, and the interface that every port has.
inline constexpr const char *kLegacyService = "com.kelv.Configuration.Legacy.IOControl1.IOPort";
inline constexpr const char *kLegacyInputInterface =
    "com.kelv.Configuration.Legacy.IOControl1.Input";
inline constexpr const char *kLegacyOutputInterface =
    "com.kelv.Configuration.Legacy.IOControl1.Output";

inline constexpr const char *kLegacyBasePath = "/com/kelv/Configuration/Legacy/IOControl/IOPort";

inline std::string legacy_object_path(int number) {
  return std::string(kLegacyBasePath) + '/' + std::to_string(number);
}
