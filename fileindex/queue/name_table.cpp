#include "fileindex/queue/name_table.h"

#include <sys/random.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>

namespace quarry::fileindex {
namespace {

// So much of a name is hashed at once.
constexpr std::size_t kBlock = 256;

struct Keys {
  std::array<std::uint32_t, kBlock / 4> words;
  std::uint64_t length;
  std::uint64_t last;
};

std::uint64_t Spread(std::uint64_t number) {
  number = (number ^ number >> 33) * 0xff51afd7ed558ccd;
  number = (number ^ number >> 33) * 0xc4ceb9fe1a85ec53;
  return number ^ number >> 33;
}

Keys MakeKeys() {
  const int saved_errno = errno;
  // Where the system has no random bytes yet, it has chosen at random where the stack lies.
  std::uint64_t seed = 0;
  const auto place = reinterpret_cast<std::uintptr_t>(&seed);
  if (getrandom(&seed, sizeof(seed), GRND_NONBLOCK) != ssize_t{sizeof(seed)}) seed = place;
  errno = saved_errno;
  const auto next = [&seed] { return Spread(seed += 0x9e3779b97f4a7c15); };
  Keys keys{};
  for (std::uint32_t& word : keys.words) word = static_cast<std::uint32_t>(next() >> 32);
  keys.length = next() | 1;
  keys.last = next() | 1;
  return keys;
}

// Eight bytes, as many as a piece has.
std::uint64_t Piece(const char* bytes) {
  std::uint64_t number = 0;
  std::memcpy(&number, bytes, sizeof(number));
  return number;
}

// The same of fewer bytes.
std::uint64_t ShortPiece(const char* bytes, std::size_t count) {
  std::uint64_t number = 0;
  if (count >= 4) {
    std::uint32_t first = 0;
    std::uint32_t last = 0;
    std::memcpy(&first, bytes, 4);
    std::memcpy(&last, bytes + count - 4, 4);
    return first | std::uint64_t{last} << 8 * (count - 4);
  }
  for (std::size_t i = 0; i < count; ++i) {
    number |= std::uint64_t{static_cast<unsigned char>(bytes[i])} << 8 * i;
  }
  return number;
}

std::uint64_t Product(std::uint64_t piece, const std::uint32_t* keys) {
  const auto low = static_cast<std::uint32_t>(piece);
  const auto high = static_cast<std::uint32_t>(piece >> 32);
  return std::uint64_t{low + keys[0]} * std::uint32_t{high + keys[1]};
}

// A block's pieces, each multiplied with a key of its own: two blocks that were chosen without the
// keys have the same sum as rarely as by chance.
std::uint64_t Sum(const Keys& keys, std::string_view block) {
  std::uint64_t sum = block.size() * keys.length;
  const std::uint32_t* key = keys.words.data();
  while (block.size() >= 8) {
    sum += Product(Piece(block.data()), key);
    key += 2;
    block.remove_prefix(8);
  }
  if (!block.empty()) sum += Product(ShortPiece(block.data(), block.size()), key);
  return sum;
}

}  // namespace

std::uint32_t NameTable::HashOf(std::string_view name) {
  static const Keys keys = MakeKeys();
  std::uint64_t sum = 0;
  for (; name.size() > kBlock; name.remove_prefix(kBlock)) {
    sum = Spread(sum + Sum(keys, name.substr(0, kBlock)));
  }
  sum += Sum(keys, name);
  return static_cast<std::uint32_t>((sum ^ sum >> 32) * keys.last >> 32);
}

}  // namespace quarry::fileindex
