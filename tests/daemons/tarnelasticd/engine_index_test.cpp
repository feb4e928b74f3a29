// Creating, deleting, pausing, renaming and moving indexes.

#include <sys/stat.h>

#include <cstdio>
#include <thread>

#include "common/json.h"
#include "daemons/tarnelasticd/catalog.h"
#include "daemons/tarnelasticd/index.h"
#include "daemons/tarnelasticd/index_files.h"
#include "tests/daemons/tarnelasticd/support/engine_fixture.h"
#include "tests/support/files.h"

namespace quarry::engine {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class IndexTest : public EngineTest {
 protected:
  static Json::Value IdData(const std::string& id = "a") {
    Json::Value data;
    data["id"] = id;
    return data;
  }
  std::vector<std::string> Ids() {
    std::vector<std::string> ids;
    const Json::Value status = Ask("engine_status", Json::objectValue);
    for (const Json::Value& entry : status["indexes"]) ids.push_back(entry["id"].asString());
    return ids;
  }
  static Json::Value ConfigData(const std::string& id, const std::string& new_id,
                                const std::string& new_path) {
    Json::Value data = IdData(id);
    data["data"] = Json::objectValue;
    if (!new_id.empty()) data["data"]["id"] = new_id;
    if (!new_path.empty()) data["data"]["path"] = new_path;
    return data;
  }
  bool Configure(const std::string& id, const std::string& new_id, const std::string& new_path) {
    return Ask("index_config_set", ConfigData(id, new_id, new_path))["found"].asBool();
  }
  bool IsPaused() {
    return Ask("engine_status", Json::objectValue)["indexes"][0U]["paused"].asBool();
  }
};

TEST_F(IndexTest, CreatingTwiceKeepsTheDocuments) {
  Create();
  Add("/s/1", "alpha");
  Create();
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1"));
  Restart();
  Create();
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1"));
}

TEST_F(IndexTest, NobodyElseMayReadTheFiles) {
  const mode_t old = umask(0);
  Create();
  Add("/s/1", "alpha");
  umask(old);
  EXPECT_EQ(test::FileMode(DirectoryOf("a")), 0700U);
  for (const std::string& name : test::ListDir(DirectoryOf("a"))) {
    EXPECT_EQ(test::FileMode(DirectoryOf("a") + '/' + name), 0600U) << name;
  }
}

TEST_F(IndexTest, ADatabaseWithoutAnEntryIsTakenOver) {
  Create();
  Add("/s/1", "alpha");
  engine_.reset();
  std::remove(options_.registry_path.c_str());
  engine_ = std::make_unique<Engine>(options_);
  EXPECT_THAT(Ids(), IsEmpty());
  Create();
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1"));
}

TEST_F(IndexTest, OtherMappingsKeepTheDocuments) {
  Create();
  Json::Value document = FileDocument("/s/1", "alpha");
  document["Topic"] = "harbour";
  document["TARNMDTitle"] = "headline";
  Upsert(document);
  Json::Value data = CreateRequest("a", DirectoryOf("a"))["data"];
  data["mappings"]["properties"]["Topic"]["_all"] = false;
  data["mappings"]["properties"].removeMember("TARNMDTitle");
  Ask("index_create", data);
  EXPECT_EQ(toString(Get("/s/1")), toString(document));
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1"));
  EXPECT_THAT(Paths("headline"), ElementsAre("/s/1"));
  EXPECT_THAT(Paths("harbour"), IsEmpty());
  Restart();
  EXPECT_EQ(toString(Get("/s/1")), toString(document));
}

TEST_F(IndexTest, CreatingElsewhereMovesTheIndex) {
  Create();
  Add("/s/1", "alpha");
  Ask("index_create", CreateRequest("a", DirectoryOf("elsewhere"))["data"]);
  EXPECT_TRUE(HasDatabase(DirectoryOf("elsewhere")));
  EXPECT_FALSE(HasDatabase(DirectoryOf("a")));
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1"));
}

TEST_F(IndexTest, DeletingIsRepeatable) {
  Create();
  Upsert(FileDocument("/s/1"));
  Ask("index_delete", IdData());
  EXPECT_THAT(Ids(), IsEmpty());
  EXPECT_FALSE(test::ListDir(dir_ / "index").size() > 0);
  Ask("index_delete", IdData());
  Ask("index_delete", IdData("never"));
  EXPECT_EQ(AskError("commit", IdData()), 1404);
  Restart();
  EXPECT_THAT(Ids(), IsEmpty());
  Create();
  EXPECT_THAT(Below("/"), IsEmpty());
}

TEST_F(IndexTest, DeletingLeavesForeignFilesAlone) {
  Create();
  test::WriteFile(DirectoryOf("a") + "/other", "x");
  Ask("index_delete", IdData());
  EXPECT_THAT(test::ListDir(DirectoryOf("a")), ElementsAre("other"));
}

TEST_F(IndexTest, APausedIndexAnswersButTakesNoWrites) {
  Create();
  Upsert(FileDocument("/s/1", "alpha"));
  Ask("index_pause", IdData());
  EXPECT_TRUE(IsPaused());
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1")) << "pausing commits";
  EXPECT_THAT(Below("/"), ElementsAre("/s/1"));
  Json::Value data = IdData();
  data["doc_id"] = "/s/1";
  EXPECT_EQ(AskError("document_del_by_id", data), 1406);
  data["data"] = FileDocument("/s/1", "beta");
  EXPECT_EQ(AskError("document_upsert_by_id", data), 1406);
  EXPECT_EQ(AskError("document_set_by_id", data), 1406);
  Json::Value below = IdData();
  below["query"]["qsl"]["prefix"]["TARNMDPath"] = "/s/";
  EXPECT_EQ(AskError("document_del_by_query", below), 1406);
  EXPECT_EQ(AskError("commit", IdData()), 0);
  EXPECT_EQ(
      AskError("update_term_suggestion", Parse(R"({"db_name":"a","doc_id_field":"TARNMDPath"})")),
      0);
  Ask("index_pause", IdData());
  Restart();
  EXPECT_TRUE(IsPaused());
  EXPECT_EQ(AskError("document_del_by_id", data), 1406);
  Create();
  EXPECT_TRUE(IsPaused()) << "creating again is no resuming";
  Ask("index_resume", IdData());
  Ask("index_resume", IdData());
  EXPECT_FALSE(IsPaused());
  EXPECT_EQ(AskError("document_del_by_id", data), 0);
  Restart();
  EXPECT_FALSE(IsPaused());
}

TEST_F(IndexTest, RenamingGivesAnotherIdAndPlace) {
  Create();
  Upsert(FileDocument("/s/1", "alpha"));
  EXPECT_TRUE(Configure("a", "b", DirectoryOf("b")));
  EXPECT_THAT(Ids(), ElementsAre("b"));
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1"));
  EXPECT_FALSE(HasDatabase(DirectoryOf("a")));
  // Whoever repeats it after a crash must not fail.
  EXPECT_FALSE(Configure("a", "b", DirectoryOf("b")));
  Restart();
  EXPECT_THAT(Ids(), ElementsAre("b"));
  EXPECT_TRUE(Configure("b", "c", ""));
  EXPECT_TRUE(HasDatabase(DirectoryOf("b"))) << "only the id changes";
  EXPECT_TRUE(Configure("c", "", DirectoryOf("moved")));
  EXPECT_TRUE(HasDatabase(DirectoryOf("moved")));
  EXPECT_TRUE(Configure("c", "", ""));
  EXPECT_TRUE(Configure("c", "c", DirectoryOf("moved")));
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1"));
}

TEST_F(IndexTest, RenamingRefusesWhatBelongsToAnother) {
  Create("a");
  Create("b");
  EXPECT_EQ(AskError("index_config_set", ConfigData("a", "b", "")), 1410);
  EXPECT_EQ(AskError("index_config_set", ConfigData("a", "", DirectoryOf("b"))), 1410);
  EXPECT_EQ(AskError("index_config_set", ConfigData("a", "", "relative")), 1402);
  EXPECT_EQ(AskError("index_config_set", Parse(R"({"id":"a","data":{"id":""}})")), 1402);
  EXPECT_EQ(AskError("index_config_set", Parse(R"({"id":"a","data":{"path":7}})")), 1402);
  EXPECT_EQ(AskError("index_config_set", Parse(R"({"id":"a"})")), 1402);
  EXPECT_THAT(Ids(), ElementsAre("a", "b"));
}

TEST_F(IndexTest, MovingReplacesALeftover) {
  Create("gone");
  Add("/s/other", "beta", "gone");
  engine_.reset();
  std::remove(options_.registry_path.c_str());
  engine_ = std::make_unique<Engine>(options_);
  Create("a");
  Add("/s/1", "alpha");
  EXPECT_TRUE(Configure("a", "", DirectoryOf("gone")));
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1"));
  EXPECT_THAT(Paths("beta"), IsEmpty());
}

TEST_F(IndexTest, AMoveThatFailsLeavesTheIndexWhereItWas) {
  Create();
  Add("/s/1", "alpha");
  test::WriteFile(dir_ / "file", "x");
  EXPECT_EQ(AskError("index_config_set", ConfigData("a", "b", dir_ / "file/below")), 1408);
  EXPECT_THAT(Ids(), ElementsAre("a"));
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1"));
  Add("/s/2", "alpha");
  Restart();
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1", "/s/2"));
}

// A crash between the list's two entries of a move leaves one of these.
TEST_F(IndexTest, AMoveThatWasCutOffIsEndedAtTheNextStart) {
  for (const bool moved : {false, true}) {
    Create("a");
    Add("/s/1", "alpha");
    engine_.reset();
    const std::string from = DirectoryOf("a");
    const std::string to = DirectoryOf("b");
    Json::Value list = Parse(test::ReadFile(options_.registry_path));
    list["indexes"][0U]["path"] = to;
    list["indexes"][0U]["moving_from"] = from;
    test::WriteFile(options_.registry_path, toString(list));
    if (moved) MoveDatabase(from, to);
    engine_ = std::make_unique<Engine>(options_);
    EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1")) << moved;
    EXPECT_TRUE(HasDatabase(to));
    EXPECT_FALSE(HasDatabase(from));
    EXPECT_EQ(test::ReadFile(options_.registry_path).find("moving_from"), std::string::npos);
    Ask("index_delete", IdData());
  }
}

TEST_F(IndexTest, AnIndexThatIsBeingMovedIsLeftOutOfSearches) {
  const Schema schema(ShareMappings());
  CreateDatabase(DirectoryOf("a"), schema);
  Index index(DirectoryOf("a"), false, {}, [] {});
  index.Open();
  const auto try_to_read = [&] {
    int code = 0;
    std::thread([&] {
      try {
        Index::Access(&index, /*wait=*/false);
      } catch (const Error& error) {
        code = error.code();
      }
      EXPECT_EQ(index.documents(), 0);
    }).join();
    return code;
  };
  EXPECT_EQ(try_to_read(), 0);
  int during = 0;
  index.Move(DirectoryOf("b"), {[&] { during = try_to_read(); }, [] {}, [] {}});
  EXPECT_EQ(during, kMovingIndex);
  EXPECT_EQ(try_to_read(), 0);
  EXPECT_EQ(index.directory(), DirectoryOf("b"));
}

TEST_F(IndexTest, IdsMayBeAnyText) {
  for (const char* id : {"fileindex_photo", "..", "a/b", "\xFF\xFE", "with blank", "%s"}) {
    Json::Value data = CreateRequest(id, dir_ / "index/x")["data"];
    Ask("index_create", data);
    Add("/s/1", "alpha", id);
    Restart();
    EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1"));
    EXPECT_EQ(Search("alpha")["hits"][0U]["index"].asString(), id);
    Ask("index_delete", IdData(id));
  }
}

TEST_F(IndexTest, SearchesAndWritesRunSideBySide) {
  Create("a");
  Create("b");
  Add("/s/0", "alpha", "a");
  std::atomic<bool> stop{false};
  std::atomic<int> failures{0};
  std::vector<std::thread> threads;
  for (const char* id : {"a", "b"}) {
    threads.emplace_back([&, id] {
      for (int i = 1; !stop; ++i) {
        const Json::Value request = UpsertRequest(
            id, FileDocument("/s/" + std::to_string(i % 50), "alpha " + std::to_string(i)));
        if (!engine_->Handle(request)["success"].asBool()) ++failures;
        if (i % 7 == 0) {
          if (!engine_->Handle(MakeRequest("commit", IdData(id)))["success"].asBool()) ++failures;
        }
      }
    });
  }
  threads.emplace_back([&] {
    while (!stop) engine_->Tick();
  });
  for (int i = 0; i < 60; ++i) {
    const Json::Value answer =
        engine_->Handle(MakeRequest("search", Parse(R"({"query":"alpha"})")));
    EXPECT_TRUE(answer["success"].asBool()) << toString(answer);
    EXPECT_GE(answer["data"]["total"].asInt(), 1);
    if (i % 20 == 10) {
      Ask("index_config_set", ConfigData("b", "", DirectoryOf("b" + std::to_string(i))));
    }
  }
  stop = true;
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(failures, 0);
}

// Several threads' texts, large ones too, are being cut and compressed whenever the index moves.
TEST_F(IndexTest, MovesAndPausesLoseNothingOfWhatIsBeingDone) {
  constexpr int kWriters = 3;
  constexpr int kEach = 30;
  Create("a");
  const std::string before = Ask("engine_status", Json::objectValue)["epoch"].asString();
  const std::string large(std::size_t{1} << 20, ' ');
  std::atomic<int> at_work{kWriters};
  std::vector<std::thread> threads;
  for (int writer = 0; writer < kWriters; ++writer) {
    threads.emplace_back([&, writer] {
      for (int i = 0; i < kEach; ++i) {
        const std::string name = std::to_string(writer) + 'x' + std::to_string(i);
        const std::string text = "alpha word" + name + (i % 5 == 0 ? large + "omega" : "");
        const Json::Value request = UpsertRequest("a", FileDocument("/s/" + name, text));
        while (!engine_->Handle(request)["success"].asBool()) std::this_thread::yield();
      }
      --at_work;
    });
  }
  for (int i = 0; at_work > 0; ++i) {
    Ask("index_config_set", ConfigData("a", "", DirectoryOf(i % 2 == 0 ? "a2" : "a")));
    Ask("index_pause", IdData("a"));
    Ask("index_resume", IdData("a"));
    engine_->Tick();
  }
  for (std::thread& thread : threads) thread.join();
  Commit("a");
  EXPECT_EQ(Ask("engine_status", Json::objectValue)["epoch"].asString(), before);
  EXPECT_EQ(Paths("alpha").size(), std::size_t{kWriters * kEach});
  EXPECT_EQ(Paths("omega").size(), std::size_t{kWriters * kEach / 5});
  for (const char* name : {"0x0", "1x29", "2x25"}) {
    EXPECT_THAT(Paths(std::string("word") + name), ElementsAre(std::string("/s/") + name));
  }
}

}  // namespace
}  // namespace quarry::engine
