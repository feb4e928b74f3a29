// Fewer pages for much memory.

#ifndef QUARRY_FILEINDEX_QUEUE_LARGE_PAGES_H_
#define QUARRY_FILEINDEX_QUEUE_LARGE_PAGES_H_

#include <algorithm>
#include <cstddef>
#include <iterator>
#include <vector>

namespace quarry::fileindex {

// The size of a large page, and its alignment.
inline constexpr std::size_t kLargePage = std::size_t{2} << 20;

// Asks the system to give large pages for those that lie in this memory whole, which has not been
// written to yet: one is given in a fraction of the time that as many small ones take.
void PreferLargePages(const void* memory, std::size_t bytes);

// Makes room for one more element. What a list needs while it is short is left to the list.
template <typename T>
void MakeRoom(std::vector<T>& list) {
  if (list.size() < list.capacity() || list.capacity() * sizeof(T) < kLargePage) return;
  std::vector<T> longer;
  longer.reserve(2 * list.capacity());
  PreferLargePages(longer.data(), longer.capacity() * sizeof(T));
  std::move(list.begin(), list.end(), std::back_inserter(longer));
  list.swap(longer);
}

}  // namespace quarry::fileindex

#endif  // QUARRY_FILEINDEX_QUEUE_LARGE_PAGES_H_
