#include "fileindex/queue/name_table.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <functional>
#include <random>
#include <set>
#include <string>
#include <string_view>
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

// A name as only somebody who means harm chooses it: those of one kind begin alike when hashed as
// the standard library does.
std::string CraftedName(std::mt19937& random) {
  std::string name;
  do {
    name = "file-" + std::to_string(random());
  } while ((std::hash<std::string>()(name) >> 24 & 0xff) != 0);
  return name;
}

TEST(NameTableTest, CraftedNamesDoNotFallTogether) {
  std::mt19937 random(1);
  std::array<int, 256> counts{};
  for (int i = 0; i < 10'000; ++i) ++counts[NameTable::HashOf(CraftedName(random)) >> 24];
  EXPECT_LT(*std::max_element(counts.begin(), counts.end()), 200);
}

// How many hashes a name's beginnings, and it with another byte at each place, have among them.
std::size_t CountHashes(std::size_t size) {
  std::set<std::uint32_t> met;
  std::string name(size, 'n');
  for (std::size_t length = 0; length <= size; ++length) {
    met.insert(NameTable::HashOf(std::string_view(name).substr(0, length)));
  }
  for (char& c : name) {
    c = 'm';
    met.insert(NameTable::HashOf(name));
    c = 'n';
  }
  return met.size();
}

TEST(NameTableTest, NamesOfAllLengthsHaveHashesOfTheirOwn) {
  const std::size_t hashes = CountHashes(40);
  // Chance alone lets two of so few meet once in a million runs; the same bytes always do.
  EXPECT_EQ(hashes, 81u);
  EXPECT_EQ(NameTable::HashOf(std::string(40, 'n')), NameTable::HashOf(std::string(40, 'n')));
}

// Where a name is hashed in several blocks, too, each byte counts, and where it stands.
TEST(NameTableTest, LongNamesHaveHashesOfTheirOwn) {
  const std::size_t hashes = CountHashes(600);
  // By chance two of so many meet once in a few thousand runs, and three pairs never.
  EXPECT_GE(hashes, 1201u - 2u);
}

TEST(NameTableTest, BytesPastTheNameDoNotCount) {
  const std::string name = "0123456789abcdefghijklmnopqrstuvwxyz";
  for (std::size_t length = 0; length < name.size(); ++length) {
    for (std::size_t begin = 0; begin + length <= name.size(); ++begin) {
      const std::string_view piece = std::string_view(name).substr(begin, length);
      ASSERT_EQ(NameTable::HashOf(piece), NameTable::HashOf(std::string(piece)));
    }
  }
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
