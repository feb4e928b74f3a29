// Documents that share texts, compared with a model in which each has its own.

#include "daemons/tarnelasticd/text_sharing.h"

#include <map>
#include <random>
#include <set>

#include "daemons/tarnelasticd/index_files.h"
#include "tests/daemons/tarnelasticd/support/engine_fixture.h"

namespace quarry::engine {
namespace {

class TextSharingTest : public EngineTest {
 protected:
  TextSharingTest() { Create(); }

  void Store(const std::string& path, const std::string& text) {
    Upsert(FileDocument(path, text));
    model_[path] = text;
  }
  void Drop(const std::string& path) {
    Json::Value data;
    data["id"] = "a";
    data["doc_id"] = path;
    Ask("document_del_by_id", data);
    model_.erase(path);
  }
  void Rename(const std::string& from, const std::string& to) {
    Json::Value data;
    data["id"] = "a";
    data["doc_id"] = from;
    data["data"]["TARNMDPath"] = to;
    Ask("document_set_by_id", data);
    if (model_.count(from) == 0 || from == to) return;
    model_[to] = model_[from];
    model_.erase(from);
  }
  std::int64_t Count(const std::string& what) {
    Database db(DatabasePath(DirectoryOf("a")));
    Statement count = db.Prepare("SELECT count(*) FROM " + what);
    return count.Step() ? count.Int(0) : -1;
  }
  std::string TextIn(const std::string& path) {
    Json::Value data;
    data["id"] = "a";
    data["query"]["qsl"]["term"]["TARNMDPath"] = path;
    data["query"]["load_field"].append("TARNMDTextContent");
    const Json::Value found = Ask("document_get_by_query", data);
    return found.size() == 1 ? found[0]["TARNMDTextContent"].asString() : "none";
  }
  std::set<std::string> Found(const std::string& query) {
    const std::vector<std::string> paths = Paths(query);
    return {paths.begin(), paths.end()};
  }
  // Each text is kept once, documents have theirs, and words find what they should.
  void Compare(const std::vector<std::string>& words) {
    std::set<std::string> texts;
    for (const auto& [path, text] : model_) {
      ASSERT_EQ(TextIn(path), text) << path;
      if (!text.empty()) texts.insert(text);
    }
    Commit();
    ASSERT_EQ(Count("text_hashes"), static_cast<std::int64_t>(texts.size()));
    ASSERT_EQ(Count("body_docsize"), static_cast<std::int64_t>(texts.size()));
    for (const std::string& word : words) {
      std::set<std::string> expected;
      for (const auto& [path, text] : model_) {
        if ((' ' + text + ' ').find(' ' + word + ' ') != std::string::npos) expected.insert(path);
      }
      ASSERT_EQ(Found(word), expected) << word;
    }
  }

  std::map<std::string, std::string> model_;
};

// SQLite would have it do so before each statement that can fail half-way.
TEST_F(TextSharingTest, DoesNotMakeFts5WriteBeforeTheCommit) {
  for (int i = 0; i < 20; ++i) Store("/v/copy" + std::to_string(i), "the same");
  Commit();
  EXPECT_EQ(Count("(SELECT DISTINCT segid FROM labels_idx)"), 1);
  EXPECT_EQ(Count("(SELECT DISTINCT segid FROM names_idx)"), 1);
}

TEST_F(TextSharingTest, TheOwnerMayGoFirst) {
  Store("/s/1", "harbour storm");
  Store("/s/2", "harbour storm");
  Store("/s/3", "harbour storm");
  ASSERT_NO_FATAL_FAILURE(Compare({"harbour"}));
  Drop("/s/1");
  ASSERT_NO_FATAL_FAILURE(Compare({"harbour"}));
  Drop("/s/3");
  Restart();
  ASSERT_NO_FATAL_FAILURE(Compare({"harbour"}));
  Drop("/s/2");
  ASSERT_NO_FATAL_FAILURE(Compare({"harbour"}));
  EXPECT_EQ(Count("text_copies"), 0);
}

TEST_F(TextSharingTest, TheOwnerMayGetAnotherText) {
  Store("/s/1", "harbour");
  Store("/s/2", "harbour");
  Store("/s/1", "storm");
  ASSERT_NO_FATAL_FAILURE(Compare({"harbour", "storm"}));
  Store("/s/1", "");
  ASSERT_NO_FATAL_FAILURE(Compare({"harbour", "storm"}));
  Store("/s/1", "lighthouse");
  Store("/s/3", "lighthouse");
  Store("/s/1", "harbour");
  ASSERT_NO_FATAL_FAILURE(Compare({"harbour", "storm", "lighthouse"}));
  Store("/s/2", "storm");
  Store("/s/3", "storm");
  ASSERT_NO_FATAL_FAILURE(Compare({"harbour", "storm", "lighthouse"}));
  Drop("/s/1");
  Drop("/s/2");
  Drop("/s/3");
  ASSERT_NO_FATAL_FAILURE(Compare({"harbour", "storm", "lighthouse"}));
  EXPECT_EQ(Count("text_copies"), 0);
}

TEST_F(TextSharingTest, ANumberThatATextHasGoesToNoDocument) {
  Store("/s/1", "other");
  Store("/s/2", "harbour");
  Store("/s/1", "harbour");
  Drop("/s/2");
  Restart();
  Store("/s/3", "storm");
  ASSERT_NO_FATAL_FAILURE(Compare({"harbour", "storm"}));
}

TEST_F(TextSharingTest, OtherMappingsKeepTexts) {
  Store("/s/1", "harbour");
  Store("/s/2", "harbour");
  Store("/s/1", "storm");
  Commit();
  Json::Value create = CreateRequest("a", DirectoryOf("a"))["data"];
  create["mappings"]["properties"]["TARNMDAnother"]["type"] = "text";
  Ask("index_create", create);
  ASSERT_NO_FATAL_FAILURE(Compare({"harbour", "storm"}));
}

TEST_F(TextSharingTest, WithoutItsKeyAnIndexIsDamaged) {
  Store("/s/1", "harbour");
  Commit();
  engine_.reset();
  Database(DatabasePath(DirectoryOf("a"))).Execute("DELETE FROM meta WHERE key='hash_key'");
  Restart();
  const Json::Value document = FileDocument("/s/2", "storm");
  EXPECT_EQ(AskError("document_upsert_by_id", UpsertRequest("a", document)["data"]), kDamagedIndex);
}

// What is kept by number would take any amount of memory.
TEST_F(TextSharingTest, ANumberThatCannotBeIsDamageAlsoToWhoWorksAlready) {
  for (const char* change :
       {"UPDATE docs SET id=1<<40 WHERE path='/s/3'", "UPDATE text_copies SET doc=1<<40"}) {
    Create();
    Store("/s/1", "harbour");
    Store("/s/2", "harbour");
    Store("/s/3", "storm");
    Commit();
    Database(DatabasePath(DirectoryOf("a"))).Execute(change);
    EXPECT_EQ(SearchError("harbour"), kDamagedIndex) << change;
    Json::Value terms;
    terms["db_name"] = "a";
    terms["doc_id_field"] = "TARNMDPath";
    Ask("update_term_suggestion", terms);
    Json::Value data;
    data["id"] = "a";
    EXPECT_EQ(AskError("commit", data), kDamagedIndex) << change;
    EXPECT_EQ(AskError("index_check", data), kDamagedIndex) << change;
  }
}

class TextSharingModelTest : public TextSharingTest, public testing::WithParamInterface<unsigned> {
 protected:
  std::string Path() { return "/s/" + std::to_string(random_() % 12); }

  std::mt19937 random_{GetParam()};
};

TEST_P(TextSharingModelTest, FindsWhatTheModelFinds) {
  const std::vector<std::string> texts = {"", "one", "one two", "two", "three one", "four"};
  for (int round = 0; round < 40; ++round) {
    for (std::size_t left = random_() % 8; left > 0; --left) {
      switch (random_() % 5) {
        case 0:
          Drop(Path());
          break;
        case 1:
          Rename(Path(), Path());
          break;
        default:
          Store(Path(), texts[random_() % texts.size()]);
      }
    }
    if (random_() % 8 == 0) Restart();
    ASSERT_NO_FATAL_FAILURE(Compare({"one", "two", "three", "four", "five"})) << round;
  }
}

INSTANTIATE_TEST_SUITE_P(Seeds, TextSharingModelTest, testing::Range(1U, 9U));

}  // namespace
}  // namespace quarry::engine
