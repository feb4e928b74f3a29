#include "daemons/tarnelasticd/text_hash.h"

#include <sys/random.h>

#include <bit>
#include <cstdint>
#include <cstring>

#include "common/error.h"

namespace quarry::engine {
namespace {

constexpr std::size_t kWordBytes = sizeof(std::uint64_t);

std::uint64_t LoadWord(const char* bytes) {
  std::uint64_t word = 0;
  std::memcpy(&word, bytes, kWordBytes);
  static_assert(std::endian::native == std::endian::little);
  return word;
}

void AppendWord(std::string* bytes, std::uint64_t word) {
  bytes->append(reinterpret_cast<const char*>(&word), kWordBytes);
}

struct State {
  std::uint64_t v0, v1, v2, v3;

  void Rounds(int count) {
    for (; count > 0; --count) {
      v0 += v1;
      v2 += v3;
      v1 = std::rotl(v1, 13) ^ v0;
      v3 = std::rotl(v3, 16) ^ v2;
      v0 = std::rotl(v0, 32);
      v2 += v1;
      v0 += v3;
      v1 = std::rotl(v1, 17) ^ v2;
      v3 = std::rotl(v3, 21) ^ v0;
      v2 = std::rotl(v2, 32);
    }
  }

  void Take(std::uint64_t word) {
    v3 ^= word;
    Rounds(2);
    v0 ^= word;
  }

  std::uint64_t Sum() const { return v0 ^ v1 ^ v2 ^ v3; }
};

}  // namespace

std::string TextHash(std::string_view key, std::string_view text) {
  const std::uint64_t k0 = LoadWord(key.data());
  const std::uint64_t k1 = LoadWord(key.data() + kWordBytes);
  State state{k0 ^ 0x736f6d6570736575U, k1 ^ 0x646f72616e646f6dU ^ 0xeeU, k0 ^ 0x6c7967656e657261U,
              k1 ^ 0x7465646279746573U};
  std::uint64_t last = std::uint64_t{text.size()} << 56;
  for (; text.size() >= kWordBytes; text.remove_prefix(kWordBytes)) {
    state.Take(LoadWord(text.data()));
  }
  for (std::size_t i = 0; i < text.size(); ++i) {
    last |= std::uint64_t{static_cast<unsigned char>(text[i])} << (8 * i);
  }
  state.Take(last);
  std::string hash;
  state.v2 ^= 0xeeU;
  state.Rounds(4);
  AppendWord(&hash, state.Sum());
  state.v1 ^= 0xddU;
  state.Rounds(4);
  AppendWord(&hash, state.Sum());
  return hash;
}

std::string RandomHashKey() {
  std::string key(kHashKeyBytes, '\0');
  if (getrandom(key.data(), key.size(), 0) != static_cast<ssize_t>(key.size())) {
    throw Error(kErrorSystem, "The system gives no random numbers");
  }
  return key;
}

}  // namespace quarry::engine
