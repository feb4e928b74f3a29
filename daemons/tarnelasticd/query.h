// What people type to search.
//
//   words          all of them must be found; a word is found in the texts of a document, or, from
//                  three characters on, anywhere in its file name
//   "some words"   found in a row
//   begin*         a word that begins so
//   -not           must not be found
//   one OR other   either; OR joins its two neighbours only: a b OR c is a, and b or c
//   type:KIND      document, audio, video or photo; several with commas
//   ext:NAME       file name extension; several with commas
//   in:PATH        the file or folder of that full path and all below it
//   name:PART      in the file name
// Values of filters may stand in quotes, and filters may be negated.

#ifndef QUARRY_DAEMONS_TARNELASTICD_QUERY_H_
#define QUARRY_DAEMONS_TARNELASTICD_QUERY_H_

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "daemons/tarnelasticd/text_tokenizer.h"

namespace quarry::engine {

struct QueryTerm {
  enum class Kind { kWords, kName, kExtension, kType, kInside };
  Kind kind = Kind::kWords;
  bool negated = false;
  bool prefix = false;    // the last word may go on
  std::string text;       // as typed, without quotes and signs
  std::size_t begin = 0;  // where `text` begins in what was typed, in bytes
  // The single values in `text`: for kType and kExtension in lower case, for kName folded and set
  // by Resolve().
  std::vector<std::string> values;

  // Set by Resolve() for kWords and kName.
  std::vector<std::string> words;  // folded
  std::string part;                // folded, with what stands between the words
};

// All groups must be met; a group is met by any of its terms.
struct Query {
  std::vector<std::vector<QueryTerm>> groups;
};

constexpr std::size_t kMaxQueryBytes = 4096;
constexpr std::size_t kMaxQueryTerms = 64;

// Throws Error kQuerySyntax with a sentence for the person who typed.
Query ParseQuery(std::string_view text);

// What "in:" with `path` means, also for paths that cannot be typed.
QueryTerm InsideTerm(std::string_view path);

// Fills in what the index needs to know. Words without a letter or digit that are too short for a
// file name are dropped. Throws Error kQuerySyntax when nothing is left.
void Resolve(const TextTokenizer& tokenizer, Query* query);

// Parts of file names are found from this many characters on.
constexpr std::size_t kMinPart = 3;

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_QUERY_H_
