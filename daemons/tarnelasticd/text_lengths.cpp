#include "daemons/tarnelasticd/text_lengths.h"

#include <algorithm>
#include <limits>

#include "daemons/tarnelasticd/doc_set.h"
#include "daemons/tarnelasticd/segment_reader.h"
#include "daemons/tarnelasticd/varint.h"

namespace quarry::engine {
namespace {

// Documents to a row: as many as make rows that a page takes several of.
constexpr std::int64_t kBlock = 256;
constexpr std::size_t kWidth = 4;  // bytes of a length, the lowest first

// The row of the sums over all documents: how many have a text, and how many words there are.
constexpr std::int64_t kSums = -1;

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

// FTS5 keeps a number for each column. One more than their sum.
std::size_t AddUp(std::string_view sizes) {
  const char* at = sizes.data();
  const char* const end = at + sizes.size();
  std::uint64_t sum = 1;
  while (at < end) sum += TakeVarint(&at, end);
  constexpr std::uint64_t kMost = std::numeric_limits<std::uint32_t>::max();
  return static_cast<std::size_t>(std::min(sum, kMost));
}

struct Sums {
  std::uint64_t documents = 0;
  std::uint64_t words = 0;

  // A document's entry takes the place of another.
  void Exchange(std::size_t old, std::size_t now) {
    if (old > 0) Add(-std::uint64_t{1}, -std::uint64_t{old - 1});
    if (now > 0) Add(1, now - 1);
  }
  void Add(std::uint64_t more_documents, std::uint64_t more_words) {
    documents += more_documents;
    words += more_words;
  }
};

// What stands for a document: nothing without a text, else one more than its words.
std::size_t EntryOf(Statement* sizes, std::int64_t doc) {
  sizes->Bind(1, doc);
  const std::size_t entry = sizes->Step() ? AddUp(sizes->Blob(0)) : 0;
  sizes->Reset();
  return entry;
}

std::string ReadBlock(Statement* row, std::int64_t block) {
  row->Bind(1, block);
  std::string lengths;
  if (row->Step()) lengths = row->Blob(0);
  row->Reset();
  return lengths;
}

Sums ReadSums(Statement* row) {
  const std::string bytes = ReadBlock(row, kSums);
  std::string_view rest = bytes;
  Sums sums;
  if (rest.empty()) return sums;
  sums.documents = TakeNumber(&rest);
  sums.words = TakeNumber(&rest);
  return sums;
}

std::string Packed(const Sums& sums) {
  std::string bytes;
  AppendNumber(&bytes, sums.documents);
  AppendNumber(&bytes, sums.words);
  return bytes;
}

}  // namespace

std::string CreateLengthTable() {
  return "CREATE TABLE text_lengths(block INTEGER PRIMARY KEY, words BLOB NOT NULL);";
}

void UpdateTextLengths(Database* db, const std::vector<std::int64_t>& docs) {
  if (docs.empty()) return;
  Statement sizes = db->Prepare(
      "SELECT sz FROM body_docsize"
      " WHERE id=coalesce((SELECT text FROM text_copies WHERE doc=?1),?1)");
  Statement old = db->Prepare(kSelect);
  Statement write = db->Prepare("INSERT OR REPLACE INTO text_lengths(block,words) VALUES(?1,?2)");
  Sums sums = ReadSums(&old);
  for (auto doc = docs.begin(); doc != docs.end();) {
    CheckId(*doc);
    const std::int64_t block = *doc / kBlock;
    std::string lengths = ReadBlock(&old, block);
    for (; doc != docs.end() && *doc / kBlock == block; ++doc) {
      const std::size_t entry = EntryOf(&sizes, *doc);
      sums.Exchange(Read(lengths, PlaceOf(*doc)), entry);
      Write(&lengths, PlaceOf(*doc), entry);
    }
    write.Bind(1, block).BindBlob(2, lengths).Run();
  }
  const std::string packed = Packed(sums);
  write.Bind(1, kSums).BindBlob(2, packed).Run();
}

TextLengths::TextLengths(Database* db) : row_(db->Prepare(kSelect)) {}

std::size_t TextLengths::Of(std::int64_t doc) {
  if (doc / kBlock != block_) Load(doc / kBlock);
  const std::size_t entry = Read(lengths_, PlaceOf(doc));
  return entry > 0 ? entry - 1 : 0;
}

double TextLengths::Average() {
  const Sums sums = ReadSums(&row_);
  if (sums.documents == 0 || sums.words == 0) return 1;
  return static_cast<double>(sums.words) / static_cast<double>(sums.documents);
}

void TextLengths::Load(std::int64_t block) {
  lengths_ = ReadBlock(&row_, block);
  block_ = block;
}

}  // namespace quarry::engine
