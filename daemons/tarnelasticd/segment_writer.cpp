#include "daemons/tarnelasticd/segment_writer.h"

#include <algorithm>

#include "daemons/tarnelasticd/fts_number.h"
#include "daemons/tarnelasticd/segment_reader.h"

namespace quarry::engine {
namespace {

constexpr std::size_t kHeader = 4;
constexpr int kLeafBits = 37;  // as segment_reader.cpp says

void PutNumber16(std::string* leaf, std::size_t at, std::size_t number) {
  (*leaf)[at] = static_cast<char>(number >> 8 & 0xffU);
  (*leaf)[at + 1] = static_cast<char>(number & 0xffU);
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
      segment_(segment),
      contents_(kHeader, '\0') {
  AddPlace("");
}

// Bytes that the leaf still takes.
std::size_t SegmentWriter::Room() const {
  const std::size_t used = contents_.size() + words_.size();
  return used < kLeafBytes ? kLeafBytes - used : 0;
}

// The words that begin on this leaf are not before `key`.
void SegmentWriter::AddPlace(std::string_view key) {
  places_.Bind(1, segment_).BindBlob(2, key).Bind(3, leaf_ << 1).Run();
}

void SegmentWriter::AddKey(std::string_view key) {
  if (Room() < key.size() + 2 * kMaxVarint && contents_.size() > kHeader) EndLeaf();
  AppendVarint(&words_, contents_.size() - last_word_);
  last_word_ = contents_.size();
  const std::size_t common = CommonBytes(key_, key);
  if (has_word_) {
    AppendVarint(&contents_, common);
    AppendVarint(&contents_, key.size() - common);
    contents_ += key.substr(common);
  } else {
    // The shortest text that tells this leaf's words from those before.
    if (leaf_ > 1) AddPlace(key.substr(0, common + 1));
    AppendVarint(&contents_, key.size());
    contents_ += key;
  }
  key_ = key;
  has_word_ = true;
}

void SegmentWriter::Add(std::string_view key, std::string_view list) {
  AddKey(key);
  const char* at = list.data();
  const char* const end = at + list.size();
  bool is_whole = true;
  for (std::uint64_t row = 0; at < end;) {
    const std::uint64_t step = TakeVarint(&at, end);
    const std::uint64_t size = TakeVarint(&at, end);
    row += step;
    // A row's id and size are never parted.
    if (Room() < 2 * kMaxVarint) EndLeaf();
    if (!has_word_ && !is_begun_) {
      PutNumber16(&contents_, 0, contents_.size());
      is_begun_ = true;
      is_whole = true;
    }
    AppendVarint(&contents_, is_whole ? row : step);
    is_whole = false;
    AppendVarint(&contents_, size);
    AddPositions({at, static_cast<std::size_t>(size >> 1)});
    at += size >> 1;
  }
}

// Where they do not fit they go on with the next leaf, which begins with a whole number.
void SegmentWriter::AddPositions(std::string_view positions) {
  while (positions.size() > Room()) {
    const std::size_t part = WholeNumbers(positions, Room());
    contents_ += positions.substr(0, part);
    positions.remove_prefix(part);
    EndLeaf();
  }
  contents_ += positions;
}

void SegmentWriter::EndLeaf() {
  PutNumber16(&contents_, 2, contents_.size());
  contents_ += words_;
  leaves_.Bind(1, (segment_ << kLeafBits) + leaf_).BindBlob(2, contents_).Run();
  ++leaf_;
  contents_.assign(kHeader, '\0');
  words_.clear();
  last_word_ = 0;
  has_word_ = false;
  is_begun_ = false;
}

std::int64_t SegmentWriter::Finish() {
  if (contents_.size() > kHeader) EndLeaf();
  return leaf_ - 1;
}

}  // namespace quarry::engine
