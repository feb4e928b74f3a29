// Finding a name among many by its hash.

#ifndef QUARRY_FILEINDEX_QUEUE_NAME_TABLE_H_
#define QUARRY_FILEINDEX_QUEUE_NAME_TABLE_H_

#include <cstddef>
#include <cstdint>
#include <string_view>
#include <vector>

#include "fileindex/queue/large_pages.h"

namespace quarry::fileindex {

// The positions of named things in a list that somebody else keeps. A slot takes eight bytes, and
// between four ninths and two thirds of the slots are taken: a directory may have a million names.
class NameTable {
 public:
  static constexpr std::uint32_t kNone = 0xffffffff;

  // Differs from one process to the next, so that nobody can name files such that they all fall to
  // one place, and make finding each as slow as walking through all.
  static std::uint32_t HashOf(std::string_view name);

  // The first position that was added with this hash and for which `is_it` holds, or kNone.
  template <typename IsIt>
  std::uint32_t Find(std::uint32_t hash, IsIt is_it) const {
    if (slots_.empty()) return kNone;
    for (std::size_t at = Home(hash);; at = After(at)) {
      const Slot& slot = slots_[at];
      if (slot.position == kNone) return kNone;
      if (slot.hash == hash && is_it(slot.position)) return slot.position;
    }
  }

  // Asks for the memory that Find will look at first.
  void Prefetch(std::uint32_t hash) const {
    if (!slots_.empty()) __builtin_prefetch(&slots_[Home(hash)]);
  }

  void Add(std::uint32_t hash, std::uint32_t position) {
    if (3 * (taken_ + 1) > 2 * slots_.size()) Grow();
    Put({hash, position});
    ++taken_;
  }

 private:
  struct Slot {
    std::uint32_t hash = 0;
    std::uint32_t position = kNone;
  };

  // In the order of the hashes, so that growing reads and writes both tables from front to back.
  std::size_t Home(std::uint32_t hash) const {
    return static_cast<std::size_t>((std::uint64_t{hash} * slots_.size()) >> 32);
  }
  std::size_t After(std::size_t at) const { return at + 1 == slots_.size() ? 0 : at + 1; }

  void Put(Slot slot) {
    std::size_t at = Home(slot.hash);
    while (slots_[at].position != kNone) at = After(at);
    slots_[at] = slot;
  }

  void Grow() {
    const std::size_t size = slots_.size() + slots_.size() / 2 + 8;
    std::vector<Slot> old;
    old.reserve(size);
    PreferLargePages(old.data(), size * sizeof(Slot));
    old.resize(size);
    old.swap(slots_);
    for (const Slot& slot : old) {
      if (slot.position != kNone) Put(slot);
    }
  }

  std::vector<Slot> slots_;
  std::size_t taken_ = 0;
};

}  // namespace quarry::fileindex

#endif  // QUARRY_FILEINDEX_QUEUE_NAME_TABLE_H_
