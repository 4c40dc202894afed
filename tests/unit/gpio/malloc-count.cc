// Counts what the whole test program allocates, its libraries included: what is called malloc here
// takes precedence over the C library's. Not for sanitizers, which bring a malloc of their own.
#include <cstddef>

#include "allocations.h"

void *counted_malloc(std::size_t size) asm("malloc");
void *counted_calloc(std::size_t count, std::size_t size) asm("calloc");
void *counted_realloc(void *memory, std::size_t size) asm("realloc");
// The C library's functions under their second names.
void *real_malloc(std::size_t size) asm("__libc_malloc");
void *real_calloc(std::size_t count, std::size_t size) asm("__libc_calloc");
void *real_realloc(void *memory, std::size_t size) asm("__libc_realloc");

void *counted_malloc(std::size_t size) {
  ++allocations;
  return real_malloc(size);
}

void *counted_calloc(std::size_t count, std::size_t size) {
  ++allocations;
  return real_calloc(count, size);
}

void *counted_realloc(void *memory, std::size_t size) {
  ++allocations;
  return real_realloc(memory, size);
}
