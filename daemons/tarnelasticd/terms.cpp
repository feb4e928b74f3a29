#include "daemons/tarnelasticd/terms.h"

#include <algorithm>
#include <map>
#include <utility>

#include "daemons/tarnelasticd/edit_distance.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/posting_lists.h"
#include "daemons/tarnelasticd/selection.h"
#include "daemons/tarnelasticd/text_sharing.h"
#include "daemons/tarnelasticd/text_tokenizer.h"

namespace quarry::engine {
namespace {

constexpr std::size_t kBlockBytes = std::size_t{64} << 10;
constexpr std::size_t kCollectedBytes = std::size_t{4} << 20;

// Gathers words into blocks.
class BlockWriter {
 public:
  explicit BlockWriter(Database* db) : db_(db) {}

  void Add(std::string_view term) {
    std::string& block = blocks_[{CountCharacters(term), term.size()}];
    block += term;
    bytes_ += term.size();
    if (block.size() >= kBlockBytes || bytes_ >= kCollectedBytes) Flush();
  }

  void Flush() {
    Statement insert =
        db_->Prepare("INSERT INTO term_blocks(letters,bytes,words) VALUES(?1,?2,?3)");
    for (const auto& [lengths, words] : blocks_) {
      insert.Bind(1, static_cast<std::int64_t>(lengths.first));
      insert.Bind(2, static_cast<std::int64_t>(lengths.second));
      insert.BindBlob(3, words).Run();
    }
    blocks_.clear();
    bytes_ = 0;
  }

 private:
  Database* db_;
  std::map<std::pair<std::size_t, std::size_t>, std::string> blocks_;
  std::size_t bytes_ = 0;
};

bool ComesBefore(const NearTerm& a, const NearTerm& b) {
  if (a.distance != b.distance) return a.distance < b.distance;
  if (a.term.documents != b.term.documents) return a.term.documents > b.term.documents;
  return a.term.text < b.term.text;
}

// Compares words with one, and keeps the best.
class NearFinder {
 public:
  NearFinder(Database* db, std::string_view word, std::size_t limit, std::size_t size)
      : db_(db), word_(CodePoints(word)), letters_(LetterSet(word_)), limit_(limit), size_(size) {}

  const std::u32string& word() const { return word_; }

  void AddBlock(std::string_view words, std::size_t letters, std::size_t bytes) {
    for (; bytes > 0 && words.size() >= bytes; words.remove_prefix(bytes)) {
      Compare(words.substr(0, bytes), letters == bytes);
    }
  }

  std::vector<NearTerm> Take() {
    Shorten();
    return std::move(found_);
  }

 private:
  void Compare(std::string_view term, bool ascii) {
    if (ascii && !MayBeNear(letters_, LetterSetOfAscii(term), limit_)) return;
    const std::u32string points = CodePoints(term);
    if (!ascii && !MayBeNear(letters_, LetterSet(points), limit_)) return;
    const std::size_t distance = EditDistance(word_, points, limit_);
    if (distance == 0 || distance > limit_) return;
    found_.push_back({{std::string(term), DocumentsWith(db_, term)}, distance});
    if (found_.size() >= 4 * size_) Shorten();
  }

  void Shorten() {
    std::sort(found_.begin(), found_.end(), ComesBefore);
    if (found_.size() > size_) found_.resize(size_);
  }

  Database* db_;
  const std::u32string word_;
  const std::uint64_t letters_;
  const std::size_t limit_;
  const std::size_t size_;
  std::vector<NearTerm> found_;
};

// How many documents have each text, by its number.
std::vector<std::int32_t> CountUsers(Database* db) {
  std::vector<std::int32_t> users(static_cast<std::size_t>(LastId(db)) + 1, 1);
  for (const TextCopy& copy : ReadTextCopies(db)) {
    if (copy.text >= users.size()) throw Error(kDamagedIndex, "Stored texts are damaged");
    if (copy.text != 0) ++users[copy.text];
    --users[copy.doc];
  }
  return users;
}

bool IsOfMiddlingLength(std::string_view word) {
  if (word.size() < static_cast<std::size_t>(kMinTermLetters)) return false;
  const auto letters = static_cast<std::int64_t>(CountCharacters(word));
  return letters >= kMinTermLetters && letters <= kMaxTermLetters;
}

std::string LengthCondition() {
  return "length(term) BETWEEN " + std::to_string(kMinTermLetters) + " AND " +
         std::to_string(kMaxTermLetters);
}

void CollectTextTerms(Database* db) {
  // Makes FTS5 write out what it holds back.
  db->Prepare("SELECT 1 FROM body_terms LIMIT 1").Step();
  PostingLists lists(db, "body", LastId(db), {}, [] {});
  if (!lists.IsReadable()) {
    db->Execute(
        "INSERT INTO terms(term,documents) SELECT term,doc FROM body_terms WHERE doc>1 AND " +
        LengthCondition());
    return;
  }
  const std::vector<std::int32_t> users = CountUsers(db);
  Statement insert = db->Prepare("INSERT INTO terms(term,documents) VALUES(?1,?2)");
  lists.CountWords([&users](std::int64_t text) { return users[static_cast<std::size_t>(text)]; },
                   [&insert](std::string_view word, std::int64_t documents) {
                     if (documents < 2 || !IsOfMiddlingLength(word)) return;
                     insert.Bind(1, word).Bind(2, documents).Run();
                   });
}

}  // namespace

std::string CreateTermTables() {
  return "CREATE TABLE terms(term TEXT PRIMARY KEY, documents INTEGER NOT NULL) WITHOUT ROWID;"
         "CREATE TABLE term_blocks(id INTEGER PRIMARY KEY, letters INTEGER NOT NULL,"
         " bytes INTEGER NOT NULL, words BLOB NOT NULL);"
         "CREATE INDEX term_blocks_letters ON term_blocks(letters);"
         "CREATE VIRTUAL TABLE body_terms USING fts5vocab('body','row');"
         "CREATE VIRTUAL TABLE label_terms USING fts5vocab('labels','row');";
}

// A word that stands in one text alone is as likely a slip as a word. In a file name it is what
// people look for, unless it is a number.
void CollectTerms(Database* db) {
  db->Execute("DELETE FROM terms;DELETE FROM term_blocks;");
  CollectTextTerms(db);
  db->Execute(
      "INSERT INTO terms(term,documents) SELECT term,doc FROM label_terms "
      "WHERE (doc>1 OR term NOT GLOB '*[0-9]*') AND " +
      LengthCondition() +
      " ON CONFLICT(term) DO UPDATE SET documents=max(documents,excluded.documents);");
  BlockWriter blocks(db);
  Statement terms = db->Prepare("SELECT term FROM terms");
  while (terms.Step()) blocks.Add(terms.Text(0));
  blocks.Flush();
}

bool HasTerms(Database* db) {
  return db->Prepare("SELECT 1 FROM terms LIMIT 1").Step();
}

std::int64_t DocumentsWith(Database* db, std::string_view term) {
  Statement row = db->Prepare("SELECT documents FROM terms WHERE term=?1");
  row.Bind(1, term);
  return row.Step() ? row.Int(0) : 0;
}

std::vector<Term> TermsThatBegin(Database* db, std::string_view prefix, std::size_t size) {
  const std::string end = PrefixEnd(std::string(prefix));
  Statement rows = db->Prepare(
      "SELECT term,documents FROM terms WHERE term>=?1 AND term<?2 "
      "ORDER BY documents DESC,term LIMIT ?3");
  rows.Bind(1, prefix).Bind(2, std::string_view(end)).Bind(3, static_cast<std::int64_t>(size));
  std::vector<Term> terms;
  while (rows.Step()) terms.push_back({std::string(rows.Text(0)), rows.Int(1)});
  return terms;
}

std::vector<NearTerm> TermsNear(Database* db, std::string_view word, std::size_t limit,
                                std::size_t size, const std::function<void()>& check) {
  NearFinder finder(db, word, limit, size);
  const auto letters = static_cast<std::int64_t>(finder.word().size());
  const auto reach = static_cast<std::int64_t>(limit);
  Statement blocks =
      db->Prepare("SELECT letters,bytes,words FROM term_blocks WHERE letters BETWEEN ?1 AND ?2");
  blocks.Bind(1, letters - reach).Bind(2, letters + reach);
  while (blocks.Step()) {
    check();
    finder.AddBlock(blocks.Blob(2), static_cast<std::size_t>(blocks.Int(0)),
                    static_cast<std::size_t>(blocks.Int(1)));
  }
  return finder.Take();
}

}  // namespace quarry::engine
