// Cutting text into the words that the index holds.

#ifndef QUARRY_DAEMONS_TARNELASTICD_TEXT_TOKENIZER_H_
#define QUARRY_DAEMONS_TARNELASTICD_TEXT_TOKENIZER_H_

#include <sqlite3.h>

#include <cstddef>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

namespace quarry::engine {

// The tokenizer of the full text in terms of FTS5: letters and digits of any script, folded to
// lower case, without accents.
constexpr const char* kTextTokenizer = "unicode61 remove_diacritics 2";

// The same tokenizer for our own use, so that what we say about words is what the index says. Any
// bytes may be given. Belongs to the connection that it was made with and to one thread at a time.
class TextTokenizer {
 public:
  explicit TextTokenizer(sqlite3* db);
  ~TextTokenizer();
  TextTokenizer(const TextTokenizer&) = delete;
  TextTokenizer& operator=(const TextTokenizer&) = delete;

  // Called with each folded word and where it stands in the text, in bytes. Returns whether to go
  // on.
  using Visitor = std::function<bool(std::string_view word, std::size_t begin, std::size_t end)>;
  void ForEach(std::string_view text, const Visitor& visit) const;

  // Calls visit(word) with the same words. Several times as fast where the text is ASCII.
  template <typename Visit>
  void EachWord(std::string_view text, Visit visit) const {
    std::string folded;
    while (true) {
      const std::size_t begin = SkipSeparators(text);
      if (begin == text.size()) return;
      text.remove_prefix(begin);
      const std::size_t size = FoldAsciiWord(text, &folded);
      if (size == 0) {
        // Words that are not ASCII are left to the tokenizer, which keeps nothing from one to the
        // next: up to where it certainly is between two words.
        const std::size_t end = FindAsciiSeparator(text);
        ForEach(text.substr(0, end), [&visit](std::string_view word, std::size_t, std::size_t) {
          visit(word);
          return true;
        });
        text.remove_prefix(end);
      } else {
        visit(std::string_view(folded).substr(0, size));
        text.remove_prefix(size);
      }
    }
  }

  std::vector<std::string> Words(std::string_view text) const;

  // The text with its words folded and all between them kept, but for control characters, which
  // become blanks. Bytes that are not UTF-8 become U+FFFD. Two spellings of a name that differ in
  // case, accents or how these are composed fold to the same text.
  std::string Fold(std::string_view text) const;

 private:
  static std::size_t SkipSeparators(std::string_view text);
  static std::size_t FindAsciiSeparator(std::string_view text);
  static std::size_t FoldAsciiWord(std::string_view text, std::string* folded);

  fts5_tokenizer functions_{};
  Fts5Tokenizer* tokenizer_ = nullptr;
};

// FTS5's interface of the connection. Throws Error kStorageFailed where there is none.
fts5_api* Fts5Api(sqlite3* db);

// The number of code points in `text`; each byte that is not UTF-8 counts as one.
std::size_t CountCharacters(std::string_view text);

// The length of the UTF-8 sequence at the beginning of `text`, which is not empty, or 0 when its
// first byte begins none.
std::size_t Utf8Length(std::string_view text);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_TEXT_TOKENIZER_H_
