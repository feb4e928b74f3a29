// Sorting out the words of one text.
//
// That is much of the work of storing a text, and needs nothing of the index: it can be done beside
// the writer.

#ifndef QUARRY_DAEMONS_TARNELASTICD_WORD_CUTTER_H_
#define QUARRY_DAEMONS_TARNELASTICD_WORD_CUTTER_H_

#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/text_tokenizer.h"

namespace quarry::engine {

// The words of a text, each once, in the order in which they come first.
struct CutText {
  struct Word {
    std::uint32_t begin;  // in letters
    std::uint32_t size;
    std::uint64_t hash;         // of this process; see word_bytes.h
    std::uint32_t place_bytes;  // in places, which has those of the words one behind the other
  };
  // How many words each column has; none where the text is too long, or one of its words: such a
  // text is for FTS5, which takes any.
  std::vector<std::size_t> sizes;
  std::vector<Word> words;
  std::string letters;
  std::string places;  // where the words stand, as in a segment of FTS5
};

// One thread at a time.
class WordCutter {
 public:
  // `tokenizer` must outlive the cutter.
  explicit WordCutter(const TextTokenizer& tokenizer);

  // Cuts a text, given by its columns. What `cut` had is gone.
  void Cut(const std::vector<std::string_view>& columns, CutText* cut);

  static constexpr std::size_t kMaxText = std::size_t{12} << 20;
  static constexpr std::size_t kMaxWord = 1000;

 private:
  void TakeWord(std::string_view word);
  void Grow();
  void PlacePositions();
  void EncodePositions(const std::vector<std::size_t>& starts, CutText* cut);
  static char* EncodeWord(const std::uint32_t* places, std::size_t count,
                          const std::vector<std::size_t>& starts, char* at);
  void Clear();
  void Reset();

  const TextTokenizer& tokenizer_;
  const std::uint64_t seed_;
  std::vector<CutText::Word> words_;
  std::string letters_;
  std::vector<std::uint32_t> slots_;       // numbers of words from 1; 0: free
  std::vector<std::uint32_t> word_slots_;  // where in slots_ each word is
  std::vector<std::uint32_t> counts_;      // how often it stands in the text
  std::vector<std::uint32_t> stream_;      // the text as numbers of words
  std::vector<std::uint32_t> places_;      // where in stream_ each word stands, word by word
  std::vector<std::uint32_t> place_ends_;
  std::string encoded_;
  bool has_long_word_ = false;
  bool is_clear_ = true;  // not after a failure
};

// As many cutters as there are threads at once. Any thread.
class WordCutters {
 public:
  // Throws Error as WordCutter's tokenizer does.
  CutText Cut(const std::vector<std::string_view>& columns);

 private:
  // A tokenizer belongs to one thread at a time.
  struct Cutter {
    explicit Cutter(sqlite3* db) : tokenizer(db), cutter(tokenizer) {}
    TextTokenizer tokenizer;
    WordCutter cutter;
  };
  std::unique_ptr<Cutter> Take();

  std::mutex mutex_;
  std::unique_ptr<Database> db_;               // to make tokenizers with; guarded by mutex_
  std::vector<std::unique_ptr<Cutter>> idle_;  // guarded by mutex_
};

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_WORD_CUTTER_H_
