// The words of an index against a model that reads them all.

#include "daemons/tarnelasticd/terms.h"

#include <algorithm>
#include <filesystem>
#include <map>
#include <random>
#include <set>

#include "daemons/tarnelasticd/compression.h"
#include "daemons/tarnelasticd/edit_distance.h"
#include "daemons/tarnelasticd/index_files.h"
#include "daemons/tarnelasticd/text_tokenizer.h"
#include "tests/daemons/tarnelasticd/support/engine_fixture.h"
#include "tests/support/files.h"

namespace quarry::engine {

void PrintTo(const Term& term, std::ostream* out) {
  *out << term.text << ' ' << term.documents;
}

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

using Words = std::map<std::string, std::int64_t>;

class TermsTest : public EngineTest {
 protected:
  TermsTest() { Create(); }

  void Request(const std::string& index = "a") {
    Json::Value data;
    data["db_name"] = index;
    data["doc_id_field"] = "TARNMDPath";
    Ask("update_term_suggestion", data);
  }
  // Collects the words, which can be looked at then.
  void Collect() {
    Request();
    Commit();
    db_ = std::make_unique<Database>(DatabasePath(DirectoryOf("a")));
  }
  Words Collected() {
    Words words;
    for (const Term& term : TermsThatBegin(db_.get(), "", 1000000)) {
      words[term.text] = term.documents;
    }
    return words;
  }
  std::vector<std::string> Begin(const std::string& prefix, std::size_t size = 10) {
    std::vector<std::string> texts;
    for (const Term& term : TermsThatBegin(db_.get(), prefix, size)) texts.push_back(term.text);
    return texts;
  }
  std::vector<std::string> Near(const std::string& word, std::size_t limit = 1,
                                std::size_t size = 10) {
    std::vector<std::string> texts;
    for (const NearTerm& near : TermsNear(db_.get(), word, limit, size, [] {})) {
      texts.push_back(near.term.text);
    }
    return texts;
  }

  std::unique_ptr<Database> db_;
};

TEST_F(TermsTest, AreWordsOfSeveralTextsAndOfAnyName) {
  Add("/s/Sailing-2019.odt", "harbour lighthouse ox 12");
  Add("/s/b-2020.odt", "harbour Lighthouse storm sailing ox 12");
  Add("/s/c-2020.odt", "harbour");
  Collect();
  EXPECT_EQ(Collected(),
            (Words{{"harbour", 3}, {"lighthouse", 2}, {"odt", 3}, {"sailing", 1}, {"2020", 2}}));
}

TEST_F(TermsTest, AreOfMiddlingLength) {
  const std::string longest(static_cast<std::size_t>(kMaxTermLetters), 'x');
  const std::string text =
      "ab abc " + longest + " " + longest + "x \xD0\xB0\xD0\xB1 \xD0\xB0\xD0\xB1\xD0\xB2";
  Add("/s/1", text);
  Add("/s/2", text);
  Collect();
  EXPECT_EQ(Collected(), (Words{{"abc", 2}, {longest, 2}, {"\xD0\xB0\xD0\xB1\xD0\xB2", 2}}));
}

TEST_F(TermsTest, AreThoseOfTheLastCollection) {
  db_ = std::make_unique<Database>(DatabasePath(DirectoryOf("a")));
  EXPECT_FALSE(HasTerms(db_.get()));
  Add("/s/harbour");
  EXPECT_FALSE(HasTerms(db_.get()));
  Collect();
  EXPECT_TRUE(HasTerms(db_.get()));
  Ask("document_del_by_id", Parse(R"({"id":"a","doc_id":"/s/harbour"})"));
  Add("/s/lighthouse");
  EXPECT_THAT(Near("harbou"), ElementsAre("harbour"));
  Collect();
  EXPECT_EQ(Collected(), (Words{{"lighthouse", 1}}));
  EXPECT_THAT(Near("harbou"), IsEmpty());
  EXPECT_THAT(Near("lighthuose"), ElementsAre("lighthouse"));
  EXPECT_EQ(DocumentsWith(db_.get(), "lighthouse"), 1);
  EXPECT_EQ(DocumentsWith(db_.get(), "harbour"), 0);
}

// What has been written anew must not stay in the log as long as nobody writes.
TEST_F(TermsTest, LeaveNoLogOfMergedTexts) {
  for (const std::uint64_t first : {1000000U, 2000000U, 3000000U, 4000000U}) {
    std::string text;
    for (std::uint64_t i = 0; i < 90000; ++i) {
      text += std::to_string((first + i) * 0x9e3779b97f4a7c15U) + ' ';
    }
    Add("/s/" + std::to_string(first), text);
  }
  const std::string log = DatabasePath(DirectoryOf("a")) + "-wal";
  EXPECT_GT(std::filesystem::file_size(log), 0U);
  Collect();
  EXPECT_EQ(std::filesystem::file_size(log), 0U);
  EXPECT_EQ(Paths(std::to_string(1000007 * 0x9e3779b97f4a7c15U)).size(), 1U);
}

TEST_F(TermsTest, SurviveOtherMappings) {
  Add("/s/harbour");
  Collect();
  db_.reset();
  Json::Value create = CreateRequest("a", DirectoryOf("a"))["data"];
  create["mappings"]["properties"]["TARNMDAnother"]["type"] = "text";
  Ask("index_create", create);
  db_ = std::make_unique<Database>(DatabasePath(DirectoryOf("a")));
  EXPECT_EQ(Collected(), (Words{{"harbour", 1}}));
}

TEST_F(TermsTest, ComeInOrderOfTheirDocuments) {
  Add("/s/1", "planet plan plane plank");
  Add("/s/2", "planet plan plane plank");
  Add("/s/3", "planet plane");
  Collect();
  EXPECT_THAT(Begin("pla"), ElementsAre("plane", "planet", "plan", "plank"));
  EXPECT_THAT(Begin("pla", 3), ElementsAre("plane", "planet", "plan"));
  EXPECT_THAT(Begin("planet"), ElementsAre("planet"));
  EXPECT_THAT(Begin("planets"), IsEmpty());
  EXPECT_THAT(Begin("\xFF"), IsEmpty());
  EXPECT_THAT(Near("plany"), ElementsAre("plane", "plan", "plank"));
  EXPECT_THAT(Near("plany", 1, 1), ElementsAre("plane"));
  EXPECT_THAT(Near("planet", 2), ElementsAre("plane", "plan", "plank"));
}

TEST_F(TermsTest, GivesUpWhenTold) {
  Add("/s/harbour");
  Collect();
  const auto give_up = [] { throw Error(kSearchTooLong, "late"); };
  EXPECT_THROW(TermsNear(db_.get(), "harbou", 1, 10, give_up), Error);
}

class ManyTermsTest : public TermsTest {
 protected:
  std::string Word() {
    static const std::vector<std::string> kLetters = {"a",
                                                      "b",
                                                      "c",
                                                      "d",
                                                      "e",
                                                      "o",
                                                      "t",
                                                      "7",
                                                      "\xC3\xB8",
                                                      "\xD0\xB1",
                                                      "\xE6\xBC\xA2",
                                                      "\xF0\x90\x90\xB0"};
    std::string word;
    for (std::size_t letters = random_() % 10 + 2; letters > 0; --letters) {
      word += kLetters[random_() % kLetters.size()];
    }
    return word;
  }
  void AddDocuments(int first = 0) {
    std::vector<std::string> words;
    for (int i = 0; i < 3000; ++i) words.push_back(Word());
    for (int document = first; document < first + 20; ++document) {
      std::string text;
      for (int i = 0; i < 1500; ++i) text += words[random_() % words.size()] + ' ';
      Upsert(FileDocument("/s/" + std::to_string(document), text));
    }
  }

  std::mt19937 random_{7};
};

// What a scan over all words finds.
std::vector<std::string> NaiveNear(const Words& words, const std::string& word, std::size_t limit,
                                   std::size_t size) {
  std::set<std::tuple<std::size_t, std::int64_t, std::string>> near;
  for (const auto& [term, documents] : words) {
    const std::size_t distance = EditDistance(CodePoints(word), CodePoints(term), limit);
    if (distance > 0 && distance <= limit) near.emplace(distance, -documents, term);
  }
  std::vector<std::string> texts;
  for (const auto& [distance, documents, term] : near) {
    if (texts.size() < size) texts.push_back(term);
  }
  return texts;
}

std::vector<std::string> NaiveBegin(const Words& words, const std::string& prefix,
                                    std::size_t size) {
  std::set<std::pair<std::int64_t, std::string>> begin;
  for (const auto& [term, documents] : words) {
    if (term.rfind(prefix, 0) == 0) begin.emplace(-documents, term);
  }
  std::vector<std::string> texts;
  for (const auto& [documents, term] : begin) {
    if (texts.size() < size) texts.push_back(term);
  }
  return texts;
}

TEST_F(ManyTermsTest, AreFoundAsByAScanOverAll) {
  AddDocuments();
  Collect();
  const Words words = Collected();
  ASSERT_GT(words.size(), 2000U);
  const TextTokenizer tokenizer(db_->handle());
  for (int i = 0; i < 60; ++i) {
    const std::string word = tokenizer.Fold(Word());
    for (const std::size_t limit : {1U, 2U}) {
      ASSERT_EQ(Near(word, limit, 64), NaiveNear(words, word, limit, 64)) << word << ' ' << limit;
    }
    ASSERT_EQ(Near(word, 2, 3), NaiveNear(words, word, 2, 3)) << word;
    const std::string prefix = word.substr(0, random_() % 4 + 1);
    ASSERT_EQ(Begin(prefix), NaiveBegin(words, prefix, 10)) << prefix;
  }
  for (const auto& [word, documents] : words) {
    ASSERT_EQ(DocumentsWith(db_.get(), word), documents) << word;
    ASSERT_EQ(DocumentsWith(db_.get(), word + "!"), 0) << word;
  }
}

// Whatever stands in the rows, nothing but the declared error comes of it.
TEST_F(ManyTermsTest, SurviveDamage) {
  AddDocuments();
  Collect();
  std::string block;
  {
    Statement row = db_->Prepare("SELECT words FROM terms WHERE id=1");
    ASSERT_TRUE(row.Step());
    block = Decompress(row.Blob(0));
  }
  int damaged = 0;
  for (int i = 0; i < 300; ++i) {
    std::string broken = block.substr(0, random_() % block.size() + 1);
    broken[random_() % broken.size()] = static_cast<char>(random_());
    const std::string packed = random_() % 8 == 0 ? broken : Compress(broken);
    db_->Prepare("UPDATE terms SET words=?1 WHERE id=1").BindBlob(1, packed).Run();
    try {
      Near("abcd", 2);
      Begin("a");
      DocumentsWith(db_.get(), Word());
    } catch (const Error& error) {
      EXPECT_TRUE(HasCode(error, kDamagedIndex)) << error.reason();
      ++damaged;
    }
  }
  EXPECT_GT(damaged, 100);
}

// What came in pieces is one afterwards, and the room that this frees is given back.
TEST_F(ManyTermsTest, PutASmallIndexTogether) {
  AddDocuments();
  Add("/t/1", "several pieces");
  AddDocuments(20);
  Add("/t/2", "several");
  const std::string segments = "SELECT count(DISTINCT id>>37) FROM body_data WHERE id>10";
  const auto count = [this](const std::string& sql) {
    Statement row = db_->Prepare(sql);
    return row.Step() ? row.Int(0) : -1;
  };
  db_ = std::make_unique<Database>(DatabasePath(DirectoryOf("a")));
  EXPECT_GT(count(segments), 1);
  const Json::Value before = Search("several");
  Collect();
  EXPECT_EQ(count(segments), 1);
  EXPECT_LE(count("PRAGMA freelist_count") * 128, count("PRAGMA page_count"));
  const Json::Value after = Search("several");
  EXPECT_EQ(before["total"].asInt(), 2);
  EXPECT_EQ(after, before);
}

// A copy counts as a document, though its text is kept once.
TEST_F(TermsTest, CountCopies) {
  Add("/s/1", "harbour storm");
  Add("/s/2", "harbour storm");
  Add("/s/3", "harbour");
  Add("/s/4", "lighthouse");
  Ask("document_del_by_id", Parse(R"({"id":"a","doc_id":"/s/1"})"));
  Add("/s/5", "harbour storm");
  Collect();
  EXPECT_EQ(Collected(), (Words{{"harbour", 3}, {"storm", 2}}));
}

// Nor is anything written for it, where nothing is written for anything else.
TEST_F(TermsTest, AreNotCollectedAgainWhereTheyAreTheSame) {
  Add("/s/1", "harbour storm");
  Add("/s/2", "harbour storm");
  Collect();
  db_->Execute("DELETE FROM terms");
  const std::string log = DatabasePath(DirectoryOf("a")) + "-wal";
  const std::string before = test::ReadFile(log);
  Collect();
  EXPECT_TRUE(test::ReadFile(log) == before);
  Ask("document_set_by_id", Parse(R"({"id":"a","doc_id":"/s/1","data":{"TARNMDFSSize":7}})"));
  Upsert(FileDocument("/s/2", "harbour storm"));
  Collect();
  EXPECT_NE(test::ReadFile(log), before);
  EXPECT_EQ(Collected(), Words());
  Restart();
  Collect();
  EXPECT_EQ(Collected(), Words());
  Add("/s/3");
  Restart();
  Collect();
  EXPECT_EQ(Collected(), (Words{{"harbour", 2}, {"storm", 2}}));
}

TEST_F(TermsTest, AreThoseOfTheCommitAfterTheyWereAskedFor) {
  Add("/s/harbour");
  Collect();
  Request();
  Add("/s/storm");
  EXPECT_EQ(Collected(), (Words{{"harbour", 1}, {"storm", 1}}));
  // One that is answered is not kept for later.
  Collect();
  Add("/s/ship");
  EXPECT_EQ(Collected(), (Words{{"harbour", 1}, {"storm", 1}}));
}

TEST_F(TermsTest, ARemovedDatabaseIsNoticed) {
  Add("/s/harbour");
  Collect();
  std::filesystem::remove(DatabasePath(DirectoryOf("a")));
  Request();
  EXPECT_EQ(AskError("commit", Parse(R"({"id":"a"})")), kDamagedIndex);
}

// Changes of all kinds, against the words of an index that is made of what they leave.
class ChangedTermsTest : public TermsTest {
 protected:
  std::string AnyOf(const std::vector<std::string>& all) { return all[random_() % all.size()]; }
  std::string AnyPath() { return "/s/" + AnyOf({"harbour", "storm", "lighthouse", "ship.odt"}); }
  std::string AnyText() {
    return AnyOf({"", "harbour storm", "storm lighthouse", "harbour ship", "lighthouse harbour"});
  }

  void Store() {
    const std::string path = AnyPath();
    documents_[path] = FileDocument(path, AnyText());
    Upsert(documents_[path]);
  }
  void Set(const std::string& path, const std::string& field, const std::string& value) {
    Json::Value data = Parse(R"({"id":"a"})");
    data["doc_id"] = path;
    data["data"][field] = value;
    if (!Ask("document_set_by_id", data)["found"].asBool()) return;
    documents_[path][field] = value;
  }
  void Move() {
    const std::string path = AnyPath();
    const std::string to = AnyPath();
    Set(path, "TARNMDPath", to);
    if (path == to || documents_.count(path) == 0) return;
    documents_[to] = documents_[path];
    documents_.erase(path);
  }
  void Delete() {
    const std::string path = AnyPath();
    Json::Value data = Parse(R"({"id":"a"})");
    data["doc_id"] = path;
    Ask("document_del_by_id", data);
    documents_.erase(path);
  }
  void Change() {
    switch (random_() % 7) {
      case 0:
        return Move();
      case 1:
        return Delete();
      case 2:
        return Set(AnyPath(), "TARNMDTextContent", AnyText());
      case 3:
        return Set(AnyPath(), "TARNMDSearchFileName", AnyOf({"storm", "ship"}));
      case 4:
        return Set(AnyPath(), "_TARNMDUserTags", AnyOf({"harbour", "calm"}));
      case 5:
        return Commit();
      default:
        return Store();
    }
  }

  Words WordsOfOneMadeNow() {
    Create("model");
    for (const auto& [path, document] : documents_) Upsert(document, "model");
    Request("model");
    Commit("model");
    db_ = std::make_unique<Database>(DatabasePath(DirectoryOf("model")));
    const Words words = Collected();
    db_.reset();
    Ask("index_delete", Parse(R"({"id":"model"})"));
    return words;
  }

  std::map<std::string, Json::Value> documents_;
  std::mt19937 random_{31};
};

TEST_F(ChangedTermsTest, AreThoseOfWhatIsThere) {
  for (int round = 0; round < 300; ++round) {
    for (auto changes = random_() % 3; changes > 0; --changes) Change();
    if (random_() % 20 == 0) Restart();
    Collect();
    const Words words = Collected();
    ASSERT_EQ(words, WordsOfOneMadeNow()) << round;
  }
}

}  // namespace
}  // namespace quarry::engine
