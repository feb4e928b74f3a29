#include "fileindex/queue/name_table.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <random>
#include <unordered_map>

namespace quarry::fileindex {
namespace {

bool Any(std::uint32_t) {
  return true;
}

TEST(NameTableTest, NothingIsFoundInAnEmptyOne) {
  const NameTable table;
  table.Prefetch(7);
  EXPECT_EQ(table.Find(7, Any), NameTable::kNone);
}

TEST(NameTableTest, HashesThatAreAlikeAreToldApartByTheCaller) {
  NameTable table;
  for (std::uint32_t at = 0; at < 100; ++at) table.Add(0xffffffff, at);
  for (std::uint32_t at = 0; at < 100; ++at) {
    EXPECT_EQ(table.Find(0xffffffff, [at](std::uint32_t found) { return found == at; }), at);
  }
  EXPECT_EQ(table.Find(0xffffffff, [](std::uint32_t) { return false; }), NameTable::kNone);
  EXPECT_EQ(table.Find(0, Any), NameTable::kNone);
}

TEST(NameTableTest, RandomHashesAreFoundAsInAMap) {
  for (const std::uint32_t range : {0u, 1'000u, 0xffff0000u}) {
    std::mt19937 random(1);
    NameTable table;
    std::unordered_map<std::uint32_t, std::uint32_t> model;
    for (std::uint32_t at = 0; at < 4'000; ++at) {
      const auto hash =
          static_cast<std::uint32_t>(range == 1'000u ? random() % range : random() | range);
      if (model.emplace(hash, at).second) table.Add(hash, at);
      const auto other = static_cast<std::uint32_t>(hash + 1);
      const auto expected = model.find(other);
      ASSERT_EQ(table.Find(other, Any),
                expected == model.end() ? NameTable::kNone : expected->second);
    }
    for (const auto& [hash, at] : model) ASSERT_EQ(table.Find(hash, Any), at);
  }
}

}  // namespace
}  // namespace quarry::fileindex
