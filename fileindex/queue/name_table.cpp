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

__extension__ using Wide = unsigned __int128;

struct Keys {
  std::array<std::uint64_t, kBlock / 8> words;
  std::uint64_t length;
  std::uint64_t low;
  std::uint64_t high;
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
  for (std::uint64_t& word : keys.words) word = next();
  keys.length = next() | 1;
  keys.low = next() | 1;
  keys.high = next() | 1;
  return keys;
}

template <typename Number>
std::uint64_t NumberAt(const char* bytes) {
  Number number = 0;
  std::memcpy(&number, bytes, sizeof(number));
  return number;
}

Wide Product(std::uint64_t first, std::uint64_t second, const std::uint64_t* keys) {
  return Wide{first + keys[0]} * (second + keys[1]);
}

// One to fifteen bytes. Of one count no two have the same numbers, though these may overlap.
Wide ProductOfFew(const char* bytes, std::size_t count, const std::uint64_t* keys) {
  using Byte = unsigned char;
  const char* const end = bytes + count;
  if (count >= 8) {
    return Product(NumberAt<std::uint64_t>(bytes), NumberAt<std::uint64_t>(end - 8), keys);
  }
  if (count >= 4) {
    return Product(NumberAt<std::uint32_t>(bytes), NumberAt<std::uint32_t>(end - 4), keys);
  }
  return Product(NumberAt<Byte>(bytes) << 8 | NumberAt<Byte>(end - 1),
                 NumberAt<Byte>(bytes + count / 2), keys);
}

// A block's numbers, added to keys of their own and multiplied pair by pair: two blocks that were
// chosen without the keys have the same sum as rarely as by chance.
Wide Sum(const Keys& keys, const char* bytes, std::size_t count) {
  Wide sum = count * keys.length;
  const std::uint64_t* key = keys.words.data();
  for (; count >= 16; count -= 16, bytes += 16, key += 2) {
    sum += Product(NumberAt<std::uint64_t>(bytes), NumberAt<std::uint64_t>(bytes + 8), key);
  }
  if (count > 0) sum += ProductOfFew(bytes, count, key);
  return sum;
}

std::uint64_t Fold(const Keys& keys, Wide sum) {
  return static_cast<std::uint64_t>(sum) * keys.low +
         static_cast<std::uint64_t>(sum >> 64) * keys.high;
}

// What the whole blocks at the front of a long name come to, which are taken off it.
[[gnu::noinline]] std::uint64_t TakeBlocks(const Keys& keys, std::string_view& name) {
  std::uint64_t before = 0;
  for (; name.size() > kBlock; name.remove_prefix(kBlock)) {
    before = Spread(Fold(keys, before + Sum(keys, name.data(), kBlock)));
  }
  return before;
}

}  // namespace

std::uint32_t NameTable::HashOf(std::string_view name) {
  static const Keys keys = MakeKeys();
  const std::uint64_t before = name.size() > kBlock ? TakeBlocks(keys, name) : 0;
  return static_cast<std::uint32_t>(Fold(keys, before + Sum(keys, name.data(), name.size())) >> 32);
}

}  // namespace quarry::fileindex
