#include "daemons/tarnelasticd/posting_lists.h"

#include <algorithm>
#include <cstring>
#include <iterator>
#include <memory>
#include <numeric>
#include <optional>
#include <utility>

#include "daemons/tarnelasticd/doc_set.h"
#include "daemons/tarnelasticd/fts_structure.h"

namespace quarry::engine {
namespace {

constexpr char kMainIndex = '0';
constexpr std::size_t kBatch = 1024;

constexpr std::uint64_t kOnes = 0x0101010101010101U;
constexpr std::uint64_t kHighBits = 0x8080808080808080U;

// Whether one of eight bytes is 1. Sometimes says so wrongly.
bool MayHaveOne(std::uint64_t bytes) {
  const std::uint64_t difference = bytes ^ kOnes;
  return ((difference - kOnes) & ~difference & kHighBits) != 0;
}

std::size_t CountLastBytes(std::uint64_t bytes) {
  return static_cast<std::size_t>(((~bytes & kHighBits) >> 7) * kOnes >> 56);
}

// The numbers in `bytes`, or none when one of them may begin another column.
std::size_t CountNumbers(std::string_view bytes) {
  std::size_t count = 0;
  for (; bytes.size() >= sizeof(std::uint64_t); bytes.remove_prefix(sizeof(std::uint64_t))) {
    std::uint64_t some = 0;
    std::memcpy(&some, bytes.data(), sizeof some);
    if (MayHaveOne(some)) return 0;
    count += CountLastBytes(some);
  }
  for (const char c : bytes) {
    if (c == 1) return 0;
    if (static_cast<unsigned char>(c) < 0x80) ++count;
  }
  return count;
}

double WeightOf(std::uint64_t column, const std::vector<double>& weights) {
  return column < weights.size() ? weights[static_cast<std::size_t>(column)] : 1;
}

double WeighOneByOne(std::string_view positions, const std::vector<double>& weights) {
  const char* at = positions.data();
  const char* const end = at + positions.size();
  double weight = WeightOf(0, weights);
  double sum = 0;
  while (at < end) {
    if (TakeVarint(&at, end) == 1) {
      weight = WeightOf(TakeVarint(&at, end), weights);
    } else {
      sum += weight;
    }
  }
  return sum;
}

std::int64_t AddLeaves(std::int64_t sum, const Segment& segment) {
  return sum + segment.last_leaf - segment.first_leaf + 1;
}

}  // namespace

// Nearly always all places are in one column, the content, and their differences small.
double WeighPositions(std::string_view positions, const std::vector<double>& weights) {
  std::string_view rest = positions;
  std::uint64_t column = 0;
  if (rest.size() > 2 && rest[0] == 1 && static_cast<unsigned char>(rest[1]) < 0x80) {
    column = static_cast<unsigned char>(rest[1]);
    rest.remove_prefix(2);
  }
  const std::size_t count = CountNumbers(rest);
  if (count == 0) return WeighOneByOne(positions, weights);
  return static_cast<double>(count) * WeightOf(column, weights);
}

// Gathers postings: of each document what the newest segment says.
class PostingLists::Gatherer {
 public:
  // What lies behind `last_id` has been deleted, or is damage that must not take memory.
  // Without weights, how often a document has a word is not counted.
  Gatherer(const std::vector<double>* weights, std::int64_t last_id, const Visitor& visit)
      : weights_(weights), last_id_(last_id), visit_(visit) {
    batch_.reserve(kBatch);
  }

  void BeginWord() {
    for (const std::int64_t id : settled_ids_) settled_.Remove(id);
    settled_ids_.clear();
  }

  // To be called with a word's entries in the newest segment first: what it says of a document
  // holds. `has_older` tells whether other segments may follow.
  void Add(const Entry& entry, bool has_older) {
    if (entry.id > last_id_) return;
    if (!settled_ids_.empty() && settled_.Contains(entry.id)) return;
    if (has_older) {
      settled_.Add(entry.id);
      settled_ids_.push_back(entry.id);
    }
    if (entry.positions.empty()) return;
    const double weight = weights_ == nullptr ? 1 : WeighPositions(entry.positions, *weights_);
    batch_.push_back({entry.id, static_cast<float>(weight)});
    if (batch_.size() == kBatch) Flush();
  }

  void Flush() {
    visit_(batch_);
    batch_.clear();
  }

 private:
  const std::vector<double>* const weights_;
  const std::int64_t last_id_;
  const Visitor& visit_;
  std::vector<Posting> batch_;
  DocSet settled_;  // documents that newer segments have spoken for
  std::vector<std::int64_t> settled_ids_;
};

PostingLists::PostingLists(Database* db, std::string table, std::int64_t last_id,
                           std::vector<double> weights, std::function<void()> check)
    : db_(db),
      table_(std::move(table)),
      last_id_(last_id),
      weights_(std::move(weights)),
      check_(std::move(check)) {
  const std::optional<FtsStructure> structure = ReadStructure(db_, table_);
  if (!structure) return;
  is_readable_ = true;
  for (const FtsStructure::Level& level : structure->levels) {
    std::copy_if(level.segments.rbegin(), level.segments.rend(), std::back_inserter(segments_),
                 [](const Segment& segment) { return segment.first_leaf > 0; });
  }
}

std::int64_t PostingLists::leaves() const {
  return std::accumulate(segments_.begin(), segments_.end(), std::int64_t{0}, AddLeaves);
}

// A large one would be written anew for minutes, and is merged step by step as it grows anyway. In
// a few segments of about the same size hardly any word is repeated so often that merging would
// pay.
bool PostingLists::IsWorthMerging() const {
  constexpr std::int64_t kMaxLeaves = 20000;
  constexpr std::int64_t kFewLeaves = 512;
  constexpr std::int64_t kFewSegments = 3;
  const std::int64_t all = leaves();
  std::int64_t large_ones = 0;
  std::int64_t in_large_ones = 0;
  std::int64_t largest = 0;
  for (const Segment& segment : segments_) {
    const std::int64_t size = AddLeaves(0, segment);
    largest = std::max(largest, size);
    if (size * 16 < all) continue;
    ++large_ones;
    in_large_ones += size;
  }
  if (all > kMaxLeaves) return false;
  const std::int64_t kept =
      all > kFewLeaves && large_ones <= kFewSegments ? in_large_ones : largest;
  return (all - kept) * 8 > all;
}

void PostingLists::ForEach(std::string_view word, bool prefix, const Visitor& visit) {
  const std::string key = kMainIndex + std::string(word);
  Gatherer gatherer(&weights_, last_id_, visit);
  if (prefix) {
    GatherBeginning(key, &gatherer, [](const std::string&) {});
  } else {
    GatherWord(key, &gatherer);
  }
  gatherer.Flush();
}

void PostingLists::GatherWord(const std::string& key, Gatherer* gatherer) {
  for (const Segment& segment : segments_) {
    SegmentReader reader(db_, table_, segment, check_);
    if (!reader.Seek(key) || reader.key() != key) continue;
    const bool has_older = &segment != &segments_.back();
    reader.ReadList([&](const Entry& entry) { gatherer->Add(entry, has_older); });
  }
}

void PostingLists::CountWords(
    const std::function<std::int64_t(std::int64_t id)>& count_of,
    const std::function<void(std::string_view word, std::int64_t rows)>& visit) {
  std::int64_t rows = 0;
  const Visitor add = [&](const std::vector<Posting>& some) {
    for (const Posting& posting : some) rows += count_of(posting.id);
  };
  Gatherer gatherer(nullptr, last_id_, add);
  GatherBeginning(std::string(1, kMainIndex), &gatherer, [&](const std::string& key) {
    gatherer.Flush();
    if (rows > 0) visit(std::string_view(key).substr(1), rows);
    rows = 0;
  });
}

// Word by word through all segments at once: what a newer one says of a word holds.
template <typename WordEnd>
void PostingLists::GatherBeginning(const std::string& key, Gatherer* gatherer, WordEnd word_end) {
  const auto is_meant = [&key](const SegmentReader& reader) {
    return reader.key().compare(0, key.size(), key) == 0;
  };
  std::vector<std::unique_ptr<SegmentReader>> readers;  // at a word that is meant
  for (const Segment& segment : segments_) {
    auto reader = std::make_unique<SegmentReader>(db_, table_, segment, check_);
    if (reader->Seek(key) && is_meant(*reader)) readers.push_back(std::move(reader));
  }
  while (!readers.empty()) {
    std::string next = readers.front()->key();
    for (const auto& reader : readers) next = std::min(next, reader->key());
    gatherer->BeginWord();
    for (auto& reader : readers) {
      if (reader->key() != next) continue;
      const bool has_older = &reader != &readers.back();
      reader->ReadList([&](const Entry& entry) { gatherer->Add(entry, has_older); });
      if (!reader->Next() || !is_meant(*reader)) reader.reset();
    }
    std::erase(readers, nullptr);
    word_end(next);
  }
}

}  // namespace quarry::engine
