#include "fileindex/queue/name_table.h"

#include <sys/random.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace quarry::fileindex {
namespace {

__extension__ using Wide = unsigned __int128;

constexpr std::uint64_t kPrime = (std::uint64_t{1} << 61) - 1;
// Numbers of as many bytes are smaller than the prime, so that no two stand for the same.
constexpr std::size_t kPiece = 7;

std::uint64_t Remainder(Wide number) {
  const std::uint64_t sum =
      static_cast<std::uint64_t>(number & kPrime) + static_cast<std::uint64_t>(number >> 61);
  return sum >= kPrime ? sum - kPrime : sum;
}

std::uint64_t MakeKey() {
  const int saved_errno = errno;
  // Where the system has no random bytes yet, it has chosen at random where the stack lies.
  std::uint64_t key = 0;
  const auto place = reinterpret_cast<std::uintptr_t>(&key);
  if (getrandom(&key, sizeof(key), GRND_NONBLOCK) != ssize_t{sizeof(key)}) key = place;
  errno = saved_errno;
  return key % (kPrime - 1) + 1;
}

std::uint64_t Number(const char* bytes, std::size_t count) {
  std::uint64_t number = 0;
  std::memcpy(&number, bytes, count);
  return number;
}

// Neighbouring numbers are spread over all bits.
std::uint64_t Spread(std::uint64_t number) {
  number = (number ^ number >> 33) * 0xff51afd7ed558ccd;
  number = (number ^ number >> 33) * 0xc4ceb9fe1a85ec53;
  return number ^ number >> 33;
}

}  // namespace

// The name is a polynomial, taken at a place that nobody outside knows: two names that were chosen
// without it meet there as rarely as by chance.
std::uint32_t NameTable::HashOf(std::string_view name) {
  static const std::uint64_t key = MakeKey();
  std::uint64_t sum = name.size();
  while (!name.empty()) {
    const std::size_t count = std::min(kPiece, name.size());
    sum = Remainder(Wide{sum} * key + Number(name.data(), count));
    name.remove_prefix(count);
  }
  return static_cast<std::uint32_t>(Spread(sum + key) >> 32);
}

}  // namespace quarry::fileindex
