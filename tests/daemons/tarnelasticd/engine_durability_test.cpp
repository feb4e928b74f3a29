// What is safe when, and what happens when the disk does not play along.

#include <cstdlib>
#include <fstream>

#include "common/json.h"
#include "daemons/tarnelasticd/index_files.h"
#include "tests/daemons/tarnelasticd/support/engine_fixture.h"
#include "tests/daemons/tarnelasticd/support/fault_disk.h"
#include "tests/support/files.h"

namespace quarry::engine {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class DurabilityTest : public EngineTest {
 protected:
  // Nothing is committed for its age, however slow the machine is.
  DurabilityTest() {
    WriterLimits limits;
    limits.commit_age = std::chrono::hours(1);
    UseLimits(limits);
  }
  ~DurabilityTest() override { engine_.reset(); }

  // Ends the engine without giving it a chance to commit, as far as its files can tell.
  void LosePower() {
    const auto left = disk_.Durable();
    disk_.SetUnlimitedRoom();
    engine_.reset();
    for (const std::string& name : test::ListDir(DirectoryOf("a"))) {
      std::remove((DirectoryOf("a") + '/' + name).c_str());
    }
    for (const auto& [path, content] : left) {
      // What is shared between connections lives in memory only.
      if (path.find("-shm") == std::string::npos) test::WriteFile(path, content);
    }
    engine_ = std::make_unique<Engine>(options_);
  }
  std::string Epoch() { return Ask("engine_status", Json::objectValue)["epoch"].asString(); }
  Json::Value IdData() { return Parse(R"({"id":"a"})"); }
  void UseLimits(const WriterLimits& limits) {
    engine_.reset();
    options_.writer = limits;
    engine_ = std::make_unique<Engine>(options_);
  }

  FaultDisk disk_;
};

TEST_F(DurabilityTest, WhatIsCommittedSurvivesALossOfPower) {
  Create();
  disk_.BeginTracking(DirectoryOf("a"));
  for (int i = 0; i < 300; ++i) {
    Upsert(FileDocument("/s/" + std::to_string(i), "alpha word" + std::to_string(i)));
    if (i % 10 == 9) Commit();
  }
  Upsert(FileDocument("/s/late", "alpha late"));
  LosePower();
  EXPECT_EQ(Below("/").size(), 300U);
  EXPECT_EQ(Paths("alpha").size(), 300U);
  EXPECT_THAT(Paths("word299"), ElementsAre("/s/299"));
  EXPECT_THAT(Paths("late"), IsEmpty());
  Add("/s/late", "alpha late");
  EXPECT_EQ(Paths("alpha").size(), 301U);
}

TEST_F(DurabilityTest, WhatIsNotCommittedIsGoneAfterALossOfPower) {
  Create();
  Add("/s/1", "alpha");
  disk_.BeginTracking(DirectoryOf("a"));
  Upsert(FileDocument("/s/2", "alpha"));
  LosePower();
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1"));
}

TEST_F(DurabilityTest, ACleanEndCommits) {
  Create();
  Upsert(FileDocument("/s/1", "alpha"));
  Restart();
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1"));
}

TEST_F(DurabilityTest, ATransactionEndsWhenItIsOld) {
  WriterLimits limits;
  limits.commit_age = std::chrono::seconds(0);
  UseLimits(limits);
  Create();
  Upsert(FileDocument("/s/1", "alpha"));
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1"));
}

TEST_F(DurabilityTest, TickEndsAnOldTransactionThatNobodyTouches) {
  WriterLimits limits;
  limits.commit_age = std::chrono::milliseconds(1);
  UseLimits(limits);
  Create();
  Upsert(FileDocument("/s/1", "alpha"));
  EXPECT_TRUE(test::WaitUntil([this] {
    engine_->Tick();
    return Paths("alpha").size() == 1;
  }));
}

// What is written while work flows without an end is found all the same.
TEST(WriterLimitsTest, NoTransactionStaysOpenForLong) {
  EXPECT_LE(WriterLimits().commit_age, std::chrono::seconds(5));
}

TEST_F(DurabilityTest, TickLeavesAYoungTransactionAlone) {
  Create();
  Upsert(FileDocument("/s/1", "alpha"));
  engine_->Tick();
  EXPECT_THAT(Paths("alpha"), IsEmpty());
}

TEST_F(DurabilityTest, ATransactionEndsWhenItIsLarge) {
  WriterLimits limits = options_.writer;
  limits.flush_bytes = 20000;
  limits.commit_bytes = 60000;
  UseLimits(limits);
  Create();
  int documents = 0;
  while (Paths("alpha").empty() && documents < 100) {
    Upsert(FileDocument("/s/" + std::to_string(documents++), "alpha " + std::string(2000, 'x')));
  }
  EXPECT_GT(documents, 1);
  EXPECT_LT(documents, 60);
}

TEST_F(DurabilityTest, ALargeTransactionLeavesNoLargeLog) {
  Create();
  std::string text;
  for (int i = 0; i < 100000; ++i) text += "word" + std::to_string(i) + ' ';
  for (int i = 0; i < 6; ++i) Upsert(FileDocument("/s/" + std::to_string(i), text));
  Commit();
  EXPECT_EQ(test::ReadFile(DatabasePath(DirectoryOf("a")) + "-wal").size(), 0U);
  EXPECT_EQ(Paths("word99999").size(), 6U);
}

// Changes of attributes alone touch no full text, but fill the log all the same.
TEST_F(DurabilityTest, ATransactionOfAttributesEndsWhenItIsLarge) {
  WriterLimits limits = options_.writer;
  limits.commit_bytes = 100 * 512;
  UseLimits(limits);
  Create();
  Add("/s/1", "alpha");
  Json::Value data = IdData();
  data["doc_id"] = "/s/1";
  const auto size = [this] { return Search("alpha")["hits"][0U]["size"].asInt(); };
  int changes = 0;
  while (size() < 1000 && changes < 300) {
    data["data"]["TARNMDFSSize"] = 1000 + changes++;
    Ask("document_set_by_id", data);
  }
  EXPECT_LT(changes, 200);
}

TEST_F(DurabilityTest, AFullDiskHasACodeOfItsOwnAndTakesUncommittedWorkWithIt) {
  Create();
  Add("/s/1", "alpha");
  const std::string epoch = Epoch();
  Upsert(FileDocument("/s/2", "alpha beta"));
  disk_.SetRoom(0);
  EXPECT_EQ(AskError("commit", IdData()), 1407);
  // Whoever waited for that commit can see that the work is gone.
  EXPECT_NE(Epoch(), epoch);
  EXPECT_THAT(Below("/"), ElementsAre("/s/1"));
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1"));
  EXPECT_EQ(AskError("index_create", CreateRequest("b", DirectoryOf("b"))["data"]), 1407);
  EXPECT_EQ(AskError("index_create", CreateRequest("a", DirectoryOf("a"))["data"]), 0);
  disk_.SetUnlimitedRoom();
  Add("/s/2", "alpha beta");
  EXPECT_EQ(Paths("alpha").size(), 2U);
  EXPECT_EQ(AskError("index_create", CreateRequest("b", DirectoryOf("b"))["data"]), 0);
}

// Wherever the disk runs full, what was committed stays, and the index works when there is room.
TEST_F(DurabilityTest, AFullDiskAtAnyMomentLosesNothingCommitted) {
  Create();
  Add("/s/0", "alpha");
  for (int room = 0; room < 200000; room += 7919) {
    disk_.SetRoom(room);
    for (int i = 1; i < 40; ++i) {
      const Json::Value document =
          FileDocument("/s/" + std::to_string(i), "alpha " + std::string(500, 'x'));
      const int code = AskError("document_upsert_by_id", UpsertRequest("a", document)["data"]);
      EXPECT_TRUE(code == 0 || code == 1407) << code;
    }
    const int code = AskError("commit", IdData());
    EXPECT_TRUE(code == 0 || code == 1407) << code;
    disk_.SetUnlimitedRoom();
    EXPECT_EQ(Paths("alpha").size(), code == 0 ? 40U : 1U) << room;
    EXPECT_EQ(Below("/").size(), Paths("alpha").size());
    Json::Value below = IdData();
    below["query"]["qsl"]["prefix"]["TARNMDPath"] = "/s/";
    Ask("document_del_by_query", below);
    Add("/s/0", "alpha");
    EXPECT_EQ(Paths("alpha").size(), 1U);
  }
}

// A question that fails takes the transaction around it along, whole.
TEST_F(DurabilityTest, AFailedReadLeavesNoHalfTransaction) {
  Create();
  for (int i = 0; i < 200; ++i) {
    Upsert(FileDocument("/s/" + std::to_string(i), "alpha word" + std::to_string(i)));
  }
  Restart();
  const std::string epoch = Epoch();
  Upsert(FileDocument("/t/1", "alpha"));
  disk_.FailReads(true);
  EXPECT_EQ(AskError("document_get_by_query",
                     Parse(R"({"id":"a","query":{"qsl":{"prefix":{"TARNMDPath":"/"}}}})")),
            1408);
  disk_.FailReads(false);
  EXPECT_NE(Epoch(), epoch);
  Add("/t/2", "alpha");
  EXPECT_THAT(Below("/t"), ElementsAre("/t/2"));
  EXPECT_EQ(Below("/").size(), 201U);
  EXPECT_EQ(Paths("alpha").size(), 201U);
  EXPECT_EQ(Ask("engine_status", Json::objectValue)["indexes"][0U]["documents"].asInt(), 201);
}

TEST_F(DurabilityTest, AFailedSyncIsNoCommit) {
  Create();
  Upsert(FileDocument("/s/1", "alpha"));
  disk_.FailSyncs(true);
  EXPECT_EQ(AskError("commit", IdData()), 1408);
  disk_.FailSyncs(false);
  EXPECT_THAT(Below("/"), IsEmpty());
  EXPECT_THAT(Paths("alpha"), IsEmpty());
  Add("/s/1", "alpha");
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1"));
}

TEST_F(DurabilityTest, AMoveToAFullDiskChangesNothing) {
  Create();
  Add("/s/1", "alpha");
  Json::Value data = CreateRequest("a", DirectoryOf("a"))["data"];
  data["mappings"]["properties"]["New"]["type"] = "text";
  disk_.SetRoom(5000);
  EXPECT_EQ(AskError("index_create", data), 1407);
  EXPECT_THAT(test::ListDir(DirectoryOf("a")),
              testing::Not(testing::Contains(testing::HasSubstr(".new"))));
  disk_.SetUnlimitedRoom();
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1"));
  EXPECT_EQ(AskError("index_create", data), 0);
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1"));
}

// A database that something has happened to while the engine was not running.
class CorruptionTest : public EngineTest {
 protected:
  CorruptionTest() {
    Create();
    for (int i = 0; i < 200; ++i) {
      Upsert(FileDocument("/s/" + std::to_string(i), "alpha beta" + std::to_string(i)));
    }
    Commit();
    Create("b");
    Add("/t/1", "alpha", "b");
    engine_.reset();
    database_ = DatabasePath(DirectoryOf("a"));
  }
  void Start() { engine_ = std::make_unique<Engine>(options_); }
  void ExpectRepairable() {
    Ask("index_create", CreateRequest("a", DirectoryOf("a"))["data"]);
    EXPECT_THAT(Below("/"), IsEmpty());
    Add("/s/1", "alpha");
    EXPECT_THAT(Paths("alpha"), testing::UnorderedElementsAre("/s/1", "/t/1"));
  }
  std::string Problem() {
    return Ask("engine_status", Json::objectValue)["indexes"][0U]["problem"].asString();
  }

  std::string database_;
};

TEST_F(CorruptionTest, AFileThatIsNoDatabaseIsAClearError) {
  test::WriteFile(database_, std::string(8192, 'x'));
  Start();
  EXPECT_EQ(AskError("commit", Parse(R"({"id":"a"})")), 1405);
  EXPECT_EQ(AskError("document_upsert_by_id", UpsertRequest("a", FileDocument("/s/1"))["data"]),
            1405);
  EXPECT_THAT(Problem(), testing::HasSubstr("not a database"));
  // The other index works on, and a search says what it has left out.
  const Json::Value found = Search("alpha");
  EXPECT_EQ(found["total"].asInt(), 1);
  EXPECT_EQ(found["skipped"][0U]["id"].asString(), "a");
  EXPECT_EQ(found["skipped"][0U]["code"].asInt(), 1405);
  Json::Value only;
  only["query"] = "alpha";
  only["ids"].append("a");
  EXPECT_EQ(AskError("search", only), 1405);
  ExpectRepairable();
  EXPECT_EQ(Problem(), "");
}

// Alone and in a batch, whatever beside them cannot be stored.
TEST_F(CorruptionTest, DocumentsThatAreWrongAreToldSo) {
  test::WriteFile(database_, std::string(8192, 'x'));
  Start();
  Json::Value wrong = UpsertRequest("a", FileDocument("/s/1"));
  wrong["data"].removeMember("doc_id");
  EXPECT_EQ(engine_->Handle(wrong)["error"]["code"].asInt(), 1402);
  Json::Value batch;
  batch["compound"].append(wrong);
  EXPECT_EQ(engine_->Handle(batch)["data"][0U]["error"]["code"].asInt(), 1402);
  batch["compound"].append(UpsertRequest("a", FileDocument("/s/2")));
  const Json::Value answers = engine_->Handle(batch)["data"];
  EXPECT_EQ(answers[0U]["error"]["code"].asInt(), 1402);
  EXPECT_EQ(answers[1U]["error"]["code"].asInt(), 1405);
}

TEST_F(CorruptionTest, AMissingOrEmptyFileIsAClearError) {
  std::remove(database_.c_str());
  Start();
  EXPECT_EQ(AskError("commit", Parse(R"({"id":"a"})")), 1405);
  EXPECT_THAT(Problem(), testing::HasSubstr("missing"));
  ExpectRepairable();
  engine_.reset();
  test::WriteFile(database_, "");
  Start();
  EXPECT_EQ(AskError("commit", Parse(R"({"id":"a"})")), 1405);
  EXPECT_THAT(Problem(), testing::HasSubstr("not one of this engine"));
  ExpectRepairable();
}

TEST_F(CorruptionTest, AnotherLayoutIsAClearError) {
  Database(database_).Execute("UPDATE meta SET value=999 WHERE key='layout'");
  Start();
  EXPECT_THAT(Problem(), testing::HasSubstr("another version"));
  ExpectRepairable();
}

TEST_F(CorruptionTest, ADamagedIndexCanBePausedMovedAndDeleted) {
  test::WriteFile(database_, std::string(8192, 'x'));
  Start();
  EXPECT_EQ(AskError("index_pause", Parse(R"({"id":"a"})")), 0);
  EXPECT_EQ(AskError("index_resume", Parse(R"({"id":"a"})")), 0);
  Json::Value move = Parse(R"({"id":"a","data":{"id":"c"}})");
  move["data"]["path"] = DirectoryOf("c");
  EXPECT_EQ(AskError("index_config_set", move), 0);
  EXPECT_EQ(AskError("commit", Parse(R"({"id":"c"})")), 1405);
  EXPECT_EQ(AskError("index_delete", Parse(R"({"id":"c"})")), 0);
  EXPECT_FALSE(HasDatabase(DirectoryOf("c")));
}

TEST_F(CorruptionTest, DamageFoundAtWorkIsRememberedAndHidesNoOtherIndex) {
  // The pages behind the first hold everything but the list of tables.
  const std::string content = test::ReadFile(database_);
  test::WriteFile(database_, content.substr(0, 4096) + std::string(content.size() - 4096, '\x55'));
  Start();
  const Json::Value found = Search("alpha");
  EXPECT_EQ(found["total"].asInt(), 1);
  EXPECT_EQ(found["skipped"][0U]["code"].asInt(), 1405);
  EXPECT_NE(Problem(), "");
  ExpectRepairable();
}

// Nothing is removed that the engine cannot have made.
TEST_F(CorruptionTest, ADirectoryInTheWayOfAFileIsKeptAside) {
  for (const char* suffix : {"", "-wal", "-shm", "-journal", ".new"}) {
    SCOPED_TRACE(suffix);
    const std::string place = database_ + suffix;
    std::remove(place.c_str());
    test::WriteFile(place + "/kept", "x");
    Start();
    const bool is_in_use = std::string(suffix) != ".new";
    EXPECT_EQ(AskError("commit", Parse(R"({"id":"a"})")), is_in_use ? 1405 : 0);
    if (!is_in_use) std::remove(database_.c_str());
    ExpectRepairable();
    engine_.reset();
    int kept = 0;
    for (const std::string& name : test::ListDir(DirectoryOf("a"))) {
      const std::string aside = DirectoryOf("a") + '/' + name;
      if (name.find(".damaged-") == std::string::npos) continue;
      kept += test::ReadFile(aside + "/kept") == "x" ? 1 : 0;
      test::RemoveTree(aside);
    }
    EXPECT_EQ(kept, 1);
  }
}

TEST_F(CorruptionTest, AFileInTheWayOfTheDirectoryIsKeptAside) {
  test::RemoveTree(DirectoryOf("a"));
  test::WriteFile(DirectoryOf("a"), "x");
  Start();
  EXPECT_EQ(AskError("commit", Parse(R"({"id":"a"})")), 1405);
  ExpectRepairable();
}

// Damage to any page ends in answers or in clear errors, and index_create always helps.
TEST_F(CorruptionTest, NoDamagedPageDoesHarm) {
  const std::string content = test::ReadFile(database_);
  const std::size_t page = 4096;
  for (std::size_t at = 0; at < content.size(); at += 3 * page) {
    std::string damaged = content;
    for (std::size_t i = at; i < std::min(at + page, content.size()); i += 5) damaged[i] ^= 0x5a;
    test::WriteFile(database_, damaged);
    Start();
    for (const char* query : {"alpha", "beta1*", "in:/s", "type:document", "name:199"}) {
      Json::Value data;
      data["query"] = query;
      const Json::Value answer = engine_->Handle(MakeRequest("search", data));
      EXPECT_TRUE(answer["success"].asBool()) << toString(answer);
    }
    AskError("document_upsert_by_id", UpsertRequest("a", FileDocument("/s/7", "gamma"))["data"]);
    const int code = AskError("commit", Parse(R"({"id":"a"})"));
    EXPECT_TRUE(code == 0 || code == 1405) << code;
    engine_.reset();
  }
  test::WriteFile(database_, std::string(100, 'x'));
  Start();
  ExpectRepairable();
}

TEST_F(CorruptionTest, AListOfIndexesThatCannotBeReadIsNotTakenForAnEmptyOne) {
  for (const char* text :
       {"", "{", "[]", "{}", R"({"version":1})", R"({"version":2,"indexes":[]})",
        R"({"version":1,"indexes":[7]})", R"({"version":1,"indexes":[{"id":"a"}]})"}) {
    test::WriteFile(options_.registry_path, text);
    try {
      Start();
      ADD_FAILURE() << text;
    } catch (const Error& error) {
      EXPECT_EQ(error.code(), kErrorLoadFile) << text;
      EXPECT_THAT(error.reason(), testing::HasSubstr(options_.registry_path));
    }
  }
}

TEST_F(CorruptionTest, AFileThatVanishesAtWorkIsNotCommittedInto) {
  Start();
  Upsert(FileDocument("/s/new", "gamma"));
  std::remove(database_.c_str());
  EXPECT_EQ(AskError("commit", Parse(R"({"id":"a"})")), 1405);
  ExpectRepairable();
}

}  // namespace
}  // namespace quarry::engine
