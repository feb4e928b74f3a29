// How far two words are apart.

#ifndef QUARRY_DAEMONS_TARNELASTICD_EDIT_DISTANCE_H_
#define QUARRY_DAEMONS_TARNELASTICD_EDIT_DISTANCE_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace quarry::engine {

// Words with more letters are near to none: what a comparison costs is thus bounded.
constexpr std::size_t kMaxComparedLetters = 64;

// The code points of `text`; a byte that begins no UTF-8 sequence stands for itself.
std::u32string CodePoints(std::string_view text);

// The fewest letters to be put in, taken out, replaced, or swapped with the next one, that turn one
// word into the other (no letter is touched twice: the restricted Damerau-Levenshtein distance), or
// `limit` + 1 when these are more than `limit`.
std::size_t EditDistance(std::u32string_view a, std::u32string_view b, std::size_t limit);

// Which letters a word has, one bit for each kind. Tells at a glance, for nearly all pairs of
// words, that they are far apart.
std::uint64_t LetterSet(std::u32string_view word);
std::uint64_t LetterSetOfAscii(std::string_view word);
// Whether words with these letters may be within `limit` of each other: each step takes one kind of
// letter away and brings another at most.
inline bool MayBeNear(std::uint64_t a, std::uint64_t b, std::size_t limit) {
  std::uint64_t only_a = a & ~b;
  std::uint64_t only_b = b & ~a;
  // Quicker than to count bits, where the processor may have no instruction for it.
  for (; limit > 0; --limit) {
    only_a &= only_a - 1;
    only_b &= only_b - 1;
  }
  return (only_a | only_b) == 0;
}

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_EDIT_DISTANCE_H_
