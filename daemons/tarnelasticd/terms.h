// The words of one index that are there to be suggested.
//
// The table "terms" keeps them in order of their bytes, thousands to a row, compressed. In a row
// stand, for each word, how many bytes it shares with the one before, how many more it has, these,
// and how many documents have it. Reading through all of them is faster than any index that would
// lead to the few words that are similar to one.

#ifndef QUARRY_DAEMONS_TARNELASTICD_TERMS_H_
#define QUARRY_DAEMONS_TARNELASTICD_TERMS_H_

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "daemons/tarnelasticd/database.h"

namespace quarry::engine {

struct Term {
  std::string text;            // folded
  std::int64_t documents = 0;  // that had it when the words were collected
};

// Shorter words are never suggested, nor are longer ones, which nobody types.
constexpr std::int64_t kMinTermLetters = 3;
constexpr std::int64_t kMaxTermLetters = 40;

// The statements that make the tables.
std::string CreateTermTables();

// Collects the words of all documents anew, inside the transaction that is open; they are current
// then. Where the full text of a small index has come in many pieces it is put together first, and
// where many documents are new, other indexes. Returns how many bytes of full text were put
// together, roughly. Throws Error as Database does, as all below do.
std::size_t CollectTerms(Database* db, std::int64_t new_documents);

// Whether words have been collected, and there were any.
bool HasTerms(Database* db);

// Whether words have been collected by today's rules, and OutdateTerms() not been called since:
// doing it anew would find the same.
bool AreTermsCurrent(Database* db);

// To be called within each transaction that changes what documents are found by.
void OutdateTerms(Database* db);

// How many documents had the word; 0 for one that was not collected.
std::int64_t DocumentsWith(Database* db, std::string_view term);

// The words that begin with these bytes, at most `size`, which is not 0: those of most documents
// first, then in order of their bytes.
std::vector<Term> TermsThatBegin(Database* db, std::string_view prefix, std::size_t size);

struct NearTerm {
  Term term;
  std::size_t distance = 0;
};

// The words at a distance of 1 to `limit` from `word`, which is folded, at most `size`: the nearest
// first, then those of most documents, then in order of their bytes. `check` is called every now
// and then, and may throw to give up.
std::vector<NearTerm> TermsNear(Database* db, std::string_view word, std::size_t limit,
                                std::size_t size, const std::function<void()>& check);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_TERMS_H_
