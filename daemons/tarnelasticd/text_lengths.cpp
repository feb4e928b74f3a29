#include "daemons/tarnelasticd/text_lengths.h"

#include <algorithm>
#include <limits>

#include "daemons/tarnelasticd/doc_set.h"
#include "daemons/tarnelasticd/segment_reader.h"

namespace quarry::engine {
namespace {

// Documents to a row: as many as make rows that a page takes several of.
constexpr std::int64_t kBlock = 256;
constexpr std::size_t kWidth = 4;  // bytes of a length, the lowest first

constexpr const char* kSelect = "SELECT words FROM text_lengths WHERE block=?1";

std::size_t PlaceOf(std::int64_t id) {
  return static_cast<std::size_t>(id % kBlock) * kWidth;
}

std::size_t Read(const std::string& lengths, std::size_t at) {
  if (at + kWidth > lengths.size()) return 0;
  std::size_t length = 0;
  for (std::size_t i = kWidth; i > 0; --i) {
    length = length << 8 | static_cast<unsigned char>(lengths[at + i - 1]);
  }
  return length;
}

void Write(std::string* lengths, std::size_t at, std::size_t length) {
  if (lengths->size() < at + kWidth) lengths->resize(at + kWidth);
  for (std::size_t i = 0; i < kWidth; ++i) {
    (*lengths)[at + i] = static_cast<char>(length & 0xffU);
    length >>= 8;
  }
}

// FTS5 keeps a number for each column.
std::size_t AddUp(std::string_view sizes) {
  const char* at = sizes.data();
  const char* const end = at + sizes.size();
  std::uint64_t sum = 0;
  while (at < end) sum += TakeVarint(&at, end);
  constexpr std::uint64_t kMost = std::numeric_limits<std::uint32_t>::max();
  return static_cast<std::size_t>(std::min(sum, kMost));
}

std::string ReadBlock(Statement* row, std::int64_t block) {
  row->Bind(1, block);
  std::string lengths;
  if (row->Step()) lengths = row->Blob(0);
  row->Reset();
  return lengths;
}

}  // namespace

std::string CreateLengthTable() {
  return "CREATE TABLE text_lengths(block INTEGER PRIMARY KEY, words BLOB NOT NULL);";
}

void UpdateTextLengths(Database* db, const std::vector<std::int64_t>& ids) {
  Statement sizes = db->Prepare("SELECT sz FROM body_docsize WHERE id=?1");
  Statement old = db->Prepare(kSelect);
  Statement write = db->Prepare("INSERT OR REPLACE INTO text_lengths(block,words) VALUES(?1,?2)");
  for (auto id = ids.begin(); id != ids.end();) {
    CheckId(*id);
    const std::int64_t block = *id / kBlock;
    std::string lengths = ReadBlock(&old, block);
    for (; id != ids.end() && *id / kBlock == block; ++id) {
      sizes.Bind(1, *id);
      Write(&lengths, PlaceOf(*id), sizes.Step() ? AddUp(sizes.Blob(0)) : 0);
      sizes.Reset();
    }
    write.Bind(1, block).BindBlob(2, lengths).Run();
  }
}

TextLengths::TextLengths(Database* db) : row_(db->Prepare(kSelect)) {}

std::size_t TextLengths::Of(std::int64_t id) {
  if (id / kBlock != block_) Load(id / kBlock);
  return Read(lengths_, PlaceOf(id));
}

void TextLengths::Load(std::int64_t block) {
  lengths_ = ReadBlock(&row_, block);
  block_ = block;
}

}  // namespace quarry::engine
