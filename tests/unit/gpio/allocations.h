// Counts what the test program allocates: through malloc and its like, and in a build with a
// sanitizer through operator new alone.
#pragma once

#include <atomic>

inline std::atomic<int> allocations = 0;
