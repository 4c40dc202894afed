// Precompiled for all files of a test program. Every file still includes what it uses: the gcc
// build of scripts/test does without this header.
#include <gio/gio.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>
