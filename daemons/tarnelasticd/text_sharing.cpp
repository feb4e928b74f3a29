#include "daemons/tarnelasticd/text_sharing.h"

#include "daemons/tarnelasticd/doc_set.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/text_hash.h"

namespace quarry::engine {

std::string CreateSharingTables() {
  return "CREATE TABLE text_copies(doc INTEGER PRIMARY KEY, text INTEGER NOT NULL);"
         "CREATE INDEX text_copies_text ON text_copies(text);"
         "CREATE TABLE text_hashes(hash BLOB PRIMARY KEY, text INTEGER NOT NULL) WITHOUT ROWID;";
}

std::int64_t TextOf(Database* db, std::int64_t doc) {
  Statement row = db->Prepare("SELECT text FROM text_copies WHERE doc=?1");
  return row.Bind(1, doc).Step() ? row.Int(0) : doc;
}

std::int64_t LastId(Database* db) {
  Statement last = db->Prepare(
      "SELECT max(coalesce((SELECT max(id) FROM docs),0),"
      "coalesce((SELECT max(doc) FROM text_copies),0))");
  const std::int64_t id = last.Step() ? last.Int(0) : 0;
  if (id != 0) CheckId(id);
  return id;
}

std::vector<TextCopy> ReadTextCopies(Database* db) {
  std::vector<TextCopy> copies;
  Statement rows = db->Prepare("SELECT doc,text FROM text_copies");
  while (rows.Step()) {
    CheckId(rows.Int(0));
    if (rows.Int(1) != 0) CheckId(rows.Int(1));
    copies.push_back(
        {static_cast<std::uint32_t>(rows.Int(0)), static_cast<std::uint32_t>(rows.Int(1))});
  }
  return copies;
}

// All are read before any is written: a text's number may be that of a document with another.
void SpreadToDocuments(const std::vector<TextCopy>& copies, Frequencies* frequencies) {
  std::vector<float> values;
  values.reserve(copies.size());
  for (const TextCopy& copy : copies) values.push_back(frequencies->Of(copy.text));
  for (std::size_t i = 0; i < copies.size(); ++i) frequencies->Set(copies[i].doc, values[i]);
}

TextSharing::TextSharing(Database* db) : db_(db) {}

const std::string& TextSharing::Key() {
  if (!key_.empty()) return key_;
  Statement row = db_->Prepare("SELECT value FROM meta WHERE key='hash_key'");
  if (row.Step()) key_ = row.Blob(0);
  if (key_.size() == kHashKeyBytes) return key_;
  key_.clear();
  throw Error(kDamagedIndex, "The index's database is incomplete");
}

bool TextSharing::HasOtherUsers(std::int64_t doc, std::int64_t text) {
  Statement others = db_->Prepare("SELECT 1 FROM text_copies WHERE text=?1 AND doc<>?2 LIMIT 1");
  if (others.Bind(1, text).Bind(2, doc).Step()) return true;
  return text != doc && TextOf(db_, text) == text;
}

// Whether others use the text with the document's number.
bool TextSharing::IsTaken(std::int64_t doc) {
  Statement users = db_->Prepare("SELECT 1 FROM text_copies WHERE text=?1 LIMIT 1");
  return users.Bind(1, doc).Step();
}

// Two statements, since one that replaces can fail half-way: against that SQLite has FTS5 write out
// all that it has collected, each time.
void TextSharing::SetCopy(std::int64_t doc, std::int64_t text) {
  DropCopy(doc);
  db_->Prepare("INSERT INTO text_copies(doc,text) VALUES(?1,?2)").Bind(1, doc).Bind(2, text).Run();
}

void TextSharing::DropCopy(std::int64_t doc) {
  db_->Prepare("DELETE FROM text_copies WHERE doc=?1").Bind(1, doc).Run();
}

TextSharing::Use TextSharing::Join(std::int64_t doc, std::string_view bytes,
                                   const std::function<std::int64_t()>& new_id) {
  const std::string hash = TextHash(Key(), bytes);
  Use use{doc, false};
  {
    Statement known = db_->Prepare("SELECT text FROM text_hashes WHERE hash=?1");
    use.is_first = !known.BindBlob(1, hash).Step();
    if (!use.is_first) use.text = known.Int(0);
  }
  if (use.is_first) {
    if (IsTaken(doc)) use.text = new_id();
    db_->Prepare("INSERT INTO text_hashes(hash,text) VALUES(?1,?2)")
        .BindBlob(1, hash)
        .Bind(2, use.text)
        .Run();
  }
  CheckId(use.text);
  if (use.text == doc) {
    DropCopy(doc);
  } else {
    if (use.is_first) SetCopy(use.text, 0);
    SetCopy(doc, use.text);
  }
  return use;
}

bool TextSharing::Leave(std::int64_t doc, std::int64_t text, std::string_view bytes) {
  const bool is_last = !HasOtherUsers(doc, text);
  DropCopy(doc);
  if (IsTaken(doc)) SetCopy(doc, 0);
  if (!is_last) return false;
  const std::string hash = TextHash(Key(), bytes);
  db_->Prepare("DELETE FROM text_hashes WHERE hash=?1").BindBlob(1, hash).Run();
  db_->Prepare("DELETE FROM text_copies WHERE doc=?1 AND text=0").Bind(1, text).Run();
  return true;
}

}  // namespace quarry::engine
