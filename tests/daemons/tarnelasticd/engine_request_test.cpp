// What the engine answers to requests of every shape.

#include <sqlite3.h>

#include <atomic>
#include <thread>

#include "common/json.h"
#include "daemons/tarnelasticd/index_files.h"
#include "tests/daemons/tarnelasticd/support/engine_fixture.h"
#include "tests/support/files.h"

namespace quarry::engine {
namespace {

using testing::HasSubstr;

class RequestTest : public EngineTest {
 protected:
  RequestTest() { Create(); }

  Json::Value AnswerText(const std::string& request) { return Parse(engine_->HandleText(request)); }
  // "code msg" of the error with which a request fails, "" when it does not.
  std::string ErrorOf(const std::string& request) {
    const Json::Value answer = AnswerText(request);
    EXPECT_TRUE(answer["success"].isBool()) << toString(answer);
    if (answer["success"].asBool()) return "";
    EXPECT_TRUE(answer["error"]["code"].isInt());
    return std::to_string(answer["error"]["code"].asInt()) + " " +
           answer["error"]["msg"].asString();
  }
};

TEST_F(RequestTest, RefusesWhatIsNoRequest) {
  EXPECT_EQ(ErrorOf(""), "1402 The request is no JSON");
  EXPECT_EQ(ErrorOf("{"), "1402 The request is no JSON");
  EXPECT_EQ(ErrorOf("{} {}"), "1402 The request is no JSON");
  EXPECT_EQ(ErrorOf(std::string("\0", 1)), "1402 The request is no JSON");
  EXPECT_EQ(ErrorOf(std::string(100000, '[')), "1402 The request is no JSON");
  for (const char* text : {"null", "true", "7", "\"commit\"", "[]", "{}", "[{\"command\":1}]"}) {
    EXPECT_EQ(ErrorOf(text), "1402 Missing property: command") << text;
  }
  EXPECT_EQ(ErrorOf(R"({"command":7,"data":{}})"), "1402 Not a string: command");
  EXPECT_EQ(ErrorOf(R"({"command":null})"), "1402 Not a string: command");
}

TEST_F(RequestTest, RefusesUnknownCommands) {
  EXPECT_EQ(ErrorOf(R"({"command":"","data":{}})"), "1403 There is no command ");
  EXPECT_EQ(ErrorOf(R"({"command":"Commit","data":{"id":"a"}})"),
            "1403 There is no command Commit");
}

TEST_F(RequestTest, RefusesDataThatIsNoObject) {
  for (const char* command :
       {"index_create", "index_delete", "index_pause", "index_resume", "index_config_set",
        "document_upsert_by_id", "document_set_by_id", "document_del_by_id",
        "document_del_by_query", "document_get_by_query", "commit", "update_term_suggestion",
        "search", "complete"}) {
    const std::string begin = std::string(R"({"command":")") + command + '"';
    EXPECT_EQ(ErrorOf(begin + "}"), "1402 Missing property: data") << command;
    for (const char* data : {"null", "1", "\"a\"", "[]"}) {
      EXPECT_EQ(ErrorOf(begin + ",\"data\":" + data + "}"), "1402 Not an object: data") << command;
    }
  }
  EXPECT_EQ(ErrorOf(R"({"command":"engine_status"})"), "");
  EXPECT_EQ(ErrorOf(R"({"command":"engine_status","data":[]})"), "1402 Not an object: data");
}

TEST_F(RequestTest, RefusesIndexesWithoutAName) {
  for (const char* command :
       {"index_create", "index_delete", "index_pause", "index_resume", "index_config_set",
        "document_upsert_by_id", "document_set_by_id", "document_del_by_id",
        "document_del_by_query", "document_get_by_query", "commit"}) {
    const std::string begin = std::string(R"({"command":")") + command + R"(","data":{)";
    EXPECT_EQ(ErrorOf(begin + "}}"), "1402 Missing property: id") << command;
    EXPECT_EQ(ErrorOf(begin + R"("id":7}})"), "1402 Not a string: id") << command;
    EXPECT_EQ(ErrorOf(begin + R"("id":""}})"), "1402 Empty: id") << command;
    EXPECT_EQ(ErrorOf(begin + R"("id":"a\u0000b"}})"), "1402 NUL byte in: id") << command;
  }
  EXPECT_EQ(ErrorOf(R"({"command":"update_term_suggestion","data":{"doc_id_field":"x"}})"),
            "1402 Missing property: db_name");
  EXPECT_EQ(ErrorOf(R"({"command":"update_term_suggestion","data":{"db_name":"a"}})"),
            "1402 Missing property: doc_id_field");
}

TEST_F(RequestTest, NamesIndexesThatAreUnknown) {
  for (const char* command :
       {"index_pause", "index_resume", "document_upsert_by_id", "document_set_by_id",
        "document_del_by_id", "document_del_by_query", "document_get_by_query", "commit"}) {
    EXPECT_EQ(ErrorOf(std::string(R"({"command":")") + command + R"(","data":{"id":"b"}})"),
              "1404 There is no index b")
        << command;
  }
  EXPECT_EQ(
      ErrorOf(
          R"({"command":"update_term_suggestion","data":{"db_name":"b","doc_id_field":"TARNMDPath"}})"),
      "1404 There is no index b");
  EXPECT_EQ(ErrorOf(R"({"command":"search","data":{"ids":["b"],"query":"x"}})"),
            "1404 There is no index b");
}

TEST_F(RequestTest, RefusesDocumentsOfTheWrongShape) {
  const auto upsert = [this](const std::string& rest) {
    return ErrorOf(R"({"command":"document_upsert_by_id","data":{"id":"a")" + rest + "}}");
  };
  EXPECT_EQ(upsert(""), "1402 Missing property: doc_id");
  EXPECT_EQ(upsert(R"(,"doc_id":["/s/1"])"), "1402 Not a string: doc_id");
  EXPECT_EQ(upsert(R"(,"doc_id":"","data":{})"), "1402 Empty: doc_id");
  EXPECT_EQ(upsert(R"(,"doc_id":"/s\u0000","data":{})"), "1402 NUL byte in: doc_id");
  EXPECT_EQ(upsert(R"(,"doc_id":"/s/1")"), "1402 Missing property: data");
  EXPECT_EQ(upsert(R"(,"doc_id":"/s/1","data":[])"), "1402 Not an object: data");
  EXPECT_EQ(upsert(R"(,"doc_id":"/s/1","data":{})"), "");
  const auto set = [this](const std::string& rest) {
    return ErrorOf(R"({"command":"document_set_by_id","data":{"id":"a","doc_id":"/s/1")" + rest +
                   "}}");
  };
  EXPECT_EQ(set(""), "1402 Missing property: data");
  EXPECT_EQ(set(R"(,"data":7)"), "1402 Not an object: data");
  EXPECT_EQ(set(R"(,"data":{"TARNMDPath":7})"), "1402 Not a string: TARNMDPath");
  EXPECT_EQ(set(R"(,"data":{"TARNMDPath":""})"), "1402 Empty: TARNMDPath");
  EXPECT_EQ(set(R"(,"data":{"TARNMDPath":null})"), "1402 Not a string: TARNMDPath");
}

TEST_F(RequestTest, RefusesQueriesThatItDoesNotKnow) {
  for (const char* command : {"document_get_by_query", "document_del_by_query"}) {
    const auto ask = [&](const std::string& query) {
      return ErrorOf(std::string(R"({"command":")") + command + R"(","data":{"id":"a")" + query +
                     "}}");
    };
    EXPECT_EQ(ask(""), "1402 Missing property: query");
    EXPECT_EQ(ask(R"(,"query":[])"), "1402 Not an object: query");
    EXPECT_EQ(ask(R"(,"query":{})"), "1402 Missing property: qsl");
    EXPECT_EQ(ask(R"(,"query":{"qsl":"*"})"), "1402 Not an object: qsl");
    EXPECT_EQ(ask(R"(,"query":{"qsl":{}})"), "1402 qsl must have one member");
    EXPECT_EQ(ask(R"(,"query":{"qsl":{"match":{}}})"),
              "1402 There is no query of this kind: match");
    EXPECT_EQ(ask(R"(,"query":{"qsl":{"prefix":{},"term":{}}})"), "1402 qsl must have one member");
    const std::string prefix = "1402 A prefix must be of TARNMDPath";
    EXPECT_EQ(ask(R"(,"query":{"qsl":{"prefix":"/s/"}})"), prefix);
    EXPECT_EQ(ask(R"(,"query":{"qsl":{"prefix":{"TARNMDParent":"/s/"}}})"), prefix);
    EXPECT_EQ(ask(R"(,"query":{"qsl":{"prefix":{"TARNMDPath":"/s/","x":1}}})"), prefix);
    EXPECT_EQ(ask(R"(,"query":{"qsl":{"prefix":{"TARNMDPath":1}}})"),
              "1402 Not a string: TARNMDPath");
    // Everything would be meant by it, and that nobody may mean by mistake.
    EXPECT_EQ(ask(R"(,"query":{"qsl":{"prefix":{"TARNMDPath":""}}})"), "1402 Empty: TARNMDPath");
    EXPECT_EQ(ask(R"(,"query":{"qsl":{"term":{}}})"), "1402 A term must have one field");
    EXPECT_EQ(ask(R"(,"query":{"qsl":{"term":{"TARNMDTitle":"x"}}})"),
              "1402 There is no query by this field: TARNMDTitle");
    EXPECT_EQ(ask(R"(,"query":{"qsl":{"term":{"TARNMDParent":1}}})"),
              "1402 Not a string: TARNMDParent");
    const std::string term = R"(,"query":{"qsl":{"term":{"TARNMDParent":"/s"}},)";
    EXPECT_EQ(ask(term + R"("load_field":"x"})"), "1402 Not an array: load_field");
    EXPECT_EQ(ask(term + R"("load_field":[1]})"), "1402 Not a string: load_field");
    EXPECT_EQ(ask(term + R"("limit":"x"})"), "1402 Not an integer: limit");
    EXPECT_EQ(ask(term + R"("limit":1.5})"), "1402 Not an integer: limit");
    EXPECT_THAT(ask(term + R"("limit":-1})"), HasSubstr("1402 limit must be from 0 to "));
    EXPECT_EQ(ask(term + R"("after":7})"), "1402 Not a string: after");
  }
}

TEST_F(RequestTest, RefusesSearchesOfTheWrongShape) {
  const auto search = [this](const std::string& data) {
    return ErrorOf(R"({"command":"search","data":{)" + data + "}}");
  };
  EXPECT_EQ(search(""), "1402 Missing property: query");
  EXPECT_EQ(search(R"("query":7)"), "1402 Not a string: query");
  EXPECT_EQ(search(R"("query":"x","ids":"a")"), "1402 Not an array: ids");
  EXPECT_EQ(search(R"("query":"x","ids":[1])"), "1402 Not a string: ids");
  EXPECT_EQ(search(R"("query":"x","limit":1001)"), "1402 limit must be from 0 to 1000");
  EXPECT_EQ(search(R"("query":"x","limit":null)"), "1402 Not an integer: limit");
  EXPECT_EQ(search(R"("query":"x","offset":100001)"), "1402 offset must be from 0 to 100000");
  EXPECT_EQ(search(R"("query":"x","sort":"size")"), "1402 sort must be score, path or time");
  EXPECT_EQ(search(R"("query":"x","sort":1)"), "1402 Not a string: sort");
  EXPECT_EQ(search(R"("query":"x","highlight":1)"), "1402 Not an object: highlight");
  EXPECT_EQ(search(R"("query":"x","highlight":{"length":4097})"),
            "1402 length must be from 0 to 4096");
  EXPECT_EQ(search(R"("query":"x","ids":[])"), "");
}

TEST_F(RequestTest, RefusesPlacesAndMappingsOfIndexes) {
  const auto create = [this](const std::string& rest) {
    return ErrorOf(R"({"command":"index_create","data":{"id":"b")" + rest + "}}");
  };
  EXPECT_EQ(create(""), "1402 Missing property: path");
  EXPECT_EQ(create(R"(,"path":"relative")"),
            "1402 The path of an index must be absolute: relative");
  EXPECT_EQ(create(R"(,"path":"/")"), "1402 The path of an index must not have empty parts: /");
  EXPECT_EQ(create(R"(,"path":"/a//b")"),
            "1402 The path of an index must not have empty parts: /a//b");
  EXPECT_EQ(create(R"(,"path":"/a/")"), "1402 The path of an index must not have empty parts: /a/");
  EXPECT_EQ(create(R"(,"path":"/a/../b")"), "1402 The path of an index must be plain: /a/../b");
  EXPECT_EQ(create(R"(,"path":"/a/.")"), "1402 The path of an index must be plain: /a/.");
  EXPECT_EQ(create(",\"path\":\"/" + std::string(5000, 'x') + '"'),
            "1402 The path of an index is too long");
  const std::string path = ",\"path\":\"" + DirectoryOf("b") + '"';
  const auto map = [&](const std::string& mappings) {
    return create(path + ",\"mappings\":" + mappings);
  };
  const std::string refused = "1412 The mappings are refused: ";
  EXPECT_EQ(map("[]"), refused + "they are no object");
  EXPECT_EQ(map(R"({"property_id":1})"), refused + "property_id is no string");
  EXPECT_EQ(map(R"({"default":1})"), refused + "default is no object");
  EXPECT_EQ(map(R"({"properties":[]})"), refused + "properties is no object");
  EXPECT_EQ(map(R"({"properties":{"x":1}})"), refused + "x is no object");
  EXPECT_EQ(map(R"({"properties":{"x":{"type":"date"}}})"), refused + "there is no type date");
  EXPECT_EQ(map(R"({"properties":{"x":{"analyzer":"greek"}}})"),
            refused + "there is no analyzer greek");
  EXPECT_EQ(map(R"({"properties":{"x":{"_all":"yes"}}})"), refused + "_all is no bool");
  EXPECT_EQ(map(R"({"properties":{"":{}}})"), refused + "the name of a field is too long");
  EXPECT_EQ(map(R"({"properties":{"x":{"preprocess":"ngram"},"y":{"preprocess":"ngram"}}})"),
            refused + "two fields are to be found by their parts");
  EXPECT_FALSE(HasDatabase(DirectoryOf("b")));
  EXPECT_EQ(map("null"), "");
}

TEST_F(RequestTest, TellsThatADirectoryBelongsToAnotherIndex) {
  EXPECT_EQ(AskError("index_create", CreateRequest("b", DirectoryOf("a"))["data"]), 1410);
}

TEST_F(RequestTest, TellsWhyAQueryIsRefused) {
  EXPECT_EQ(ErrorOf(R"({"command":"search","data":{"query":""}})"),
            "1409 There is nothing to search for.");
}

TEST_F(RequestTest, GivesUpSearchesThatTakeTooLong) {
  for (int i = 0; i < 50; ++i) {
    Upsert(FileDocument("/s/" + std::to_string(i) + ".txt", "alpha beta"));
  }
  Commit();
  engine_.reset();
  options_.search_time = std::chrono::seconds(-1);
  engine_ = std::make_unique<Engine>(options_);
  EXPECT_EQ(SearchError("alpha"), 1411);
}

TEST_F(RequestTest, RunsBatchesInOrderAndAnswersPerElement) {
  Json::Value batch;
  batch["compound"].append(UpsertRequest("a", FileDocument("/s/1.txt")));
  batch["compound"].append(MakeRequest("nonsense", Json::objectValue));
  batch["compound"].append(7);
  Json::Value nested;
  nested["compound"].append(UpsertRequest("a", FileDocument("/s/2.txt")));
  batch["compound"].append(nested);
  Json::Value id;
  id["id"] = "a";
  batch["compound"].append(MakeRequest("commit", id));
  const Json::Value answer = engine_->Handle(batch);
  EXPECT_TRUE(answer["success"].asBool());
  EXPECT_TRUE(answer["has_fail"].asBool());
  ASSERT_EQ(answer["data"].size(), 5U);
  EXPECT_EQ(toString(answer["data"][0U]), R"({"success":true})");
  EXPECT_EQ(answer["data"][1U]["error"]["code"].asInt(), 1403);
  EXPECT_EQ(answer["data"][2U]["error"]["code"].asInt(), 1402);
  EXPECT_EQ(answer["data"][3U]["error"]["msg"].asString(), "Missing property: command");
  EXPECT_TRUE(answer["data"][4U]["success"].asBool());
  EXPECT_THAT(Below("/s/"), testing::ElementsAre("/s/1.txt"));
}

// Documents in a row, which are stored together, are answered as each would be by itself.
TEST_F(RequestTest, AnswersDocumentsOfBatchesOneByOne) {
  for (const char* id : {"a", "b", "paused"}) Create(id);
  Json::Value id;
  id["id"] = "paused";
  Ask("index_pause", id);
  std::vector<Json::Value> requests;
  for (int i = 0; i < 40; ++i) {
    const std::string path = "/s/" + std::to_string(i % 23) + ".txt";
    const char* index = i < 15 ? "a" : i < 25 ? "b" : i < 30 ? "paused" : i < 33 ? "none" : "a";
    requests.push_back(UpsertRequest(index, FileDocument(path, "text" + std::to_string(i))));
  }
  requests[1]["data"].removeMember("doc_id");
  requests[3]["data"]["doc_id"] = 7;
  requests[4]["data"]["data"] = "no object";
  requests[6]["data"].removeMember("data");
  requests[8].removeMember("data");
  requests[10]["command"] = 5;
  requests[11]["data"]["id"] = 3;
  requests[12]["data"]["id"] = "";
  requests[13] = 7;
  for (int i = 36; i < 40; ++i) requests[static_cast<std::size_t>(i)]["data"].removeMember("id");
  Json::Value batch;
  Json::Value expected(Json::arrayValue);
  for (const Json::Value& request : requests) batch["compound"].append(request);
  for (const Json::Value& request : requests) {
    Json::Value alone;
    alone["compound"].append(request);
    expected.append(engine_->Handle(request));
    EXPECT_EQ(engine_->Handle(alone)["data"][0U], expected[expected.size() - 1]);
  }
  const std::vector<std::string> below_a = Below("/s", "a");
  const std::vector<std::string> below_b = Below("/s", "b");
  for (const char* index : {"a", "b"}) {
    id["id"] = index;
    Ask("index_delete", id);
    Create(index);
  }
  const Json::Value response = engine_->Handle(batch);
  EXPECT_TRUE(response["has_fail"].asBool());
  EXPECT_EQ(response["data"], expected);
  EXPECT_EQ(Below("/s", "a"), below_a);
  EXPECT_EQ(Below("/s", "b"), below_b);
  EXPECT_FALSE(below_a.empty());
  EXPECT_FALSE(below_b.empty());
}

TEST_F(RequestTest, AnswersAnEmptyBatchAndRefusesOneThatIsNoArray) {
  EXPECT_EQ(engine_->HandleText(R"({"compound":[]})"),
            R"({"data":[],"has_fail":false,"success":true})");
  EXPECT_EQ(ErrorOf(R"({"compound":{}})"), "1402 Not an array: compound");
  EXPECT_EQ(ErrorOf(R"({"compound":null})"), "1402 Not an array: compound");
}

TEST_F(RequestTest, ReportsItsIndexes) {
  Create("b");
  Upsert(FileDocument("/s/1.txt"), "b");
  const Json::Value status = Ask("engine_status", Json::objectValue);
  EXPECT_EQ(toString(status["indexes"]),
            R"([{"documents":0,"id":"a","paused":false},{"documents":1,"id":"b","paused":false}])");
  EXPECT_EQ(Ask("engine_status", Json::objectValue)["epoch"], status["epoch"]);
  Restart();
  EXPECT_NE(Ask("engine_status", Json::objectValue)["epoch"], status["epoch"]);
}

// Busy answers send their receiver to sleep for a quarter of an hour.
class BusyTest : public EngineTest {
 protected:
  ~BusyTest() override { sqlite3_hard_heap_limit64(0); }
};

TEST_F(BusyTest, AnswersBusyWhileOthersHoldAllMemory) {
  engine_.reset();
  options_.memory_bytes = 1;
  options_.memory_wait = std::chrono::milliseconds(0);
  engine_ = std::make_unique<Engine>(options_);
  Create("a");
  Create("b");
  // Somebody else's transaction keeps the first request at work, and so holding its memory.
  Database db(DatabasePath(DirectoryOf("a")));
  db.Execute("BEGIN IMMEDIATE");
  const Json::Value first = UpsertRequest("a", FileDocument("/s/1.txt"));
  std::thread at_work([&] {
    // The other request may hold the memory when this one first asks for it.
    EXPECT_TRUE(test::WaitUntil([&] { return engine_->Handle(first)["success"].asBool(); }));
  });
  const Json::Value second = UpsertRequest("b", FileDocument("/s/2.txt"));
  EXPECT_TRUE(test::WaitUntil(
      [&] { return engine_->Handle(second)["error"]["code"] == Json::Value(1400); }));
  // What must never be busy is not.
  for (const char* command : {"index_pause", "index_resume", "index_delete"}) {
    EXPECT_EQ(AskError(command, Parse(R"({"id":"b"})")), 0) << command;
  }
  EXPECT_EQ(AskError("index_create", CreateRequest("b", DirectoryOf("b"))["data"]), 0);
  db.Execute("ROLLBACK");
  at_work.join();
  EXPECT_TRUE(engine_->Handle(second)["success"].asBool());
}

TEST_F(BusyTest, AnswersBusyWithoutMemoryButNotToWhatMustNotBeBusy) {
  Create("a");
  sqlite3_hard_heap_limit64(sqlite3_memory_used());
  EXPECT_EQ(
      AskError("document_upsert_by_id",
               UpsertRequest("a", FileDocument("/s/1.txt", std::string(100000, 'x')))["data"]),
      1401);
  EXPECT_EQ(AskError("index_create", CreateRequest("b", DirectoryOf("b"))["data"]), 1414);
  sqlite3_hard_heap_limit64(0);
  EXPECT_EQ(AskError("index_create", CreateRequest("b", DirectoryOf("b"))["data"]), 0);
  Upsert(FileDocument("/s/1.txt"));
}

TEST_F(BusyTest, WhatCouldNotBeOpenedForWantOfMemoryIsOpenedLater) {
  Create("a");
  Add("/s/1.txt", "alpha");
  engine_.reset();
  sqlite3_hard_heap_limit64(sqlite3_memory_used() + 20000);
  engine_ = std::make_unique<Engine>(options_);
  EXPECT_EQ(SearchError("alpha"), 1401);
  // Making it anew would throw away what is sound.
  EXPECT_EQ(AskError("index_create", CreateRequest("a", DirectoryOf("a"))["data"]), 1414);
  sqlite3_hard_heap_limit64(0);
  EXPECT_THAT(Paths("alpha"), testing::ElementsAre("/s/1.txt"));
  EXPECT_TRUE(Ask("engine_status", Json::objectValue)["indexes"][0U]["problem"].isNull());
}

}  // namespace
}  // namespace quarry::engine
