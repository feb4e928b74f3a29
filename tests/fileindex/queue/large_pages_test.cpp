#include "fileindex/queue/large_pages.h"

#include <gtest/gtest.h>
#include <sys/mman.h>

#include <cerrno>
#include <cstddef>
#include <memory>
#include <vector>

namespace quarry::fileindex {
namespace {

TEST(LargePagesTest, AskingForThemChangesNothing) {
  std::vector<char> memory(3 * kLargePage, 'm');
  errno = EAGAIN;
  PreferLargePages(memory.data(), memory.size());
  PreferLargePages(memory.data(), 10);
  PreferLargePages(memory.data(), 0);
  PreferLargePages(nullptr, 0);
  EXPECT_EQ(errno, EAGAIN);
  EXPECT_EQ(memory, std::vector<char>(3 * kLargePage, 'm'));
}

TEST(LargePagesTest, NoErrorIsLeftWhereNoMemoryIs) {
  constexpr std::size_t kSize = 3 * kLargePage;
  void* const place = mmap(nullptr, kSize, PROT_NONE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  ASSERT_NE(place, MAP_FAILED);
  ASSERT_EQ(munmap(place, kSize), 0);
  errno = 0;
  PreferLargePages(place, kSize);
  EXPECT_EQ(errno, 0);
}

TEST(LargePagesTest, ShortListsGrowByThemselves) {
  std::vector<int> list(10);
  list.shrink_to_fit();
  MakeRoom(list);
  EXPECT_EQ(list.capacity(), 10u);
}

TEST(LargePagesTest, LongListsGetTwiceTheRoomAndKeepTheirElements) {
  std::vector<std::unique_ptr<std::size_t>> list;
  const std::size_t count = kLargePage / sizeof(list[0]);
  list.reserve(count);
  while (list.size() < count) list.push_back(std::make_unique<std::size_t>(list.size()));
  MakeRoom(list);
  EXPECT_EQ(list.capacity(), 2 * count);
  ASSERT_EQ(list.size(), count);
  for (std::size_t i = 0; i < count; ++i) ASSERT_EQ(*list[i], i);
  list.push_back(nullptr);
  MakeRoom(list);
  EXPECT_EQ(list.capacity(), 2 * count);
}

}  // namespace
}  // namespace quarry::fileindex
