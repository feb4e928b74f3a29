// The words of new texts, each with the texts and places where it stands, on their way to a
// segment.
//
// FTS5 looks each word of a text up in one large table of its own, which costs a miss of the
// processor's caches or two for every word. Here the words of one text come sorted out, which takes
// little memory, so that the large table is asked once for each different word of a text.

#ifndef QUARRY_DAEMONS_TARNELASTICD_WORD_LISTS_H_
#define QUARRY_DAEMONS_TARNELASTICD_WORD_LISTS_H_

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "daemons/tarnelasticd/word_cutter.h"

namespace quarry::engine {

// One thread at a time.
class WordLists {
 public:
  // Adds the text `id`, which must be above all that were added since Clear().
  void Add(std::int64_t id, const CutText& text);

  bool empty() const { return count_ == 0; }
  // Roughly the memory that is held.
  std::size_t bytes() const;

  // Calls visit(word, list) with each word, in order of their bytes. A list is as in a segment:
  // row ids, the first whole and the others as differences, each with its positions' doubled length
  // and the positions. Both are valid during the call.
  using Visitor = std::function<void(std::string_view word, std::string_view list)>;
  void ForEach(const Visitor& visit) const;

  void Clear();

 private:
  // A word of all texts. Its list lies in blocks, each twice as large as the one before and with
  // the address of the next one behind its end.
  struct Word {
    const char* text;
    std::uint32_t size;
    std::uint32_t hash;
    std::uint32_t list_bytes;
    std::uint32_t block_bytes;  // of the last block
    char* first_block;
    char* at;
    char* end;  // of the last block
    std::int64_t last_id;
  };
  struct Slot {
    std::uint32_t hash;
    std::uint32_t word;  // its number from 1; 0: free
  };

  Word& At(std::uint32_t number) { return chunks_[number / kChunkWords][number % kChunkWords]; }
  const Word& At(std::uint32_t number) const {
    return chunks_[number / kChunkWords][number % kChunkWords];
  }
  Word& NewWord();
  void Prefetch(const std::vector<CutText::Word>& words, std::size_t next) const;
  Word& Find(std::string_view word, std::uint64_t hash);
  void Grow();
  char* Allocate(std::size_t bytes);
  void Append(Word* word, const char* bytes, std::size_t size);
  static void CopyList(const Word& word, std::string* list);

  static constexpr std::uint32_t kChunkWords = 4096;

  // A list that is moved when it grows would for a moment take three times the room.
  std::vector<std::unique_ptr<Word[]>> chunks_;
  std::uint32_t count_ = 0;  // of words
  std::vector<Slot> slots_;
  std::vector<std::unique_ptr<char[]>> slabs_;
  char* slab_at_ = nullptr;
  char* slab_end_ = nullptr;
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_WORD_LISTS_H_
