// Counts what the test program allocates through operator new.
#pragma once

#include <atomic>

inline std::atomic<int> allocations = 0;
