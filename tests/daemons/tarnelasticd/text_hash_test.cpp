#include "daemons/tarnelasticd/text_hash.h"

#include <gtest/gtest.h>

#include <set>

namespace quarry::engine {
namespace {

// The key and the inputs of which another program told the hashes: bytes that count up from 0.
std::string CountUp(std::size_t size) {
  std::string bytes;
  for (std::size_t i = 0; i < size; ++i) bytes += static_cast<char>(i);
  return bytes;
}

std::string Hex(const std::string& bytes) {
  constexpr char kDigits[] = "0123456789abcdef";
  std::string hex;
  for (const char c : bytes) {
    const auto byte = static_cast<unsigned char>(c);
    hex += kDigits[byte >> 4];
    hex += kDigits[byte & 15];
  }
  return hex;
}

TEST(TextHashTest, IsThePublishedFunction) {
  const std::string key = CountUp(kHashKeyBytes);
  EXPECT_EQ(Hex(TextHash(key, CountUp(0))), "083aac7ba77bc664005d821eb8bfa4d9");
  EXPECT_EQ(Hex(TextHash(key, CountUp(1))), "b8debbaa94db1228c038dc59cdf5731e");
  EXPECT_EQ(Hex(TextHash(key, CountUp(7))), "53b67533cf790015752bb3f2bb7205e6");
  EXPECT_EQ(Hex(TextHash(key, CountUp(8))), "73b0e11b7da30a83c3a306d53f5742e6");
  EXPECT_EQ(Hex(TextHash(key, CountUp(15))), "0c7c9c3922d41a7b2b3b20f92685d560");
  EXPECT_EQ(Hex(TextHash(key, CountUp(63))), "716c0003b0d84332b6bf17e556d0450c");
}

TEST(TextHashTest, TellsTextsApart) {
  const std::string key = RandomHashKey();
  std::set<std::string> hashes;
  for (std::size_t size = 0; size < 300; ++size) hashes.insert(TextHash(key, CountUp(size)));
  for (std::size_t size = 1; size < 300; ++size) {
    hashes.insert(TextHash(key, std::string(size, '\0')));
  }
  EXPECT_EQ(hashes.size(), 598U);  // one zero byte is the first of those that count up
}

TEST(TextHashTest, DependsOnTheKey) {
  EXPECT_NE(RandomHashKey(), RandomHashKey());
  EXPECT_NE(TextHash(RandomHashKey(), "text"), TextHash(RandomHashKey(), "text"));
}

}  // namespace
}  // namespace quarry::engine
