#include "daemons/tarnelasticd/segment_reader.h"

#include <algorithm>
#include <utility>

#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::engine {
namespace {

constexpr std::size_t kHeader = 4;
constexpr std::size_t kLeavesBetweenChecks = 64;
// Far more than a word's positions in one text of the largest size can take.
constexpr std::uint64_t kMaxPositions = std::uint64_t{1} << 30;

[[noreturn]] void FailDamaged() {
  throw Error(kDamagedIndex, "The full text is not as it should be");
}

std::size_t Number16(std::string_view leaf, std::size_t at) {
  return std::size_t{static_cast<unsigned char>(leaf[at])} << 8 |
         static_cast<unsigned char>(leaf[at + 1]);
}

}  // namespace

std::uint64_t TakeLongVarint(const char** at, const char* end) {
  std::uint64_t value = 0;
  for (int i = 0; i < 9; ++i) {
    if (*at >= end) FailDamaged();
    const auto byte = static_cast<unsigned char>(*(*at)++);
    if (i == 8) return value << 8 | byte;
    value = value << 7 | (byte & 0x7fU);
    if (byte < 0x80) break;
  }
  return value;
}

SegmentReader::SegmentReader(Database* db, const std::string& table, const Segment& segment,
                             std::function<void()> check)
    : db_(db),
      table_(table),
      leaves_(db->Prepare("SELECT block,id FROM " + table + "_data WHERE id BETWEEN ?1 AND ?2")),
      segment_(segment),
      check_(std::move(check)) {}

// The leaf that the word is on, if it is there.
std::int64_t SegmentReader::FindLeaf(std::string_view key) {
  Statement place = db_->Prepare("SELECT pgno>>1 FROM " + table_ +
                                 "_idx WHERE segid=?1 AND term<=?2 ORDER BY term DESC LIMIT 1");
  place.Bind(1, segment_.id).BindBlob(2, key);
  return place.Step() ? std::max(segment_.first_leaf, place.Int(0)) : segment_.first_leaf;
}

bool SegmentReader::Seek(std::string_view key) {
  const std::int64_t base = segment_.id << kLeafBits;
  next_leaf_ = base + FindLeaf(key);
  leaves_.Bind(1, next_leaf_).Bind(2, base + segment_.last_leaf);
  while (NextLeaf()) {
    while (next_word_ < words_.size()) {
      ReadKey();
      if (key_ >= key) return true;
    }
  }
  return false;
}

bool SegmentReader::Next() {
  while (next_word_ >= words_.size()) {
    if (!NextLeaf()) return false;
  }
  ReadKey();
  return true;
}

bool SegmentReader::NextLeaf() {
  if (++leaves_read_ % kLeavesBetweenChecks == 0) check_();
  // A statement that is at its end would begin anew.
  is_at_end_ = is_at_end_ || !leaves_.Step();
  if (is_at_end_) {
    CheckAllRead();
    return false;
  }
  if (leaves_.Int(1) != next_leaf_++) FailDamaged();
  leaf_ = leaves_.Blob(0);
  if (leaf_.size() < kHeader) FailDamaged();
  const std::size_t end = Number16(leaf_, 2);
  if (end < kHeader || end > leaf_.size()) FailDamaged();
  at_ = leaf_.data() + kHeader;
  contents_end_ = leaf_.data() + end;
  words_.clear();
  next_word_ = 0;
  const char* place = contents_end_;
  std::size_t word = 0;
  while (place < leaf_.data() + leaf_.size()) {
    word += static_cast<std::size_t>(TakeVarint(&place, leaf_.data() + leaf_.size()));
    if (word < kHeader || word >= end || (!words_.empty() && word <= words_.back())) FailDamaged();
    words_.push_back(word);
  }
  is_first_ = true;
  return true;
}

// A leaf that is missing must not pass for the end of a list.
void SegmentReader::CheckAllRead() const {
  if (next_leaf_ <= (segment_.id << kLeafBits) + segment_.last_leaf) FailDamaged();
}

// Words share the beginning of the one before, on the same leaf.
void SegmentReader::ReadKey() {
  const bool is_first_word = next_word_ == 0;
  at_ = leaf_.data() + words_[next_word_++];
  const std::uint64_t kept = is_first_word ? 0 : TakeNumber();
  const std::uint64_t size = TakeNumber();
  if (kept > key_.size() || size > static_cast<std::size_t>(Limit() - at_)) FailDamaged();
  key_.resize(static_cast<std::size_t>(kept));
  key_.append(at_, static_cast<std::size_t>(size));
  at_ += size;
  row_ = 0;
  is_first_ = true;
}

// Where the list at hand ends on this leaf, or the leaf.
const char* SegmentReader::Limit() const {
  return next_word_ < words_.size() ? leaf_.data() + words_[next_word_] : contents_end_;
}

bool SegmentReader::TakeEntry(Entry* entry) {
  while (at_ >= Limit()) {
    if (next_word_ < words_.size() || !NextLeaf()) return false;
  }
  const std::uint64_t step = TakeNumber();
  const auto row = static_cast<std::uint64_t>(row_);
  const std::uint64_t next = is_first_ ? step : row + step;
  if (next <= row || next > std::uint64_t{INT64_MAX}) FailDamaged();
  row_ = static_cast<std::int64_t>(next);
  is_first_ = false;
  const std::uint64_t size = TakeNumber();
  entry->id = row_;
  entry->is_marked = (size & 1) != 0;
  entry->positions = TakePositions(size >> 1);
  return true;
}

std::string_view SegmentReader::TakePositions(std::uint64_t size) {
  if (size > kMaxPositions) FailDamaged();
  auto left = static_cast<std::size_t>(size);
  const auto here = static_cast<std::size_t>(Limit() - at_);
  if (left <= here) {
    const std::string_view positions(at_, left);
    at_ += left;
    return positions;
  }
  positions_.clear();
  while (left > 0) {
    while (at_ >= Limit()) {
      if (next_word_ < words_.size() || !NextLeaf()) FailDamaged();
    }
    const std::size_t part = std::min(left, static_cast<std::size_t>(Limit() - at_));
    positions_.append(at_, part);
    at_ += part;
    left -= part;
  }
  return positions_;
}

}  // namespace quarry::engine
