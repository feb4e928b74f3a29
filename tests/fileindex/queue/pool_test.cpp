#include "fileindex/queue/pool.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <memory>
#include <random>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

namespace quarry::fileindex {
namespace {

constexpr std::size_t kChunk = std::size_t{2} << 20;

struct Large {
  std::array<char, 1000> bytes{};
};

std::size_t ChunkOf(const void* place) {
  return reinterpret_cast<std::uintptr_t>(place) / kChunk;
}

TEST(PoolTest, AnUnusedOneTakesNothing) {
  const std::size_t before = Pool::BytesInUse();
  const Pool pool;
  EXPECT_EQ(Pool::BytesInUse(), before);
}

TEST(PoolTest, ObjectsAreMadeOfTheirArgumentsAndDestroyed) {
  Pool pool;
  const auto content = std::make_shared<int>(1);
  auto pair =
      pool.Make<std::pair<std::string, std::shared_ptr<int>>>(std::string(100, 'x'), content);
  EXPECT_EQ(pair->first, std::string(100, 'x'));
  EXPECT_EQ(content.use_count(), 2);
  pair.reset();
  EXPECT_EQ(content.use_count(), 1);
}

TEST(PoolTest, ObjectsLieOneBehindTheOther) {
  Pool pool;
  std::vector<std::shared_ptr<std::uint64_t>> made;
  for (std::uint64_t i = 0; i < 100; ++i) made.push_back(pool.Make<std::uint64_t>(i));
  const auto step = reinterpret_cast<std::uintptr_t>(made[1].get()) -
                    reinterpret_cast<std::uintptr_t>(made[0].get());
  for (std::size_t i = 1; i < made.size(); ++i) {
    EXPECT_EQ(*made[i], i);
    EXPECT_EQ(reinterpret_cast<std::uintptr_t>(made[i].get()),
              reinterpret_cast<std::uintptr_t>(made[i - 1].get()) + step);
  }
  EXPECT_LE(step, 32u);
}

TEST(PoolTest, OddSizesLeaveTheNextObjectAligned) {
  Pool pool;
  const auto odd = pool.Make<std::array<char, 13>>();
  const auto next = pool.Make<std::uint64_t>(7);
  EXPECT_EQ(reinterpret_cast<std::uintptr_t>(next.get()) % alignof(std::uint64_t), 0u);
}

TEST(PoolTest, AChunkGoesWhenItIsDoneWithAndEmpty) {
  const std::size_t before = Pool::BytesInUse();
  {
    Pool pool;
    auto first = pool.Make<Large>();
    EXPECT_EQ(Pool::BytesInUse(), before + kChunk);
    first.reset();
    EXPECT_EQ(Pool::BytesInUse(), before + kChunk);  // the next object comes there
    std::vector<std::shared_ptr<Large>> made(1, pool.Make<Large>());
    while (ChunkOf(made.front().get()) == ChunkOf(made.back().get())) {
      made.push_back(pool.Make<Large>());
    }
    EXPECT_GT(made.size(), 1900u);
    EXPECT_EQ(Pool::BytesInUse(), before + 2 * kChunk);
    made.erase(made.begin(), made.end() - 1);
    EXPECT_EQ(Pool::BytesInUse(), before + kChunk);
  }
  EXPECT_EQ(Pool::BytesInUse(), before);
}

TEST(PoolTest, ObjectsOutliveTheirPool) {
  const std::size_t before = Pool::BytesInUse();
  auto pool = std::make_unique<Pool>();
  auto kept = pool->Make<std::string>(100, 'k');
  pool.reset();
  EXPECT_EQ(*kept, std::string(100, 'k'));
  EXPECT_EQ(Pool::BytesInUse(), before + kChunk);
  std::thread([&kept] { kept.reset(); }).join();
  EXPECT_EQ(Pool::BytesInUse(), before);
}

struct Throwing {
  Throwing() { throw std::runtime_error("not made"); }
};

TEST(PoolTest, WhatCouldNotBeMadeHoldsNothing) {
  const std::size_t before = Pool::BytesInUse();
  auto pool = std::make_unique<Pool>();
  EXPECT_THROW(pool->Make<Throwing>(), std::runtime_error);
  pool.reset();
  EXPECT_EQ(Pool::BytesInUse(), before);
}

// Objects of one pool that hold the next object of another one.
struct Link {
  explicit Link(Pool* other) : next(other != nullptr ? other->Make<Link>(nullptr) : nullptr) {}
  std::shared_ptr<Link> next;
};

TEST(PoolTest, OnePoolIsUsedWhileAnotherMakesAnObject) {
  const std::size_t before = Pool::BytesInUse();
  {
    Pool outer;
    Pool inner;
    const auto link = outer.Make<Link>(&inner);
    const auto after = outer.Make<Link>(nullptr);
    EXPECT_EQ(ChunkOf(link.get()), ChunkOf(after.get()));
    EXPECT_NE(ChunkOf(link.get()), ChunkOf(link->next.get()));
  }
  EXPECT_EQ(Pool::BytesInUse(), before);
}

TEST(PoolTest, ObjectsKeepTheirBytesWhateverElseComesAndGoes) {
  const std::size_t before = Pool::BytesInUse();
  {
    std::mt19937 random(1);
    Pool pool;
    std::vector<std::shared_ptr<Large>> kept;
    std::vector<char> fill;
    for (int i = 0; i < 20'000; ++i) {
      if (!kept.empty() && random() % 2 == 0) {
        const std::size_t at = random() % kept.size();
        const auto is_same = [&](char byte) { return byte == fill[at]; };
        ASSERT_TRUE(std::all_of(kept[at]->bytes.begin(), kept[at]->bytes.end(), is_same));
        kept.erase(kept.begin() + static_cast<std::ptrdiff_t>(at));
        fill.erase(fill.begin() + static_cast<std::ptrdiff_t>(at));
      } else {
        kept.push_back(pool.Make<Large>());
        fill.push_back(static_cast<char>(random()));
        kept.back()->bytes.fill(fill.back());
      }
    }
  }
  EXPECT_EQ(Pool::BytesInUse(), before);
}

}  // namespace
}  // namespace quarry::fileindex
