// Making one segment of several.
//
// FTS5 takes lists apart document by document, through several layers. Here the lists of a word are
// copied one behind the other, which is all there is to do where the segments have been written of
// new documents. Leaves that have been read are removed at once, so that those that are written
// take their place in the file.

#ifndef QUARRY_DAEMONS_TARNELASTICD_SEGMENT_MERGER_H_
#define QUARRY_DAEMONS_TARNELASTICD_SEGMENT_MERGER_H_

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/fts_structure.h"

namespace quarry::engine {

// So many segments of a level become one. A search looks into each.
constexpr std::size_t kManySegments = 8;

// Told of each word of a table, in order of their bytes, with the rows that have it, ascending; of
// no word at the end.
using WordVisitor =
    std::function<void(std::string_view word, const std::vector<std::int64_t>& rows)>;

// Has all of the table in one segment. Where the tables are not of the form that is understood
// here, or FTS5 has begun to merge them, it does so. Returns whether `visit` has been told of all
// words: else it is not called. Within the transaction that is open, which must be rolled back when
// this fails, as below.
bool MergeAllSegments(Database* db, const std::string& table, const WordVisitor& visit = {});

// Merges levels with many segments, as far as these are not too large for one go, and keeps
// `structure` true. To be called between WriteOutFts() and ForgetFts().
void MergeFullLevels(Database* db, const std::string& table, FtsStructure* structure);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_SEGMENT_MERGER_H_
