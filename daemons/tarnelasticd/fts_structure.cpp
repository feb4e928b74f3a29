#include "daemons/tarnelasticd/fts_structure.h"

#include <algorithm>
#include <set>
#include <string_view>

#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/fts_number.h"

namespace quarry::engine {
namespace {

constexpr int kUnderstoodVersion = 4;
constexpr std::int64_t kTotalsRow = 1;
constexpr std::int64_t kStructureRow = 10;
constexpr std::size_t kCookie = 4;  // bytes before the structure
constexpr std::int64_t kMaxSegmentId = (std::int64_t{1} << 16) - 1;
constexpr std::int64_t kMaxLeaf = (std::int64_t{1} << 31) - 1;
// FTS5 takes no more.
constexpr std::int64_t kMostSegments = 2000;

bool IsWithin(std::int64_t value, std::int64_t most) {
  return value >= 0 && value <= most;
}

void CheckSegment(const Segment& segment) {
  if (!IsWithin(segment.id, kMaxSegmentId) || !IsWithin(segment.first_leaf, kMaxLeaf) ||
      !IsWithin(segment.last_leaf, kMaxLeaf)) {
    throw Error(kDamagedIndex, "The full text is not as it should be");
  }
}

std::string ReadRecord(Database* db, const std::string& table, std::int64_t id) {
  Statement row = db->Prepare("SELECT block FROM " + table + "_data WHERE id=?1");
  row.Bind(1, id);
  return row.Step() ? std::string(row.Blob(0)) : std::string();
}

void WriteRecord(Database* db, const std::string& table, std::int64_t id,
                 const std::string& record) {
  db->Prepare("REPLACE INTO " + table + "_data(id,block) VALUES(?1,?2)")
      .Bind(1, id)
      .BindBlob(2, record)
      .Run();
}

}  // namespace

std::int64_t FtsStructure::FreeSegment() const {
  std::set<std::int64_t> used;
  for (const Level& level : levels) {
    for (const Segment& segment : level.segments) used.insert(segment.id);
  }
  std::int64_t free = 1;
  while (used.count(free) > 0) ++free;
  return free <= kMostSegments ? free : 0;
}

std::int64_t FtsStructure::NextSegment() const {
  std::int64_t last = 0;
  for (const Level& level : levels) {
    for (const Segment& segment : level.segments) last = std::max(last, segment.id);
  }
  return last < kMostSegments ? last + 1 : FreeSegment();
}

std::optional<FtsStructure> ReadStructure(Database* db, const std::string& table) {
  Statement version = db->Prepare("SELECT v FROM " + table + "_config WHERE k='version'");
  if (!version.Step() || version.Int(0) != kUnderstoodVersion) return std::nullopt;
  const std::string record = ReadRecord(db, table, kStructureRow);
  // The second form of this record, with a byte that no first one has here, is another version's.
  if (record.size() <= kCookie || static_cast<unsigned char>(record[kCookie]) == 0xff) {
    return std::nullopt;
  }
  FtsStructure structure;
  structure.cookie = record.substr(0, kCookie);
  const char* at = record.data() + kCookie;
  const char* const end = record.data() + record.size();
  const auto take = [&] { return static_cast<std::int64_t>(TakeVarint(&at, end)); };
  const std::int64_t levels = take();
  take();  // how many segments there are in all
  structure.leaves_written = take();
  for (std::int64_t i = 0; i < levels; ++i) {
    FtsStructure::Level& level = structure.levels.emplace_back();
    level.merging = take();
    const std::int64_t count = take();
    for (std::int64_t j = 0; j < count; ++j) {
      Segment segment;
      segment.id = take();
      segment.first_leaf = take();
      segment.last_leaf = take();
      CheckSegment(segment);
      level.segments.push_back(segment);
    }
  }
  return structure;
}

// Asked for no work, FTS5 takes part in the transaction from now on, and so is told of savepoints.
void WriteOutFts(Database* db, const std::string& table) {
  db->Execute("INSERT INTO " + table + "(" + table +
              ",rank) VALUES('merge',0);SAVEPOINT own;RELEASE own");
}

void ForgetFts(Database* db) {
  db->Execute("SAVEPOINT own;ROLLBACK TO own;RELEASE own");
}

void WriteStructure(Database* db, const std::string& table, const FtsStructure& structure) {
  std::size_t segments = 0;
  for (const FtsStructure::Level& level : structure.levels) segments += level.segments.size();
  std::string record = structure.cookie;
  const auto put = [&record](std::int64_t number) {
    AppendVarint(&record, static_cast<std::uint64_t>(number));
  };
  AppendVarint(&record, structure.levels.size());
  AppendVarint(&record, segments);
  put(structure.leaves_written);
  for (const FtsStructure::Level& level : structure.levels) {
    put(level.merging);
    AppendVarint(&record, level.segments.size());
    for (const Segment& segment : level.segments) {
      put(segment.id);
      put(segment.first_leaf);
      put(segment.last_leaf);
    }
  }
  WriteRecord(db, table, kStructureRow, record);
}

void AddToTotals(Database* db, const std::string& table, std::uint64_t rows,
                 const std::vector<std::uint64_t>& words) {
  const std::string old = ReadRecord(db, table, kTotalsRow);
  const char* at = old.data();
  const char* const end = at + old.size();
  const auto take = [&] { return at < end ? TakeVarint(&at, end) : 0; };
  std::string record;
  AppendVarint(&record, take() + rows);
  for (const std::uint64_t count : words) AppendVarint(&record, take() + count);
  WriteRecord(db, table, kTotalsRow, record);
}

}  // namespace quarry::engine
