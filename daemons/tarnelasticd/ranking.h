// How well a document's full text answers a query: BM25.

#ifndef QUARRY_DAEMONS_TARNELASTICD_RANKING_H_
#define QUARRY_DAEMONS_TARNELASTICD_RANKING_H_

#include <sqlite3.h>

#include <cstddef>
#include <vector>

#include "daemons/tarnelasticd/doc_set.h"
#include "daemons/tarnelasticd/frequencies.h"

namespace quarry::engine {

// The weight of a word that `documents_with` of `documents` have.
double WordWeight(std::size_t documents_with, std::size_t documents);

// How much a text's length counts against it: 1 for one of average length, more for a longer one.
double LengthNorm(std::size_t length, double average_length);

// What a word of weight 1 adds to the score of a text that has it so often; at most
// kMostOfWord.
double WordScore(double frequency, double length_norm);
constexpr double kMostOfWord = 2.2;

// What the functions below write to while a statement runs: documents, or how often rows have the
// first phrase of the MATCH expression.
struct CountContext {
  std::vector<double> column_weights;
  DocSet* documents = nullptr;
  Frequencies* frequencies = nullptr;
};

// Gives the connection quarry_count(TABLE), for use in a statement with MATCH over TABLE, and
// quarry_add(ID), which notes a document; they return nothing. `*slot` is read while such
// statements run, and belongs to the caller.
void RegisterCounting(sqlite3* db, CountContext** slot);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_RANKING_H_
