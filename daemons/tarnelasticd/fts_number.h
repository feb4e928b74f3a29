// Numbers as FTS5 writes them.

#ifndef QUARRY_DAEMONS_TARNELASTICD_FTS_NUMBER_H_
#define QUARRY_DAEMONS_TARNELASTICD_FTS_NUMBER_H_

#include <cstdint>
#include <string>

namespace quarry::engine {

constexpr int kMaxVarint = 9;

// Writes what TakeVarint() reads, and returns its end. There must be room for kMaxVarint bytes.
inline char* PutVarint(char* at, std::uint64_t number) {
  if (number < 0x80) {
    *at++ = static_cast<char>(number);
    return at;
  }
  char groups[kMaxVarint];
  int count = 0;
  // The ninth byte, if there is one, has eight bits.
  if (number >> 56 != 0) {
    groups[count++] = static_cast<char>(number & 0xffU);
    number >>= 8;
    for (; count < kMaxVarint; number >>= 7) {
      groups[count++] = static_cast<char>(0x80U | (number & 0x7fU));
    }
  } else {
    groups[count++] = static_cast<char>(number & 0x7fU);
    for (number >>= 7; number != 0; number >>= 7) {
      groups[count++] = static_cast<char>(0x80U | (number & 0x7fU));
    }
  }
  while (count > 0) *at++ = groups[--count];
  return at;
}

inline void AppendVarint(std::string* out, std::uint64_t number) {
  char bytes[kMaxVarint];
  out->append(bytes, static_cast<std::size_t>(PutVarint(bytes, number) - bytes));
}

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_FTS_NUMBER_H_
