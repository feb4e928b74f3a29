#include "daemons/tarnelasticd/index_writer.h"

#include <algorithm>
#include <exception>
#include <limits>
#include <utility>
#include <vector>

#include "daemons/tarnelasticd/attributes.h"
#include "daemons/tarnelasticd/doc_set.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/request.h"
#include "daemons/tarnelasticd/terms.h"

namespace quarry::engine {
namespace {

constexpr std::int64_t kDeleteChunk = 500;

constexpr std::size_t kLargeTransaction = std::size_t{4} << 20;

// Roughly what one row costs beside its text.
constexpr std::size_t kRowBytes = 512;

void Configure(Database* db) {
  db->Execute(
      "PRAGMA journal_mode=WAL;PRAGMA synchronous=FULL;PRAGMA cache_size=-16384;"
      // Overwriting what is deleted with zeros would write every page twice.
      "PRAGMA secure_delete=OFF;"
      // A log file that one large transaction has blown up is cut back afterwards.
      "PRAGMA wal_autocheckpoint=4000;PRAGMA journal_size_limit=67108864;");
}

bool WantsText(const Schema& schema, const Selection& selection) {
  if (!selection.load_fields) return false;
  return std::any_of(selection.load_fields->begin(), selection.load_fields->end(),
                     [&](const std::string& name) {
                       const Field* field = schema.Find(name);
                       return field != nullptr && field->storage == Storage::kText;
                     });
}

void ApplyChanges(const Json::Value& changes, Json::Value* document) {
  for (auto change = changes.begin(); change != changes.end(); ++change) {
    if (change->isNull()) {
      document->removeMember(change.name());
    } else {
      (*document)[change.name()] = *change;
    }
  }
}

}  // namespace

IndexWriter::IndexWriter(const std::string& database_path, std::shared_ptr<const Schema> schema,
                         const WriterLimits& limits)
    : schema_(std::move(schema)),
      limits_(limits),
      db_(database_path),
      tokenizer_(db_.handle()),
      buffer_(*schema_, &db_, tokenizer_, &side_work_),
      texts_(&db_, kTexts, &side_work_),
      attributes_(&db_, kAttributes, &side_work_),
      sharing_(&db_),
      insert_sql_(InsertDocsSql(*schema_)),
      update_sql_(UpdateDocsSql(*schema_)),
      select_row_sql_("SELECT " + DocsColumns(*schema_) + " FROM docs WHERE path=?1") {
  Configure(&db_);
  LoadCounters();
  collected_id_ = next_id_;
}

IndexWriter::~IndexWriter() {
  Rollback();
}

void IndexWriter::LoadCounters() {
  next_id_ = LastId(&db_) + 1;
  Statement count = db_.Prepare("SELECT value FROM meta WHERE key='documents'");
  documents_ = count.Step() ? count.Int(0) : 0;
}

// Runs a change. Half a change must never be committed, so whatever fails undoes everything.
template <typename Action>
auto IndexWriter::Change(Action action) {
  try {
    Begin();
    auto result = action();
    KeepWithinLimits();
    return result;
  } catch (...) {
    Rollback();
    throw;
  }
}

void IndexWriter::Begin() {
  if (uncommitted_) return;
  Undo();
  db_.Execute("BEGIN IMMEDIATE");
  uncommitted_ = true;
  transaction_bytes_ = 0;
  transaction_start_ = std::chrono::steady_clock::now();
}

void IndexWriter::Rollback() noexcept {
  buffer_.Clear();
  texts_.Clear();
  attributes_.Clear();
  if (!uncommitted_) return;
  uncommitted_ = false;
  lost_ = true;
  terms_requested_ = false;
  words_changed_ = false;
  must_undo_ = true;
  try {
    Undo();
  } catch (const std::exception&) {
    // Tried again by the next use, which says so where the database is beyond help.
  }
}

// What was not committed must neither stay in the database nor be counted, also where there was no
// memory to undo it at once.
void IndexWriter::Undo() {
  if (!must_undo_) return;
  if (db_.InTransaction()) db_.Execute("ROLLBACK");
  LoadCounters();
  must_undo_ = false;
}

// Checked with each change, since a writer that is never idle leaves CommitIfOld() no turn.
void IndexWriter::KeepWithinLimits() {
  if (buffer_.bytes() >= limits_.flush_bytes) {
    transaction_bytes_ += buffer_.bytes();
    buffer_.Flush();
  } else if (buffer_.list_bytes() >= limits_.list_bytes) {
    buffer_.SaveLists();
  }
  if (transaction_bytes_ >= limits_.commit_bytes || IsOld()) CommitNow();
}

bool IndexWriter::IsOld() const {
  return std::chrono::steady_clock::now() - transaction_start_ >= limits_.commit_age;
}

void IndexWriter::CommitNow() {
  // Whoever removes the file under us must not be told that documents are safe in it.
  if (db_.HasMoved()) throw Error(kDamagedIndex, "The index's database has been removed");
  transaction_bytes_ += buffer_.bytes();
  buffer_.Flush();
  texts_.Flush();
  attributes_.Flush();
  if (std::exchange(words_changed_, false)) OutdateTerms(&db_);
  if (terms_requested_ && !AreTermsCurrent(&db_)) {
    transaction_bytes_ += CollectTerms(&db_, next_id_ - collected_id_);
  }
  db_.Prepare("INSERT OR REPLACE INTO meta(key,value) VALUES('documents',?1)")
      .Bind(1, documents_.load())
      .Run();
  db_.Execute("COMMIT");
  uncommitted_ = false;
  // The end of a pass: what it has left free may not be needed again for long.
  if (std::exchange(terms_requested_, false)) {
    collected_id_ = next_id_;
    db_.GiveBackFreePages();
  }
  // Else the log stays as large as the transaction was for as long as nobody writes.
  if (transaction_bytes_ >= kLargeTransaction) db_.EmptyLog();
}

void IndexWriter::Commit() {
  if (!uncommitted_) {
    terms_requested_ = false;
    return Undo();
  }
  try {
    CommitNow();
  } catch (...) {
    Rollback();
    throw;
  }
}

void IndexWriter::CommitIfOld() {
  if (uncommitted_ && IsOld()) Commit();
}

bool IndexWriter::TakeLost() {
  return std::exchange(lost_, false);
}

// Where nobody else writes and the words are the same, nothing is written for them.
void IndexWriter::RequestTerms() {
  Undo();
  if (uncommitted_ || db_.HasMoved() || !AreTermsCurrent(&db_)) {
    Change([this] { return terms_requested_ = true; });
  } else {
    terms_requested_ = true;
  }
}

DocumentRow IndexWriter::Unpack(const Statement& row) {
  return UnpackRow(*schema_, row, attributes_.Read(row.Int(0)));
}

std::optional<IndexWriter::Found> IndexWriter::FindByPath(std::string_view path) {
  Statement row = db_.Prepare(select_row_sql_);
  row.Bind(1, path);
  if (!row.Step()) return std::nullopt;
  return Found{row.Int(0), ReadLabels(*schema_, Unpack(row))};
}

void IndexWriter::WriteRow(const std::string& sql, std::int64_t id, const DocumentRow& row) {
  Statement statement = db_.Prepare(sql);
  BindDocs(*schema_, id, row, &statement);
  statement.Run();
  attributes_.Write(id, PackAttributes(*schema_, row));
  transaction_bytes_ += kRowBytes;
}

void IndexWriter::ChangeLabels(const Found& old, const Labels& now) {
  if (old.labels == now) return;
  words_changed_ = true;
  buffer_.ChangeLabels(old.id, old.labels, now);
}

std::int64_t IndexWriter::NewId() {
  CheckId(next_id_);
  return next_id_++;
}

std::string IndexWriter::ReadTextOf(std::int64_t doc) {
  return texts_.Read(TextOf(&db_, doc));
}

void IndexWriter::ChangeText(std::int64_t doc, std::string body) {
  const std::int64_t text = TextOf(&db_, doc);
  std::string old = texts_.Read(text);
  if (old == body) return;
  words_changed_ = true;
  buffer_.NoteText(doc);
  if (!old.empty()) DropText(doc, text, std::move(old));
  if (!body.empty()) AddText(doc, std::move(body));
}

void IndexWriter::DropText(std::int64_t doc, std::int64_t text, std::string old) {
  if (!sharing_.Leave(doc, text, old)) return;
  texts_.Write(text, "");
  buffer_.ChangeBody(text, std::move(old), "");
}

void IndexWriter::AddText(std::int64_t doc, std::string body) {
  const TextSharing::Use use = sharing_.Join(doc, body, [this] { return NewId(); });
  if (!use.is_first) return;
  texts_.Write(use.text, body);
  buffer_.ChangeBody(use.text, "", std::move(body));
}

void IndexWriter::Insert(StoredDocument document) {
  const std::int64_t id = NewId();
  WriteRow(insert_sql_, id, document.row);
  words_changed_ = true;
  buffer_.InsertLabels(id, document.labels);
  transaction_bytes_ += document.body.size();
  ++documents_;
  if (document.body.empty()) return;
  buffer_.NoteText(id);
  const TextSharing::Use use = sharing_.Join(id, document.body, [this] { return NewId(); });
  if (!use.is_first) return;
  const auto body = std::make_shared<const std::string>(std::move(document.body));
  buffer_.InsertBody(use.text, body);
  texts_.Write(use.text, body);
}

void IndexWriter::Replace(const Found& old, StoredDocument document) {
  WriteRow(update_sql_, old.id, document.row);
  ChangeLabels(old, document.labels);
  ChangeText(old.id, std::move(document.body));
}

void IndexWriter::Remove(const Found& old) {
  ChangeText(old.id, "");
  words_changed_ = true;
  buffer_.ChangeLabels(old.id, old.labels, std::nullopt);
  db_.Prepare("DELETE FROM docs WHERE id=?1").Bind(1, old.id).Run();
  attributes_.Write(old.id, "");
  transaction_bytes_ += kRowBytes;
  --documents_;
}

void IndexWriter::Upsert(StoredDocument document) {
  Change([&] {
    const std::optional<Found> old = FindByPath(document.row.path);
    if (old) {
      Replace(*old, std::move(document));
    } else {
      Insert(std::move(document));
    }
    return true;
  });
}

bool IndexWriter::Set(std::string_view path, const Json::Value& changes) {
  if (changes.isMember(schema_->path_field())) {
    NameProperty(changes, schema_->path_field().c_str());
  }
  return Change([&] { return SetLocked(path, changes); });
}

bool IndexWriter::SetLocked(std::string_view path, const Json::Value& changes) {
  Found found{};
  Json::Value document;
  {
    Statement row = db_.Prepare(select_row_sql_);
    row.Bind(1, path);
    if (!row.Step()) return false;
    const DocumentRow unpacked = Unpack(row);
    found = {row.Int(0), ReadLabels(*schema_, unpacked)};
    document = ReadRow(*schema_, unpacked, nullptr);
  }
  const bool touches_text = TouchesText(*schema_, changes);
  if (touches_text) AddTexts(*schema_, ReadTextOf(found.id), nullptr, &document);
  ApplyChanges(changes, &document);
  const std::string new_path = document[schema_->path_field()].asString();
  if (new_path != path) {
    const std::optional<Found> in_the_way = FindByPath(new_path);
    if (in_the_way) Remove(*in_the_way);
  }
  if (touches_text) {
    Replace(found, MakeDocument(*schema_, new_path, document));
  } else {
    const StoredDocument stored = MakeDocument(*schema_, new_path, document);
    WriteRow(update_sql_, found.id, stored.row);
    ChangeLabels(found, stored.labels);
  }
  return true;
}

bool IndexWriter::Delete(std::string_view path) {
  return Change([&] {
    const std::optional<Found> old = FindByPath(path);
    if (old) Remove(*old);
    return old.has_value();
  });
}

// The first selected documents; `rest` selects those behind them afterwards.
std::vector<IndexWriter::Found> IndexWriter::TakeSelected(std::int64_t limit, Selection* rest) {
  std::vector<Found> batch;
  std::optional<std::string> last;
  {
    SelectedRows rows(*schema_, *rest, limit, &db_);
    while (rows.Step()) {
      DocumentRow row = Unpack(rows.row());
      batch.push_back({rows.row().Int(0), ReadLabels(*schema_, row)});
      last = std::move(row.path);
    }
  }
  if (last) rest->after = std::move(last);
  return batch;
}

// Each chunk goes on behind the one before: what lies between the documents of a folder stays, and
// must not be stepped over again and again.
std::int64_t IndexWriter::DeleteSelected(const Selection& selection) {
  std::int64_t left = selection.limit.value_or(std::numeric_limits<std::int64_t>::max());
  std::int64_t deleted = 0;
  Selection rest = selection;
  for (;;) {
    const std::int64_t chunk = Change([&] {
      const std::vector<Found> batch = TakeSelected(std::min(left, kDeleteChunk), &rest);
      for (const Found& old : batch) Remove(old);
      return static_cast<std::int64_t>(batch.size());
    });
    deleted += chunk;
    left -= chunk;
    if (chunk < kDeleteChunk || left == 0) return deleted;
  }
}

Json::Value IndexWriter::Find(const Selection& selection) {
  Undo();
  try {
    return FindAll(selection);
  } catch (...) {
    // Without memory, or where the disk fails, SQLite ends a transaction for a question as well.
    if (uncommitted_ && !db_.InTransaction()) Rollback();
    throw;
  }
}

Json::Value IndexWriter::FindAll(const Selection& selection) {
  const bool wants_text = WantsText(*schema_, selection);
  const std::set<std::string>* only = selection.load_fields ? &*selection.load_fields : nullptr;
  Json::Value found(Json::arrayValue);
  std::size_t text_bytes = 0;
  const std::int64_t limit = std::min(selection.limit.value_or(kMaxFound + 1), kMaxFound + 1);
  SelectedRows rows(*schema_, selection, limit, &db_);
  while (rows.Step()) {
    if (found.size() >= kMaxFound) FailMalformed("Too many documents: ask with a limit");
    Json::Value document = ReadRow(*schema_, Unpack(rows.row()), only);
    if (wants_text) {
      const std::string body = ReadTextOf(rows.row().Int(0));
      text_bytes += body.size();
      if (text_bytes > kMaxFoundText && !found.empty()) {
        FailMalformed("Too much text: ask with a limit");
      }
      AddTexts(*schema_, body, only, &document);
    }
    found.append(std::move(document));
  }
  return found;
}

}  // namespace quarry::engine
