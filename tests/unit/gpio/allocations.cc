#include "allocations.h"

#include <cstdlib>
#include <new>

void *operator new(std::size_t size) {
  ++allocations;
  return std::malloc(size);
}

void operator delete(void *memory) noexcept {
  std::free(memory);
}

void operator delete(void *memory, std::size_t /*size*/) noexcept {
  std::free(memory);
}
