#include "daemons/tarnelasticd/segment_merger.h"

#include <algorithm>
#include <limits>
#include <memory>
#include <optional>
#include <utility>

#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/segment_reader.h"
#include "daemons/tarnelasticd/segment_writer.h"

namespace quarry::engine {
namespace {

constexpr char kMainIndex = '0';
// Each is read through a statement of its own.
constexpr std::size_t kMostInputs = 64;
// So many are removed at a time.
constexpr std::int64_t kLeavesToRemove = 64;
// Leaves that are merged while one change waits.
constexpr std::int64_t kMostLeaves = 20000;
// So many may be written anew for the sake of one.
constexpr std::int64_t kFewLeaves = 256;
// More than a table of any size comes to by itself.
constexpr std::size_t kManyLevels = 8;

[[noreturn]] void FailDamaged() {
  throw Error(kDamagedIndex, "The full text is not as it should be");
}

std::int64_t CountLeaves(const std::vector<Segment>& segments) {
  std::int64_t leaves = 0;
  for (const Segment& segment : segments) leaves += segment.last_leaf - segment.first_leaf + 1;
  return leaves;
}

class SegmentMerger {
 public:
  // `segments` are in order of their age, the oldest first. Where `is_oldest`, there is none before
  // them, so that it need not be known any more which rows have been deleted.
  SegmentMerger(Database* db, const std::string& table, const std::vector<Segment>& segments,
                bool is_oldest, const WordVisitor& visit)
      : is_oldest_(is_oldest),
        visit_(visit),
        remove_rows_(db->Prepare("DELETE FROM " + table + "_data WHERE id>=?1 AND id<?2")),
        remove_places_(db->Prepare("DELETE FROM " + table + "_idx WHERE segid=?1")) {
    for (const Segment& segment : segments) {
      inputs_.push_back({segment.id, std::make_unique<SegmentReader>(db, table, segment, [] {}),
                         segment.first_leaf, Entry()});
    }
  }

  // Writes the words of all segments, and removes these.
  void Merge(SegmentWriter* writer) {
    for (Input& input : inputs_) {
      if (input.reader->Seek("")) reading_.push_back(&input);
    }
    while (!reading_.empty()) {
      TakeInputsAtFirstWord();
      const std::string& word = at_word_.front()->reader->key();
      // Words in another order could not be found again.
      if (word <= word_) FailDamaged();
      word_ = word;
      MergeLists(writer);
    }
    for (const Input& input : inputs_) RemoveSegment(input.segment);
    if (visit_) visit_("", {});
  }

 private:
  struct Input {
    std::int64_t segment;
    std::unique_ptr<SegmentReader> reader;
    std::int64_t first_leaf;  // that has not been removed
    Entry entry;              // of the word at hand
  };

  void TakeInputsAtFirstWord() {
    at_word_.clear();
    for (Input* const input : reading_) {
      const int order =
          at_word_.empty() ? 0 : input->reader->key().compare(at_word_.front()->reader->key());
      if (order < 0) at_word_.clear();
      if (order <= 0) at_word_.push_back(input);
    }
  }

  void MergeLists(SegmentWriter* writer) {
    is_written_ = false;
    rows_.clear();
    for (Input*& input : at_word_) {
      if (!Advance(input)) input = nullptr;
    }
    for (std::erase(at_word_, nullptr); !at_word_.empty(); std::erase(at_word_, nullptr)) {
      MergeEntries(writer);
    }
    if (!rows_.empty() && word_.front() == kMainIndex) {
      visit_(std::string_view(word_).substr(1), rows_);
    }
  }

  // Writes, of one input, all that comes before what others have.
  void MergeEntries(SegmentWriter* writer) {
    Input** first = &at_word_.front();
    for (Input*& input : at_word_) {
      // What the newest segment says of a row holds.
      if (input->entry.id <= (*first)->entry.id) first = &input;
    }
    std::int64_t end = std::numeric_limits<std::int64_t>::max();
    for (Input*& input : at_word_) {
      if (&input == first) continue;
      if (input->entry.id == (*first)->entry.id && !Advance(input)) {
        input = nullptr;
      } else {
        end = std::min(end, input->entry.id);
      }
    }
    bool has_more = true;
    do {
      Write((*first)->entry, writer);
      has_more = Advance(*first);
    } while (has_more && (*first)->entry.id < end);
    if (!has_more) *first = nullptr;
  }

  void Write(const Entry& entry, SegmentWriter* writer) {
    if (entry.positions.empty() && (is_oldest_ || !entry.is_marked)) return;
    if (!is_written_) writer->BeginWord(word_);
    is_written_ = true;
    writer->AddEntry(entry);
    if (visit_ && !entry.positions.empty()) rows_.push_back(entry.id);
  }

  // To the next entry; behind the last one to the next word, and returns false.
  bool Advance(Input* input) {
    if (input->reader->TakeEntry(&input->entry)) return true;
    if (!input->reader->Next()) {
      std::erase(reading_, input);
      return false;
    }
    const std::int64_t leaf = input->reader->leaf();
    if (leaf - input->first_leaf >= kLeavesToRemove) {
      const std::int64_t base = input->segment << kLeafBits;
      remove_rows_.Bind(1, base + input->first_leaf).Bind(2, base + leaf).Run();
      input->first_leaf = leaf;
    }
    return false;
  }

  void RemoveSegment(std::int64_t segment) {
    remove_rows_.Bind(1, segment << kLeafBits).Bind(2, (segment + 1) << kLeafBits).Run();
    remove_places_.Bind(1, segment).Run();
  }

  const bool is_oldest_;
  const WordVisitor& visit_;
  Statement remove_rows_;
  Statement remove_places_;
  std::vector<Input> inputs_;    // the oldest first, like those below
  std::vector<Input*> reading_;  // at a word
  std::vector<Input*> at_word_;  // at an entry of the word at hand
  std::string word_;
  bool is_written_ = false;         // whether the word at hand has been begun
  std::vector<std::int64_t> rows_;  // that have it
};

// The oldest segments of a level go on to the next one as they are where the newest is far smaller:
// they would be written anew for the sake of a few leaves. Returns whether any do.
bool PassOnLarge(std::size_t level, FtsStructure* structure) {
  constexpr std::int64_t kTimes = 8;
  if (level + 1 >= kManyLevels) return false;
  if (level + 1 == structure->levels.size()) structure->levels.emplace_back();
  std::vector<Segment>& from = structure->levels[level].segments;
  std::vector<Segment>& to = structure->levels[level + 1].segments;
  const std::int64_t large = std::max(kFewLeaves, kTimes * CountLeaves({from.back()}));
  const auto first_small = std::find_if(from.begin(), from.end(), [large](const Segment& segment) {
    return CountLeaves({segment}) < large;
  });
  const bool has_large = first_small != from.begin();
  to.insert(to.end(), from.begin(), first_small);
  from.erase(from.begin(), first_small);
  return has_large;
}

// Makes `segments` of `structure`, which are not in it any more, one segment `id` of a level.
void MergeInto(Database* db, const std::string& table, const std::vector<Segment>& segments,
               std::int64_t id, std::size_t level, const WordVisitor& visit,
               FtsStructure* structure) {
  if (id == 0) throw Error(kDamagedIndex, "The full text has too many parts");
  const bool is_oldest = std::all_of(
      structure->levels.begin() + static_cast<std::ptrdiff_t>(level), structure->levels.end(),
      [](const FtsStructure::Level& older) { return older.segments.empty(); });
  SegmentWriter writer(db, table, id);
  SegmentMerger(db, table, segments, is_oldest, visit).Merge(&writer);
  const std::int64_t leaves = writer.Finish();
  if (leaves > 0) structure->levels[level].segments.push_back({id, 1, leaves});
  WriteStructure(db, table, *structure);
}

// FTS5 takes very long for a large level, a few leaves with each commit, and newer segments come to
// that level meanwhile. Makes these one while they are about as large as those behind them, so that
// there are few of them, and no leaf is written often.
void MergeNewest(Database* db, const std::string& table, std::size_t level,
                 FtsStructure* structure) {
  std::vector<Segment>& all = structure->levels[level].segments;
  const auto begin = static_cast<std::size_t>(structure->levels[level].merging);
  std::int64_t leaves = 0;
  std::size_t first = all.size();
  while (first > begin && all.size() - first < kMostInputs) {
    const std::int64_t more = CountLeaves({all[first - 1]});
    if (leaves > 0 && more > std::max(kFewLeaves, 2 * leaves)) break;
    if (leaves + more > kMostLeaves) break;
    leaves += more;
    --first;
  }
  if (all.size() - first < kManySegments) return;
  const std::int64_t id = structure->NextSegment();
  const std::vector<Segment> newest(all.begin() + static_cast<std::ptrdiff_t>(first), all.end());
  all.resize(first);
  MergeInto(db, table, newest, id, level, {}, structure);
}

// All segments, the oldest first, or none where some are not to be touched.
std::vector<Segment> MergeableSegments(const FtsStructure& structure) {
  std::vector<Segment> segments;
  for (auto level = structure.levels.rbegin(); level != structure.levels.rend(); ++level) {
    if (level->merging > 0) return {};
    segments.insert(segments.end(), level->segments.begin(), level->segments.end());
  }
  const bool has_empty = std::any_of(segments.begin(), segments.end(), [](const Segment& segment) {
    return segment.first_leaf == 0;
  });
  return has_empty || segments.size() > kMostInputs ? std::vector<Segment>() : segments;
}

// FTS5 puts the one segment on a new level each time and never gives one up. The more there are the
// more it merges with each write, and with 2000 it takes the table for damaged.
void MergeByFts(Database* db, const std::string& table) {
  db->Execute("INSERT INTO " + table + "(" + table + ") VALUES('optimize')");
  WriteOutFts(db, table);
  std::optional<FtsStructure> structure = ReadStructure(db, table);
  if (!structure || structure->levels.size() <= kManyLevels) return;
  while (structure->levels.size() > kManyLevels) {
    const auto empty =
        std::find_if(structure->levels.begin(), structure->levels.end(),
                     [](const FtsStructure::Level& level) { return level.segments.empty(); });
    if (empty == structure->levels.end()) break;
    structure->levels.erase(empty);
  }
  WriteStructure(db, table, *structure);
  ForgetFts(db);
}

}  // namespace

bool MergeAllSegments(Database* db, const std::string& table, const WordVisitor& visit) {
  WriteOutFts(db, table);
  std::optional<FtsStructure> structure = ReadStructure(db, table);
  const std::vector<Segment> segments =
      structure ? MergeableSegments(*structure) : std::vector<Segment>();
  if (segments.size() < 2) {
    MergeByFts(db, table);
    return false;
  }
  const std::size_t levels = std::clamp<std::size_t>(structure->levels.size(), 2, kManyLevels);
  const std::int64_t id = structure->NextSegment();
  structure->levels.assign(levels, {});
  MergeInto(db, table, segments, id, levels - 1, visit, &*structure);
  ForgetFts(db);
  return true;
}

void MergeFullLevels(Database* db, const std::string& table, FtsStructure* structure) {
  for (std::size_t i = 0; i < structure->levels.size(); ++i) {
    if (structure->levels[i].segments.size() < kManySegments) continue;
    // A merge that FTS5 has begun goes on with the last segment of the next level.
    if (i > 0 && structure->levels[i - 1].merging > 0) continue;
    if (structure->levels[i].merging > 0) {
      MergeNewest(db, table, i, structure);
      continue;
    }
    if (PassOnLarge(i, structure)) WriteStructure(db, table, *structure);
    const FtsStructure::Level& level = structure->levels[i];
    if (level.segments.size() < kManySegments) continue;
    if (level.segments.size() > kMostInputs || CountLeaves(level.segments) > kMostLeaves) continue;
    const std::int64_t id = structure->NextSegment();
    const std::vector<Segment> segments = std::exchange(structure->levels[i].segments, {});
    if (i + 1 == structure->levels.size()) structure->levels.emplace_back();
    MergeInto(db, table, segments, id, i + 1, {}, structure);
  }
}

}  // namespace quarry::engine
