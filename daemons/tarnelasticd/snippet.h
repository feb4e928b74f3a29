// The piece of a text that shows why a document was found.

#ifndef QUARRY_DAEMONS_TARNELASTICD_SNIPPET_H_
#define QUARRY_DAEMONS_TARNELASTICD_SNIPPET_H_

#include <cstddef>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "daemons/tarnelasticd/query.h"
#include "daemons/tarnelasticd/text_tokenizer.h"

namespace quarry::engine {

struct Snippet {
  std::string text;
  // Where the words of the query stand in `text`: first byte and number of bytes, ascending.
  std::vector<std::pair<std::size_t, std::size_t>> highlights;
};

// A stretch of about `length` bytes with as many of the terms as possible, or the beginning where
// there are none. It is cut between words, blanks and control characters are drawn together into
// one blank, and "…" stands where text is left out. Only the first MiB of the text is looked at.
Snippet MakeSnippet(const TextTokenizer& tokenizer, std::string_view text,
                    const std::vector<const QueryTerm*>& terms, std::size_t length);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_SNIPPET_H_
