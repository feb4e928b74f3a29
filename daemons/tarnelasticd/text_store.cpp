#include "daemons/tarnelasticd/text_store.h"

#include <algorithm>
#include <iterator>
#include <limits>
#include <string_view>
#include <utility>

#include "daemons/tarnelasticd/compression.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/varint.h"

namespace quarry::engine {
namespace {

// So many bytes of texts are open, and so many together with those that are being compressed.
constexpr std::size_t kOpenBytes = std::size_t{4} << 20;
constexpr std::size_t kHeldBytes = std::size_t{16} << 20;

// What a text takes in memory beside its bytes.
constexpr std::size_t kEntryBytes = 80;

std::size_t CostOf(std::string_view text) {
  return text.empty() ? 0 : text.size() + kEntryBytes;
}

[[noreturn]] void FailDamaged() {
  throw Error(kDamagedIndex, "Stored texts are damaged");
}

// So many rows are kept, and so many bytes beside the row at hand: when documents are read in order
// of their paths, these are of a few rows at a time. A text that has a row of its own may be large.
constexpr std::size_t kKeptRows = 16;
constexpr std::size_t kKeptBytes = std::size_t{4} << 20;

std::string Select(const char* columns, const TextTable& table, const char* rest) {
  return std::string("SELECT ") + columns + " FROM " + table.name + " WHERE " + rest;
}

constexpr char kRowOf[] = "id<=?1 ORDER BY id DESC LIMIT 1";

// Calls visit(id, text) for each text of a row until it returns false. The ids ascend.
template <typename Visit>
void ForEachText(std::int64_t row, std::string_view bytes, Visit visit) {
  if (row < 0) FailDamaged();
  std::int64_t id = row;
  for (bool first = true; !bytes.empty(); first = false) {
    const std::uint64_t step = TakeNumber(&bytes);
    const auto room = static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max() - id);
    if (first != (step == 0) || step > room) FailDamaged();
    id += static_cast<std::int64_t>(step);
    if (!visit(id, TakeCounted(&bytes))) return;
  }
}

}  // namespace

std::string CreateTextTable(const TextTable& table) {
  return std::string("CREATE TABLE ") + table.name +
         "(id INTEGER PRIMARY KEY, packed BLOB NOT NULL);";
}

TextReader::TextReader(Database* db, const TextTable& table)
    : db_(db),
      find_sql_(Select("id", table, kRowOf)),
      load_sql_(Select("packed", table, "id=?1")) {}

const std::string& TextReader::Row(std::int64_t key) {
  const auto kept = rows_.find(key);
  if (kept != rows_.end()) return kept->second;
  if (rows_.size() >= kKeptRows || kept_bytes_ >= kKeptBytes) Clear();
  Statement row = db_->Prepare(load_sql_);
  std::string bytes = row.Bind(1, key).Step() ? Decompress(row.Blob(0)) : std::string();
  kept_bytes_ += bytes.size();
  return rows_.emplace(key, std::move(bytes)).first->second;
}

void TextReader::Clear() {
  rows_.clear();
  kept_bytes_ = 0;
}

std::string TextReader::Read(std::int64_t id) {
  std::string found;
  Statement row = db_->Prepare(find_sql_);
  row.Bind(1, id);
  if (!row.Step()) return found;
  ForEachText(row.Int(0), Row(row.Int(0)), [&](std::int64_t at, std::string_view text) {
    if (at == id) found = text;
    return at < id;
  });
  return found;
}

std::string ReadText(Database* db, const TextTable& table, std::int64_t id) {
  return TextReader(db, table).Read(id);
}

TextStore::TextStore(Database* db, const TextTable& table, SideWork* work)
    : db_(db),
      work_(work),
      table_(table),
      select_sql_(Select("id,packed", table, kRowOf)),
      next_sql_(Select("min(id)", table, "id>?1")),
      delete_sql_(std::string("DELETE FROM ") + table.name + " WHERE id=?1"),
      insert_sql_(std::string("INSERT INTO ") + table.name + "(id,packed) VALUES(?1,?2)"),
      reader_(db, table) {}

TextStore::~TextStore() {
  Clear();
}

const TextStore::Texts& TextStore::TextsOf(const Row& row) {
  return row.sealed ? row.sealed->texts : row.texts;
}

TextStore::Rows::iterator TextStore::FindOpen(std::int64_t id) {
  auto row = rows_.upper_bound(id);
  if (row == rows_.begin()) return rows_.end();
  --row;
  return id < row->second.end ? row : rows_.end();
}

// The first id behind `id` that belongs to another row.
std::int64_t TextStore::EndBehind(std::int64_t id) {
  std::int64_t end = std::numeric_limits<std::int64_t>::max();
  Statement next = db_->Prepare(next_sql_);
  next.Bind(1, id).Step();
  if (!next.IsNull(0)) end = next.Int(0);
  const auto open = rows_.upper_bound(id);
  return open == rows_.end() ? end : std::min(end, open->first);
}

// The row that the id belongs to, or a new one where there is none.
TextStore::Rows::iterator TextStore::Load(std::int64_t id) {
  std::int64_t key = id;
  Row row;
  row.end = EndBehind(id);
  Statement stored = db_->Prepare(select_sql_);
  stored.Bind(1, id);
  if (stored.Step()) {
    key = stored.Int(0);
    row.stored = true;
    const std::string bytes = Decompress(stored.Blob(1));
    ForEachText(key, bytes, [&row](std::int64_t at, std::string_view text) {
      if (at >= row.end) FailDamaged();
      row.bytes += CostOf(text);
      row.texts.emplace(at, std::make_shared<const std::string>(text));
      return true;
    });
  }
  open_bytes_ += row.bytes;
  return rows_.emplace(key, std::move(row)).first;
}

// As Load(), but of a row that is full a new one begins behind its last text.
TextStore::Rows::iterator TextStore::Open(std::int64_t id) {
  auto found = FindOpen(id);
  if (found == rows_.end()) found = Load(id);
  Row& row = found->second;
  if (row.bytes < table_.row_bytes || id <= TextsOf(row).rbegin()->first) return found;
  if (!row.sealed) Seal(found->first, &row);
  Row behind;
  behind.end = std::exchange(row.end, id);
  return rows_.emplace(id, std::move(behind)).first;
}

// The task has all that it uses to itself: the store may go on, or end, before it is done.
void TextStore::Seal(std::int64_t key, Row* row) {
  sealed_.push_back(key);
  const auto sealed = std::make_shared<Sealed>();
  sealed->texts = std::move(row->texts);
  row->texts.clear();
  row->sealed = sealed;
  sealed_bytes_ += row->bytes;
  row->task = work_->Add(row->bytes, [sealed, bytes = row->bytes, row_bytes = table_.row_bytes] {
    sealed->packed = Pack(sealed->texts, bytes, row_bytes);
  });
}

// Others may be reading the texts that are sealed.
void TextStore::Unseal(Row* row) {
  row->texts = row->sealed->texts;
  work_->Drop(row->task);
  row->task.reset();
  row->sealed.reset();
  sealed_bytes_ -= row->bytes;
}

// Puts into the table what has been compressed.
void TextStore::PlaceSealed() {
  std::vector<std::int64_t> left;
  for (const std::int64_t key : sealed_) {
    const auto row = rows_.find(key);
    if (row == rows_.end() || !row->second.sealed) continue;
    if (!work_->IsDone(*row->second.task)) {
      left.push_back(key);
      continue;
    }
    WriteOut(key, row->second);
    open_bytes_ -= row->second.bytes;
    sealed_bytes_ -= row->second.bytes;
    rows_.erase(row);
    reader_.Clear();
  }
  sealed_.swap(left);
}

std::string TextStore::Read(std::int64_t id) {
  const auto row = FindOpen(id);
  if (row == rows_.end()) return reader_.Read(id);
  const Texts& texts = TextsOf(row->second);
  const auto text = texts.find(id);
  return text == texts.end() ? std::string() : *text->second;
}

void TextStore::Write(std::int64_t id, std::string text) {
  Write(id, std::make_shared<const std::string>(std::move(text)));
}

void TextStore::Write(std::int64_t id, std::shared_ptr<const std::string> text) {
  if (!sealed_.empty()) PlaceSealed();
  const auto opened = Open(id);
  Row& row = opened->second;
  if (row.sealed) Unseal(&row);
  const auto kept = row.texts.find(id);
  const std::size_t freed = kept == row.texts.end() ? 0 : CostOf(*kept->second);
  row.bytes += CostOf(*text) - freed;
  open_bytes_ += CostOf(*text) - freed;
  if (!text->empty()) {
    const bool is_full = text->size() >= table_.row_bytes;
    row.texts.insert_or_assign(id, std::move(text));
    // Large ones take the longest, and nothing will join them.
    if (is_full && row.texts.rbegin()->first == id) Seal(opened->first, &row);
  } else if (kept != row.texts.end()) {
    row.texts.erase(kept);
  }
  // Not left to the next call: a request that has been answered must not go on holding much.
  if (open_bytes_ >= kHeldBytes || open_bytes_ - sealed_bytes_ >= kOpenBytes) Flush();
}

// A row that has grown becomes several. A text that fills one has one of its own, so that its
// neighbours are read without it.
std::vector<TextStore::Packed> TextStore::Pack(const Texts& texts, std::size_t most_bytes,
                                               std::size_t row_bytes) {
  std::vector<Packed> packed;
  std::string bytes;
  bytes.reserve(most_bytes);
  for (auto text = texts.begin(); text != texts.end();) {
    const std::int64_t first = text->first;
    bytes.clear();
    for (std::int64_t last = first; text != texts.end() && bytes.size() < row_bytes; ++text) {
      if (!bytes.empty() && text->second->size() >= row_bytes) break;
      AppendNumber(&bytes, static_cast<std::uint64_t>(text->first - last));
      AppendNumber(&bytes, text->second->size());
      bytes += *text->second;
      last = text->first;
    }
    packed.push_back({first, Compress(bytes)});
  }
  return packed;
}

void TextStore::WriteOut(std::int64_t key, const Row& row) {
  if (row.stored) db_->Prepare(delete_sql_).Bind(1, key).Run();
  std::vector<Packed> packed;
  if (row.sealed) {
    work_->Finish(row.task);
    packed.swap(row.sealed->packed);
  } else {
    packed = Pack(row.texts, row.bytes, table_.row_bytes);
  }
  Statement insert = db_->Prepare(insert_sql_);
  for (const auto& [first, bytes] : packed) insert.Bind(1, first).BindBlob(2, bytes).Run();
}

void TextStore::Flush() {
  for (const auto& [key, row] : rows_) WriteOut(key, row);
  Clear();
}

void TextStore::Clear() {
  for (const auto& [key, row] : rows_) {
    if (row.task) work_->Drop(row.task);
  }
  reader_.Clear();
  rows_.clear();
  sealed_.clear();
  open_bytes_ = 0;
  sealed_bytes_ = 0;
}

}  // namespace quarry::engine
