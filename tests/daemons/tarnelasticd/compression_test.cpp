#include "daemons/tarnelasticd/compression.h"

#include <gtest/gtest.h>

#include <random>

#include "common/error.h"
#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::engine {
namespace {

TEST(CompressionTest, GivesBackEveryByte) {
  std::mt19937 random(2);
  for (const std::size_t size : {0U, 1U, 100U, 70000U, 3000000U}) {
    std::string bytes(size, 'x');
    for (std::size_t i = 0; i < size; i += 3) bytes[i] = static_cast<char>(random());
    EXPECT_EQ(Decompress(Compress(bytes)), bytes);
    EXPECT_EQ(Compress(bytes), Compress(bytes));
  }
  EXPECT_LT(Compress(std::string(100000, 'x')).size(), 200U);
}

TEST(CompressionTest, RefusesWhatItHasNotMade) {
  const std::string whole = Compress(std::string(1000, 'x') + "the end");
  for (std::size_t size = 0; size < whole.size(); ++size) {
    try {
      Decompress(whole.substr(0, size));
      ADD_FAILURE() << size;
    } catch (const Error& error) {
      EXPECT_TRUE(HasCode(error, kDamagedIndex));
    }
  }
  EXPECT_THROW(Decompress("no frame at all"), Error);
}

// Most of a frame of texts that hardly repeat are their bytes as they are.
TEST(CompressionTest, NoticesEveryChangedByte) {
  std::mt19937 random(3);
  std::string bytes(200, 'x');
  for (char& c : bytes) c = static_cast<char>(random());
  const std::string whole = Compress(bytes);
  for (std::size_t i = 0; i < whole.size(); ++i) {
    std::string damaged = whole;
    damaged[i] = static_cast<char>(damaged[i] ^ 1 << random() % 8);
    try {
      EXPECT_EQ(Decompress(damaged), bytes) << i;
    } catch (const Error& error) {
      EXPECT_TRUE(HasCode(error, kDamagedIndex));
    }
  }
}

}  // namespace
}  // namespace quarry::engine
