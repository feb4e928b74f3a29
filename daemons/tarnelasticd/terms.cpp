#include "daemons/tarnelasticd/terms.h"

#include <algorithm>
#include <optional>
#include <utility>

#include "daemons/tarnelasticd/compression.h"
#include "daemons/tarnelasticd/edit_distance.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/posting_lists.h"
#include "daemons/tarnelasticd/segment_merger.h"
#include "daemons/tarnelasticd/segment_writer.h"
#include "daemons/tarnelasticd/text_sharing.h"
#include "daemons/tarnelasticd/text_tokenizer.h"
#include "daemons/tarnelasticd/varint.h"

namespace quarry::engine {
namespace {

// Larger ones compress better, but looking one word up reads a whole one.
constexpr std::size_t kBlockBytes = std::size_t{32} << 10;

// Indexes of so many rows are made anew when more than one of so many is new.
constexpr std::int64_t kMaxSorted = 200000;
constexpr std::int64_t kFewOf = 8;

// To be raised when other words are collected from the same documents: they are not current then.
constexpr int kRules = 1;

[[noreturn]] void FailDamaged() {
  throw Error(kDamagedIndex, "The words to suggest are damaged");
}

// Gathers words, which come in order, into blocks.
class BlockWriter {
 public:
  explicit BlockWriter(Database* db)
      : insert_(db->Prepare("INSERT INTO terms(first,words) VALUES(?1,?2)")) {}

  void Add(std::string_view term, std::int64_t documents) {
    if (block_.empty()) first_ = last_ = term;
    const auto differs = std::mismatch(term.begin(), term.end(), last_.begin(), last_.end()).first;
    const auto shared = block_.empty() ? 0 : static_cast<std::size_t>(differs - term.begin());
    AppendNumber(&block_, shared);
    AppendNumber(&block_, term.size() - shared);
    block_ += term.substr(shared);
    AppendNumber(&block_, static_cast<std::uint64_t>(documents));
    last_ = term;
    if (block_.size() >= kBlockBytes) Flush();
  }

  void Flush() {
    if (block_.empty()) return;
    const std::string packed = Compress(block_);
    insert_.BindBlob(1, first_).BindBlob(2, packed).Run();
    block_.clear();
  }

 private:
  Statement insert_;
  std::string first_;
  std::string last_;
  std::string block_;
};

// Calls visit(term, documents) with each word of a block until it returns false; returns whether it
// never did.
template <typename Visit>
bool ReadBlock(std::string_view packed, Visit visit) {
  const std::string bytes = Decompress(packed);
  std::string_view block = bytes;
  std::string term;
  while (!block.empty()) {
    const std::uint64_t shared = TakeNumber(&block);
    if (shared > term.size()) FailDamaged();
    term.resize(static_cast<std::size_t>(shared));
    term += TakeCounted(&block);
    if (!visit(term, static_cast<std::int64_t>(TakeNumber(&block)))) return false;
  }
  return true;
}

// The same with all words from `from` on, and perhaps some before it.
template <typename Visit>
void ReadFrom(Database* db, std::string_view from, Visit visit) {
  Statement rows = db->Prepare(
      "SELECT words FROM terms WHERE first>="
      "coalesce((SELECT max(first) FROM terms WHERE first<=?1),?1) ORDER BY first");
  rows.BindBlob(1, from);
  while (rows.Step()) {
    if (!ReadBlock(rows.Blob(0), visit)) return;
  }
}

bool HasMore(const Term& a, const Term& b) {
  if (a.documents != b.documents) return a.documents > b.documents;
  return a.text < b.text;
}

bool ComesBefore(const NearTerm& a, const NearTerm& b) {
  return a.distance != b.distance ? a.distance < b.distance : HasMore(a.term, b.term);
}

bool IsAscii(std::string_view term) {
  return std::all_of(term.begin(), term.end(),
                     [](char c) { return static_cast<unsigned char>(c) < 0x80; });
}

// Compares words with one, and keeps the best.
class NearFinder {
 public:
  NearFinder(std::string_view word, std::size_t limit, std::size_t size)
      : word_(CodePoints(word)), letters_(LetterSet(word_)), limit_(limit), size_(size) {}

  void Compare(const std::string& term, std::int64_t documents) {
    // No word of fewer bytes has enough letters.
    if (term.size() + limit_ < word_.size()) return;
    const bool ascii = IsAscii(term);
    if (ascii && term.size() > word_.size() + limit_) return;
    if (ascii && !MayBeNear(letters_, LetterSetOfAscii(term), limit_)) return;
    const std::u32string points = CodePoints(term);
    if (!ascii && !MayBeNear(letters_, LetterSet(points), limit_)) return;
    const std::size_t distance = EditDistance(word_, points, limit_);
    if (distance == 0 || distance > limit_) return;
    found_.push_back({{term, documents}, distance});
    if (found_.size() >= 4 * size_) Shorten();
  }

  std::vector<NearTerm> Take() {
    Shorten();
    return std::move(found_);
  }

 private:
  void Shorten() {
    std::sort(found_.begin(), found_.end(), ComesBefore);
    if (found_.size() > size_) found_.resize(size_);
  }

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

// The words of file names and fields that are not listed, in order, woven into those of the texts.
// A word that stands in one text alone is as likely a slip as a word. In a file name it is what
// people look for, unless it is a number.
class TermMerger {
 public:
  explicit TermMerger(Database* db)
      : labels_(db->Prepare("SELECT term,doc FROM label_terms "
                            "WHERE (doc>1 OR term NOT GLOB '*[0-9]*') AND " +
                            LengthCondition() + " ORDER BY term")),
        blocks_(db) {
    NextLabel();
  }

  void AddOfTexts(std::string_view word, std::int64_t documents) {
    if (documents < 2 || !IsOfMiddlingLength(word)) return;
    while (has_label_ && label_ < word) TakeLabel();
    if (has_label_ && label_ == word) {
      documents = std::max(documents, label_documents_);
      NextLabel();
    }
    blocks_.Add(word, documents);
  }

  void Finish() {
    while (has_label_) TakeLabel();
    blocks_.Flush();
  }

 private:
  void TakeLabel() {
    blocks_.Add(label_, label_documents_);
    NextLabel();
  }
  void NextLabel() {
    has_label_ = labels_.Step();
    if (!has_label_) return;
    label_ = labels_.Text(0);
    label_documents_ = labels_.Int(1);
  }

  Statement labels_;
  bool has_label_ = false;
  std::string label_;
  std::int64_t label_documents_ = 0;
  BlockWriter blocks_;
};

// Reads the words of all texts, and makes them and those of names words to suggest.
void ReadWords(Database* db, const std::vector<std::int32_t>& users) {
  TermMerger terms(db);
  PostingLists lists(db, "body", LastId(db), {}, [] {});
  if (lists.IsReadable()) {
    lists.CountWords([&users](std::int64_t text) { return users[static_cast<std::size_t>(text)]; },
                     [&terms](std::string_view word, std::int64_t documents) {
                       terms.AddOfTexts(word, documents);
                     });
  } else {
    Statement words = db->Prepare("SELECT term,doc FROM body_terms ORDER BY term");
    while (words.Step()) terms.AddOfTexts(words.Text(0), words.Int(1));
  }
  terms.Finish();
}

// The same while the texts' segments are merged. Returns whether that was done, not by FTS5.
bool ReadWordsMerging(Database* db, const std::vector<std::int32_t>& users) {
  std::optional<TermMerger> terms;
  return MergeAllSegments(db, "body", [&](std::string_view word, const auto& texts) {
    if (!terms) terms.emplace(db);
    if (word.empty()) {
      terms->Finish();
      terms.reset();
      return;
    }
    std::int64_t documents = 0;
    for (const std::int64_t text : texts) {
      // Behind the last text lies what is gone, or damage.
      const auto index = static_cast<std::size_t>(text);
      if (index < users.size()) documents += users[index];
    }
    terms->AddOfTexts(word, documents);
  });
}

}  // namespace

std::string CreateTermTables() {
  return "CREATE TABLE terms(id INTEGER PRIMARY KEY, first BLOB NOT NULL, words BLOB NOT NULL);"
         "CREATE INDEX terms_first ON terms(first);"
         "CREATE VIRTUAL TABLE body_terms USING fts5vocab('body','row');"
         "CREATE VIRTUAL TABLE label_terms USING fts5vocab('labels','row');";
}

std::size_t CollectTerms(Database* db, std::int64_t new_documents) {
  db->Execute("DELETE FROM terms");
  // Makes FTS5 write out what it holds back.
  db->Prepare("SELECT 1 FROM body_terms LIMIT 1").Step();
  const std::vector<std::int32_t> users = CountUsers(db);
  const PostingLists lists(db, "body", LastId(db), {}, [] {});
  // What is in several pieces repeats their words, and is searched several times.
  const bool is_merged = lists.IsWorthMerging();
  if (!is_merged || !ReadWordsMerging(db, users)) ReadWords(db, users);
  // Indexes into which came what is in no order have half-filled pages.
  const std::int64_t documents = LastId(db);
  if (documents <= kMaxSorted && new_documents * kFewOf > documents) {
    db->Execute("REINDEX docs;REINDEX text_hashes");
  }
  db->Prepare("INSERT OR REPLACE INTO meta(key,value) VALUES('current_terms',?1)")
      .Bind(1, std::int64_t{kRules})
      .Run();
  return is_merged ? static_cast<std::size_t>(lists.leaves()) * SegmentWriter::kLeafBytes : 0;
}

bool HasTerms(Database* db) {
  return db->Prepare("SELECT 1 FROM terms LIMIT 1").Step();
}

bool AreTermsCurrent(Database* db) {
  Statement rules = db->Prepare("SELECT value FROM meta WHERE key='current_terms'");
  return rules.Step() && rules.Int(0) == kRules;
}

void OutdateTerms(Database* db) {
  db->Execute("DELETE FROM meta WHERE key='current_terms'");
}

std::int64_t DocumentsWith(Database* db, std::string_view term) {
  std::int64_t found = 0;
  ReadFrom(db, term, [&](const std::string& word, std::int64_t documents) {
    if (word == term) found = documents;
    return word < term;
  });
  return found;
}

std::vector<Term> TermsThatBegin(Database* db, std::string_view prefix, std::size_t size) {
  std::vector<Term> terms;
  const auto shorten = [&terms, size] {
    std::sort(terms.begin(), terms.end(), HasMore);
    if (terms.size() > size) terms.resize(size);
  };
  ReadFrom(db, prefix, [&](const std::string& word, std::int64_t documents) {
    const int order = word.compare(0, prefix.size(), prefix);
    if (order == 0) terms.push_back({word, documents});
    if (terms.size() >= 4 * size) shorten();
    return order <= 0;
  });
  shorten();
  return terms;
}

std::vector<NearTerm> TermsNear(Database* db, std::string_view word, std::size_t limit,
                                std::size_t size, const std::function<void()>& check) {
  NearFinder finder(word, limit, size);
  Statement blocks = db->Prepare("SELECT words FROM terms");
  while (blocks.Step()) {
    check();
    ReadBlock(blocks.Blob(0), [&finder](const std::string& term, std::int64_t documents) {
      finder.Compare(term, documents);
      return true;
    });
  }
  return finder.Take();
}

}  // namespace quarry::engine
