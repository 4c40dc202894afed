// Precompiled for all files of a library. Every file still includes what it uses: the gcc build of
// scripts/test does without this header.
#include <gio/gio.h>

#include <algorithm>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>
