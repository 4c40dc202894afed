// Memory that the allocator keeps for later though nobody may need as much again.
#pragma once

// Gives the system back what the heap holds and does not use, where the C library can. Takes a
// moment: for the end of something that needed a lot. Any thread.
void heap_trim();
