#include "daemons/tarnelasticd/edit_distance.h"

#include <algorithm>
#include <array>
#include <numeric>
#include <utility>

#include "daemons/tarnelasticd/text_tokenizer.h"

namespace quarry::engine {
namespace {

using Row = std::array<unsigned int, kMaxComparedLetters + 1>;

char32_t Decode(std::string_view sequence) {
  const auto first = static_cast<unsigned char>(sequence.front());
  if (sequence.size() == 1) return first;
  char32_t code = first & (0x7fU >> sequence.size());
  for (const char c : sequence.substr(1))
    code = code << 6 | (static_cast<unsigned char>(c) & 0x3fU);
  return code;
}

// The distances between the first `i` letters of `a` and each beginning of `b`; returns the least.
unsigned int FillRow(std::u32string_view a, std::u32string_view b, std::size_t i, const Row& before,
                     const Row& last, Row* row) {
  Row& now = *row;
  now[0] = static_cast<unsigned int>(i);
  unsigned int best = now[0];
  for (std::size_t j = 1; j <= b.size(); ++j) {
    const unsigned int replaced = last[j - 1] + (a[i - 1] == b[j - 1] ? 0U : 1U);
    now[j] = std::min({replaced, last[j] + 1, now[j - 1] + 1});
    if (i > 1 && j > 1 && a[i - 1] == b[j - 2] && a[i - 2] == b[j - 1]) {
      now[j] = std::min(now[j], before[j - 2] + 1);
    }
    best = std::min(best, now[j]);
  }
  return best;
}

// Letters of Latin script have bits of their own, others share the rest.
constexpr std::uint64_t LetterBit(char32_t letter) {
  constexpr char32_t kOthers = 64 - 26;
  const char32_t bit = letter >= 'a' && letter <= 'z' ? letter - 'a' : 26 + letter % kOthers;
  return std::uint64_t{1} << bit;
}

constexpr auto kByteBits = [] {
  std::array<std::uint64_t, 256> bits{};
  for (char32_t byte = 0; byte < bits.size(); ++byte) bits[byte] = LetterBit(byte);
  return bits;
}();

}  // namespace

std::u32string CodePoints(std::string_view text) {
  std::u32string points;
  points.reserve(text.size());
  while (!text.empty()) {
    const std::size_t length = std::max<std::size_t>(Utf8Length(text), 1);
    points.push_back(Decode(text.substr(0, length)));
    text.remove_prefix(length);
  }
  return points;
}

std::size_t EditDistance(std::u32string_view a, std::u32string_view b, std::size_t limit) {
  const std::size_t far = limit + 1;
  if (a.size() > b.size()) std::swap(a, b);
  if (b.size() > kMaxComparedLetters || b.size() - a.size() > limit) return far;
  std::array<Row, 3> rows{};
  Row* before = &rows[0];
  Row* last = &rows[1];
  Row* now = &rows[2];
  std::iota(last->begin(), last->end(), 0U);
  for (std::size_t i = 1; i <= a.size(); ++i) {
    const unsigned int best = FillRow(a, b, i, *before, *last, now);
    // A swap leaps over one row that is beyond the limit, but not over two.
    if (best > far) return far;
    before = std::exchange(last, std::exchange(now, before));
  }
  return std::min<std::size_t>((*last)[b.size()], far);
}

std::uint64_t LetterSet(std::u32string_view word) {
  std::uint64_t set = 0;
  for (const char32_t letter : word) set |= LetterBit(letter);
  return set;
}

std::uint64_t LetterSetOfAscii(std::string_view word) {
  std::uint64_t set = 0;
  for (const char letter : word) set |= kByteBits[static_cast<unsigned char>(letter)];
  return set;
}

}  // namespace quarry::engine
