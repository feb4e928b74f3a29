#include "daemons/tarnelasticd/text_hash.h"

#include <gtest/gtest.h>

#include <set>

namespace quarry::engine {
namespace {

// The key and the inputs of the function's published test vectors: bytes that count up from 0.
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
  EXPECT_EQ(Hex(TextHash(key, CountUp(0))), "a3817f04ba25a8e66df67214c7550293");
  EXPECT_EQ(Hex(TextHash(key, CountUp(1))), "da87c1d86b99af44347659119b22fc45");
  EXPECT_EQ(Hex(TextHash(key, CountUp(7))), "a1f1ebbed8dbc153c0b84aa61ff08239");
  EXPECT_EQ(Hex(TextHash(key, CountUp(8))), "3b62a9ba6258f5610f83e264f31497b4");
  EXPECT_EQ(Hex(TextHash(key, CountUp(15))), "5493e99933b0a8117e08ec0f97cfc3d9");
  EXPECT_EQ(Hex(TextHash(key, CountUp(63))), "5150d1772f50834a503e069a973fbd7c");
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
