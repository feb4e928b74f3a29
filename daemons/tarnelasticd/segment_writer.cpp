#include "daemons/tarnelasticd/segment_writer.h"

#include <algorithm>
#include <cstring>

#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/fts_number.h"

namespace quarry::engine {
namespace {

constexpr std::size_t kHeader = 4;

void PutNumber16(char* at, std::size_t number) {
  at[0] = static_cast<char>(number >> 8 & 0xffU);
  at[1] = static_cast<char>(number & 0xffU);
}

std::size_t CommonBytes(std::string_view a, std::string_view b) {
  const auto end = std::mismatch(a.begin(), a.begin() + std::min(a.size(), b.size()), b.begin());
  return static_cast<std::size_t>(end.first - a.begin());
}

// How many of the first `most` bytes are whole numbers.
std::size_t WholeNumbers(std::string_view numbers, std::size_t most) {
  while (most > 0 && static_cast<unsigned char>(numbers[most - 1]) >= 0x80) --most;
  return most;
}

}  // namespace

SegmentWriter::SegmentWriter(Database* db, const std::string& table, std::int64_t segment)
    : leaves_(db->Prepare("INSERT INTO " + table + "_data(id,block) VALUES(?1,?2)")),
      places_(db->Prepare("INSERT INTO " + table + "_idx(segid,term,pgno) VALUES(?1,?2,?3)")),
      doclist_index_(db, table, segment),
      segment_(segment),
      leaf_bytes_(2 * kLeafBytes + kMaxKey, '\0') {
  BeginLeaf();
}

// Bytes that the leaf still takes.
std::size_t SegmentWriter::Room() const {
  const std::size_t used = Used() + words_.size();
  return used < kLeafBytes ? kLeafBytes - used : 0;
}

void SegmentWriter::Put(std::uint64_t number) {
  at_ = PutVarint(at_, number);
}

// Most are that short, for which a call would cost more.
void SegmentWriter::Put(std::string_view bytes) {
  constexpr std::size_t kShort = 4;
  if (bytes.size() > kShort) {
    std::memcpy(at_, bytes.data(), bytes.size());
    at_ += bytes.size();
  } else {
    for (const char byte : bytes) *at_++ = byte;
  }
}

// The words that begin on this leaf are not before `key`.
void SegmentWriter::BeginPlace(std::string_view key) {
  EndPlace();
  place_ = key;
  place_leaf_ = leaf_;
}

// The mark tells that the list of its last word has an index.
void SegmentWriter::EndPlace() {
  const std::int64_t mark = doclist_index_.Finish() ? 1 : 0;
  places_.Bind(1, segment_).BindBlob(2, place_).Bind(3, place_leaf_ << 1 | mark).Run();
}

void SegmentWriter::BeginWord(std::string_view key) {
  if (key.size() > kMaxKey) throw Error(kDamagedIndex, "The full text is not as it should be");
  if (Room() < key.size() + 2 * kMaxVarint && Used() > kHeader) EndLeaf();
  AppendVarint(&words_, Used() - last_word_);
  last_word_ = Used();
  const std::size_t common = CommonBytes(key_, key);
  if (has_word_) {
    Put(common);
    Put(key.size() - common);
    Put(key.substr(common));
  } else {
    // The shortest text that tells this leaf's words from those before.
    if (leaf_ > 1) BeginPlace(key.substr(0, common + 1));
    Put(key.size());
    Put(key);
  }
  doclist_index_.Begin(leaf_);
  key_ = key;
  last_row_ = 0;
  has_word_ = true;
  is_next_row_whole_ = true;
}

void SegmentWriter::AddEntry(const Entry& entry) {
  // A row's id and size are never parted.
  if (Room() < 2 * kMaxVarint) EndLeaf();
  if (!has_word_ && !is_begun_) {
    PutNumber16(leaf_bytes_.data(), Used());
    doclist_index_.AddRow(leaf_, entry.id);
    is_begun_ = true;
    is_next_row_whole_ = true;
  }
  Put(static_cast<std::uint64_t>(is_next_row_whole_ ? entry.id : entry.id - last_row_));
  Put(2 * entry.positions.size() + (entry.is_marked ? 1 : 0));
  is_next_row_whole_ = false;
  last_row_ = entry.id;
  AddPositions(entry.positions);
}

void SegmentWriter::AddList(std::string_view list) {
  const char* at = list.data();
  const char* const end = at + list.size();
  Entry entry;
  while (at < end) {
    entry.id += static_cast<std::int64_t>(TakeVarint(&at, end));
    const std::uint64_t size = TakeVarint(&at, end) >> 1;
    entry.positions = {at, static_cast<std::size_t>(size)};
    at += size;
    AddEntry(entry);
  }
}

// Where they do not fit they go on with the next leaf, which begins with a whole number.
void SegmentWriter::AddPositions(std::string_view positions) {
  while (positions.size() > Room()) {
    const std::size_t part = WholeNumbers(positions, Room());
    if (part == 0 && Used() == kHeader) {
      throw Error(kDamagedIndex, "The full text is not as it should be");
    }
    Put(positions.substr(0, part));
    positions.remove_prefix(part);
    EndLeaf();
  }
  Put(positions);
}

void SegmentWriter::BeginLeaf() {
  std::fill_n(leaf_bytes_.data(), kHeader, '\0');
  at_ = leaf_bytes_.data() + kHeader;
  words_.clear();
  last_word_ = 0;
  has_word_ = false;
  is_begun_ = false;
}

void SegmentWriter::EndLeaf() {
  if (!has_word_) doclist_index_.AddLeaf(is_begun_);
  PutNumber16(leaf_bytes_.data() + 2, Used());
  Put(words_);
  leaves_.Bind(1, (segment_ << kLeafBits) + leaf_).BindBlob(2, {leaf_bytes_.data(), Used()}).Run();
  ++leaf_;
  BeginLeaf();
}

std::int64_t SegmentWriter::Finish() {
  if (Used() > kHeader) EndLeaf();
  if (leaf_ > 1) EndPlace();
  return leaf_ - 1;
}

}  // namespace quarry::engine
