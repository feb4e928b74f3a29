// A set of documents of one index.

#ifndef QUARRY_DAEMONS_TARNELASTICD_DOC_SET_H_
#define QUARRY_DAEMONS_TARNELASTICD_DOC_SET_H_

#include <algorithm>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <vector>

#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::engine {

// Documents are numbered as they come, from 1. What is kept by number would take any amount of
// memory for a larger number. An index that has given out all of them counts as damaged, and so is
// made anew with small ones.
constexpr std::int64_t kMaxId = std::int64_t{1} << 28;

inline void CheckId(std::int64_t id) {
  if (id <= 0 || id > kMaxId) throw Error(kDamagedIndex, "The number of a document is damaged");
}

// One bit per row id: ids are small and dense, so a set over a million documents takes 125 KB
// however many it holds, and sets are combined a word at a time.
class DocSet {
 public:
  // Throws Error kDamagedIndex for an id that no document can have.
  void Add(std::int64_t id) {
    CheckId(id);
    const auto word = static_cast<std::size_t>(id) / 64;
    if (word >= bits_.size()) bits_.resize(std::max(word + 1, bits_.size() * 3 / 2));
    bits_[word] |= std::uint64_t{1} << (static_cast<std::uint64_t>(id) % 64);
  }

  void Remove(std::int64_t id) {
    const auto word = static_cast<std::size_t>(id) / 64;
    if (word < bits_.size())
      bits_[word] &= ~(std::uint64_t{1} << (static_cast<std::uint64_t>(id) % 64));
  }

  bool Contains(std::int64_t id) const {
    const auto word = static_cast<std::size_t>(id) / 64;
    return word < bits_.size() && (bits_[word] >> (static_cast<std::uint64_t>(id) % 64) & 1) != 0;
  }

  void Unite(const DocSet& other) {
    if (bits_.size() < other.bits_.size()) bits_.resize(other.bits_.size());
    for (std::size_t i = 0; i < other.bits_.size(); ++i) bits_[i] |= other.bits_[i];
  }

  void Intersect(const DocSet& other) {
    if (bits_.size() > other.bits_.size()) bits_.resize(other.bits_.size());
    for (std::size_t i = 0; i < bits_.size(); ++i) bits_[i] &= other.bits_[i];
  }

  void Subtract(const DocSet& other) {
    const std::size_t common = std::min(bits_.size(), other.bits_.size());
    for (std::size_t i = 0; i < common; ++i) bits_[i] &= ~other.bits_[i];
  }

  std::size_t Count() const {
    std::size_t count = 0;
    for (const std::uint64_t word : bits_) count += static_cast<std::size_t>(std::popcount(word));
    return count;
  }

  bool Empty() const {
    return std::all_of(bits_.begin(), bits_.end(), [](std::uint64_t word) { return word == 0; });
  }

  // Calls `visit` with each id, ascending.
  template <typename Visit>
  void ForEach(Visit visit) const {
    for (std::size_t i = 0; i < bits_.size(); ++i) {
      for (std::uint64_t word = bits_[i]; word != 0; word &= word - 1) {
        visit(static_cast<std::int64_t>(i * 64) + std::countr_zero(word));
      }
    }
  }

  // One more than the largest id that the set has room for.
  std::size_t Bound() const { return bits_.size() * 64; }

 private:
  std::vector<std::uint64_t> bits_;
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_DOC_SET_H_
