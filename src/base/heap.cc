#include "base/heap.h"

#include <cstdlib>
#ifdef __GLIBC__
#include <malloc.h>
#endif

void heap_trim() {
#ifdef __GLIBC__
  malloc_trim(0);
#endif
}
