// Putting the documents that were found in order, and cutting out one page.

#ifndef QUARRY_DAEMONS_TARNELASTICD_PAGE_H_
#define QUARRY_DAEMONS_TARNELASTICD_PAGE_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "daemons/tarnelasticd/matcher.h"
#include "daemons/tarnelasticd/search.h"

namespace quarry::engine {

// A document found, with what it is ordered by.
struct Ranked {
  std::size_t index = 0;  // which of the searched indexes
  std::int64_t id = 0;
  double score = 0;
  std::int64_t time = 0;
  std::string path;
};

// The first `count` documents of one index in that order, which is not kDefault. `weights` are
// those of matches.terms.
std::vector<Ranked> FirstOf(const SearchedIndex& index, const Query& query, const Matches& matches,
                            const std::vector<double>& weights, SortOrder order, std::size_t count);

// Whether `a` comes before `b`. No two documents are equal, so pages never overlap.
bool ComesBefore(const Ranked& a, const Ranked& b, SortOrder order);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_PAGE_H_
