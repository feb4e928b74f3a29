#include "daemons/common/heap.h"

#include <malloc.h>

namespace quarry::daemon {

void KeepHeapSmall() {
#ifdef __GLIBC__
  // Each thread would get a heap of its own, and each heap keep what its largest moment took.
  mallopt(M_ARENA_MAX, 2);
  // Left to itself the library raises both bounds with each large block that is freed.
  mallopt(M_MMAP_THRESHOLD, 512 << 10);
  mallopt(M_TRIM_THRESHOLD, 1 << 20);
#endif
}

}  // namespace quarry::daemon
