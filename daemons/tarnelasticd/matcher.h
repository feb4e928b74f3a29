// Which documents of one index answer a query.

#ifndef QUARRY_DAEMONS_TARNELASTICD_MATCHER_H_
#define QUARRY_DAEMONS_TARNELASTICD_MATCHER_H_

#include <cstddef>
#include <optional>
#include <vector>

#include "daemons/tarnelasticd/doc_set.h"
#include "daemons/tarnelasticd/frequencies.h"
#include "daemons/tarnelasticd/index_reader.h"
#include "daemons/tarnelasticd/query.h"
#include "daemons/tarnelasticd/schema.h"

namespace quarry::engine {

// Where one term of a query is found, as ranking needs it.
struct TermMatches {
  const QueryTerm* term = nullptr;
  DocSet texts;   // in the full text
  DocSet labels;  // by a whole word of the file name or of a field that is not listed
  DocSet names;   // by a part of the file name
  // How often in the full text; without a value when that takes too much memory, for all terms
  // together, to be kept.
  std::optional<Frequencies> frequencies;
  std::size_t documents = 0;  // documents with it anywhere
};

struct Matches {
  DocSet documents;
  // One for each term that counts for ranking: words that are not negated, in order.
  std::vector<TermMatches> terms;
};

// Finds what answers `query`, which has been resolved and must outlive the result. Every text of
// the query reaches the database as a parameter, and as one quoted string within it.
Matches FindMatches(const Schema& schema, const Query& query, IndexReader* reader);

// The words of the query that count for ranking, in the order of Matches::terms.
std::vector<const QueryTerm*> RankedTerms(const Query& query);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_MATCHER_H_
