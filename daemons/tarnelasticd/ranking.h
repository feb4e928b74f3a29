// How well a document's full text answers a query.

#ifndef QUARRY_DAEMONS_TARNELASTICD_RANKING_H_
#define QUARRY_DAEMONS_TARNELASTICD_RANKING_H_

#include <sqlite3.h>

#include <cstddef>
#include <vector>

#include "daemons/tarnelasticd/doc_set.h"

namespace quarry::engine {

// The BM25 weight of a word that `documents_with` of `documents` have.
double WordWeight(std::size_t documents_with, std::size_t documents);

// What quarry_score works on while a statement runs. Scores are added up per document, and only for
// documents that count: reading how long a document is costs more than finding it.
struct RankContext {
  const DocSet* candidates = nullptr;
  std::vector<double> word_weights;  // one per phrase of the MATCH expression
  std::vector<double> column_weights;
  std::vector<float>* scores = nullptr;  // by row id; large enough for all candidates
  double average_length = 0;             // of the texts, in words; found out at the first of them
};

// Gives the connection quarry_score(TABLE), for use in a statement with MATCH over TABLE; it
// returns nothing. `*slot` is read while such statements run, and belongs to the caller.
void RegisterRanking(sqlite3* db, RankContext** slot);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_RANKING_H_
