// What FTS5 writes down of a full-text table as a whole: its segments, and how many words it has.

#ifndef QUARRY_DAEMONS_TARNELASTICD_FTS_STRUCTURE_H_
#define QUARRY_DAEMONS_TARNELASTICD_FTS_STRUCTURE_H_

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/segment_reader.h"

namespace quarry::engine {

struct FtsStructure {
  struct Level {
    std::int64_t merging = 0;       // how many of the segments are being merged
    std::vector<Segment> segments;  // the newest last
  };
  std::string cookie;
  std::int64_t leaves_written = 0;  // ever
  std::vector<Level> levels;        // the newest first

  // A number that no segment has, or 0 when there are as many as can be.
  std::int64_t FreeSegment() const;
  // The same behind all others where there is one: what is written there is appended to the table.
  std::int64_t NextSegment() const;
};

// Nothing where the tables are of a form that is not understood here, as those of a library to come
// may be. Throws Error as Database does, kDamagedIndex for what cannot be.
std::optional<FtsStructure> ReadStructure(Database* db, const std::string& table);

// Has FTS5 write out what it has of the table in memory, as its own bookkeeping is about to be
// changed. Within the transaction that is open, like all below.
void WriteOutFts(Database* db, const std::string& table);

// Has FTS5 read its bookkeeping anew.
void ForgetFts(Database* db);

// To be called between WriteOutFts() and ForgetFts().
void WriteStructure(Database* db, const std::string& table, const FtsStructure& structure);

// Adds rows, with so many words in each column, to what FTS5 knows of the table. Like
// WriteStructure().
void AddToTotals(Database* db, const std::string& table, std::uint64_t rows,
                 const std::vector<std::uint64_t>& words);

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_FTS_STRUCTURE_H_
