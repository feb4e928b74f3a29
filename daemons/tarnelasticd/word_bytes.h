// Comparing words, and numbers that stand for them in tables of this process.

#ifndef QUARRY_DAEMONS_TARNELASTICD_WORD_BYTES_H_
#define QUARRY_DAEMONS_TARNELASTICD_WORD_BYTES_H_

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>

namespace quarry::engine {

inline std::uint64_t LoadBytes(const char* at, std::size_t size) {
  std::uint64_t bytes = 0;
  if (size == sizeof(std::uint64_t)) {
    std::memcpy(&bytes, at, sizeof(std::uint64_t));
  } else {
    std::memcpy(&bytes, at, sizeof(std::uint32_t));
  }
  return bytes;
}

// Up to eight bytes as one number. Loads that overlap are cheaper than one of any size.
inline std::uint64_t LoadShort(const char* at, std::size_t size) {
  if (size == 8) return LoadBytes(at, 8);
  if (size >= 4) return LoadBytes(at, 4) | LoadBytes(at + size - 4, 4) << 32;
  if (size == 0) return 0;
  const auto byte = [at](std::size_t i) {
    return std::uint64_t{static_cast<unsigned char>(at[i])};
  };
  return byte(0) | byte(size / 2) << 8 | byte(size - 1) << 16;
}

inline std::uint64_t MixBytes(std::uint64_t hash, std::uint64_t bytes) {
  hash = (hash ^ bytes) * 0x9e3779b97f4a7c15U;
  return hash ^ hash >> 32;
}

inline std::uint64_t HashWord(std::string_view word, std::uint64_t seed) {
  std::uint64_t hash = MixBytes(seed, word.size());
  for (; word.size() > 8; word.remove_prefix(8)) hash = MixBytes(hash, LoadBytes(word.data(), 8));
  return MixBytes(MixBytes(hash, LoadShort(word.data(), word.size())), seed);
}

// Nearly all words are that short, for which a call would cost more than the comparison.
inline bool AreEqualWords(const char* a, const char* b, std::size_t size) {
  if (size <= 8) return LoadShort(a, size) == LoadShort(b, size);
  if (size > 16) return std::memcmp(a, b, size) == 0;
  return LoadBytes(a, 8) == LoadBytes(b, 8) &&
         LoadBytes(a + size - 8, 8) == LoadBytes(b + size - 8, 8);
}

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_WORD_BYTES_H_
