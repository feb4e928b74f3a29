#include "fileindex/queue/large_pages.h"

#include <sys/mman.h>

#include <cerrno>
#include <cstdint>

namespace quarry::fileindex {

void PreferLargePages(const void* memory, std::size_t bytes) {
  const auto begin = reinterpret_cast<std::uintptr_t>(memory);
  const std::uintptr_t first = (begin + kLargePage - 1) / kLargePage * kLargePage;
  const std::uintptr_t last = (begin + bytes) / kLargePage * kLargePage;
  if (first >= last) return;
  const int saved_errno = errno;
  madvise(reinterpret_cast<void*>(first), last - first, MADV_HUGEPAGE);
  errno = saved_errno;
}

}  // namespace quarry::fileindex
