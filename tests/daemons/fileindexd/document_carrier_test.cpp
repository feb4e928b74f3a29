#include "daemons/fileindexd/document_carrier.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <iterator>
#include <mutex>
#include <random>
#include <utility>

#include "common/json.h"
#include "tests/daemons/common/harness.h"
#include "tests/support/temp_dir.h"

namespace quarry::fileindexd {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

// A daemon whose answers a test makes, and that keeps what it was asked.
class Peer {
 public:
  using Answer = std::function<std::string(const std::string& request)>;

  explicit Peer(const std::string& path)
      : server_(path, [this](const std::string& request, const daemon::Peer&) {
          const std::lock_guard<std::mutex> lock(mutex_);
          asked_.push_back(request);
          return answer_(request);
        }) {}

  void Set(Answer answer) {
    const std::lock_guard<std::mutex> lock(mutex_);
    answer_ = std::move(answer);
  }
  std::vector<std::string> Asked() {
    const std::lock_guard<std::mutex> lock(mutex_);
    return std::exchange(asked_, {});
  }
  std::size_t ConnectionCount() const { return server_.ConnectionCount(); }

 private:
  std::mutex mutex_;
  Answer answer_ = [](const std::string&) { return std::string("{}"); };
  std::vector<std::string> asked_;
  test::ServerThread server_;
};

Json::Value Parsed(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

// The document of each path up to `most` of them; "null" for names that begin with "bad".
std::string Read(const std::string& request, std::size_t most = 1000) {
  std::string reply;
  const Json::Value asked = Parsed(request);
  for (const Json::Value& file : asked["data"]["files"]) {
    const Json::Value& path = file["path"];
    if (most-- == 0) break;
    if (!reply.empty()) reply += ',';
    const bool bad = path.asString().find("/bad") != std::string::npos;
    // Numbers and escapes that a parser would write down differently.
    reply += bad ? "null" : R"({"TARNMDPath":)" + toString(path) + R"(, "n":1.50,"t":"\u0041\/"})";
  }
  return R"({"data":[)" + reply + R"(],"success":true})";
}

// Takes every document but those whose names begin with "full".
std::string Store(const std::string& request) {
  Json::Value answer;
  answer["success"] = true;
  answer["data"] = Json::Value(Json::arrayValue);
  const Json::Value asked = Parsed(request);
  for (const Json::Value& element : asked["compound"]) {
    Json::Value one;
    one["success"] = element["data"]["doc_id"].asString().find("/full") == std::string::npos;
    if (!one["success"].asBool()) one["error"]["code"] = 1401;
    answer["data"].append(one);
  }
  return toString(answer);
}

bool Always() {
  return true;
}

class DocumentCarrierTest : public ::testing::Test {
 protected:
  void SetUp() override {
    extractor_.Set([](const std::string& request) { return Read(request); });
    engine_.Set(Store);
  }
  std::vector<bool> Carry(const std::vector<std::string>& paths) {
    std::vector<Wish> wishes;
    for (const std::string& path : paths) wishes.push_back({path, true});
    return carrier_.Carry("fileindex_photo", wishes, [this] { return exchanges_-- > 0; });
  }

  test::TempDir dir_;
  Peer extractor_{dir_ / "x"};
  Peer engine_{dir_ / "e"};
  DocumentCarrier carrier_{{dir_ / "x", dir_ / "e"}};
  int exchanges_ = 1'000'000;  // until it is not to go on
};

TEST_F(DocumentCarrierTest, HandsDocumentsOnAsTheyAre) {
  EXPECT_THAT(Carry({"/v/a", "/v/\"b\".\xFF"}), ElementsAre(true, true));
  EXPECT_THAT(extractor_.Asked(),
              ElementsAre("{\"command\":\"parse_many\",\"data\":{\"files\":["
                          "{\"options\":{\"need_meta\":true},\"path\":\"/v/a\"},"
                          "{\"options\":{\"need_meta\":true},\"path\":\"/v/\\\"b\\\".\xFF\"}]}}"));
  EXPECT_THAT(
      engine_.Asked(),
      ElementsAre("{\"compound\":[{\"command\":\"document_upsert_by_id\",\"data\":{\"id\":"
                  "\"fileindex_photo\",\"doc_id\":\"/v/a\",\"data\":{\"TARNMDPath\":"
                  "\"/v/a\", \"n\":1.50,\"t\":\"\\u0041\\/\",\"TARNMDSearchFileName\":\"a\"}}},"
                  "{\"command\":\"document_upsert_by_id\",\"data\":{\"id\":\"fileindex_photo\","
                  "\"doc_id\":\"/v/\\\"b\\\".\xFF\",\"data\":{\"TARNMDPath\":"
                  "\"/v/\\\"b\\\".\xFF\", \"n\":1.50,\"t\":\"\\u0041\\/\","
                  "\"TARNMDSearchFileName\":\"\\\"b\\\".\xFF\"}}}]}"));
}

TEST_F(DocumentCarrierTest, ContentIsOptional) {
  EXPECT_THAT(carrier_.Carry("i", {{"/v/a", false}, {"/v/b", true}}, Always),
              ElementsAre(true, true));
  const Json::Value asked = Parsed(extractor_.Asked().at(0));
  EXPECT_FALSE(asked["data"]["files"][0]["options"]["need_meta"].asBool());
  EXPECT_TRUE(asked["data"]["files"][1]["options"]["need_meta"].asBool());
}

TEST_F(DocumentCarrierTest, TellsWhichDocumentsWereReadAndTaken) {
  EXPECT_THAT(Carry({"/v/bad", "/v/a", "/v/full", "/v/bad2", "/v/b"}),
              ElementsAre(false, true, false, false, true));
  EXPECT_THAT(Parsed(engine_.Asked().at(0))["compound"], SizeIs(3));
}

TEST_F(DocumentCarrierTest, AsksNothingOfTheEngineWhereNothingWasRead) {
  EXPECT_THAT(Carry({"/v/bad", "/v/bad2"}), ElementsAre(false, false));
  EXPECT_THAT(engine_.Asked(), IsEmpty());
  EXPECT_THAT(Carry({}), IsEmpty());
}

TEST_F(DocumentCarrierTest, AReaderMayAnswerAFewAtATime) {
  extractor_.Set([](const std::string& request) { return Read(request, 2); });
  EXPECT_THAT(Carry({"/v/a", "/v/bad", "/v/b", "/v/c", "/v/full"}),
              ElementsAre(true, false, true, true, false));
  EXPECT_THAT(extractor_.Asked(), SizeIs(3));
  EXPECT_THAT(engine_.Asked(), SizeIs(3));
}

TEST_F(DocumentCarrierTest, NothingIsDoneByAnAnswerThatIsNone) {
  const char* const replies[] = {
      "{}",
      "",
      "7",
      "[]",
      R"({"success":false,"error":{"code":120,"msg":"Unknown command"}})",
      R"({"data":[],"success":true})",
      R"({"data":{},"success":true})",
      R"({"data":[{"a":1},{"a":1},{"a":1}],"success":true})",
      R"({"data":[{"a":1}})",
      R"({"data":["text",7],"success":true})"};
  for (const char* reply : replies) {
    extractor_.Set([reply](const std::string&) { return std::string(reply); });
    EXPECT_THAT(Carry({"/v/a", "/v/b"}), ElementsAre(false, false)) << reply;
  }
  EXPECT_THAT(engine_.Asked(), IsEmpty());
}

TEST_F(DocumentCarrierTest, NothingIsDoneWhereTheEngineDoesNotSaySo) {
  for (const char* reply :
       {"{}", "", "7", "[]", "no JSON", R"({"success":false,"error":{"code":1400,"msg":"busy"}})",
        R"({"success":true,"data":[{"success":true}]})", R"({"success":true,"data":[1,2]})",
        R"({"success":true,"data":[{},{"success":"yes"}]})"}) {
    engine_.Set([reply](const std::string&) { return std::string(reply); });
    EXPECT_THAT(Carry({"/v/a", "/v/b"}), ElementsAre(false, false)) << reply;
    EXPECT_THAT(engine_.Asked(), SizeIs(1));
  }
}

TEST_F(DocumentCarrierTest, WhatWasTakenBeforeABreakStaysDone) {
  int asked = 0;
  extractor_.Set(
      [&](const std::string& request) { return ++asked == 1 ? Read(request, 1) : std::string(); });
  EXPECT_THAT(Carry({"/v/a", "/v/b", "/v/c"}), ElementsAre(true, false, false));
}

TEST_F(DocumentCarrierTest, LeavesTheRestWhenItIsNotToGoOn) {
  extractor_.Set([](const std::string& request) { return Read(request, 1); });
  exchanges_ = 2;
  EXPECT_THAT(Carry({"/v/a", "/v/b", "/v/c", "/v/d"}), ElementsAre(true, true, false, false));
  EXPECT_THAT(extractor_.Asked(), SizeIs(2));
  EXPECT_THAT(Carry({"/v/a"}), ElementsAre(false));
  EXPECT_THAT(extractor_.Asked(), IsEmpty());
}

TEST_F(DocumentCarrierTest, StoresNoDocumentInThePlaceOfAnother) {
  extractor_.Set([](const std::string&) {
    return std::string(R"({"data":[{"TARNMDPath":"/v/b"},{"TARNMDPath":"/v/a"},{"t":1},{},)"
                       R"({"t":{"TARNMDPath":"/v/e"}},{"TARNMDPath":"/v/f"}],"success":true})");
  });
  EXPECT_THAT(Carry({"/v/a", "/v/b", "/v/c", "/v/d", "/v/e", "/v/f"}),
              ElementsAre(false, false, false, false, false, true));
  EXPECT_THAT(Parsed(engine_.Asked().at(0))["compound"], SizeIs(1));
}

TEST_F(DocumentCarrierTest, TheReaderDoesNotSayByWhatNameAPlaceIsFound) {
  extractor_.Set([](const std::string&) {
    return std::string(R"({"data":[{"TARNMDPath":"/v/a","TARNMDSearchFileName":"b"}]})");
  });
  EXPECT_THAT(Carry({"/v/a"}), ElementsAre(true));
  EXPECT_EQ(Parsed(engine_.Asked().at(0))["compound"][0]["data"]["data"]["TARNMDSearchFileName"],
            "a");
}

// Whatever the reader answers, the engine is asked for nothing but to store documents of these
// places in this index, or refuses the whole.
TEST_F(DocumentCarrierTest, NoAnswerCanMakeOtherCommands) {
  std::mt19937 random(3);
  const char* const pieces[] = {"{",
                                "}",
                                "[",
                                "]",
                                "\"",
                                "\\",
                                ",",
                                ":",
                                "}}}",
                                "]}",
                                "\\\"",
                                "/*x",
                                "*/",
                                "//\n",
                                "\n",
                                "'",
                                R"("}},{"command":"commit","data":{"id":")",
                                R"(}},{"command":"commit","data":{"id":"i"}},{"a":{)",
                                R"(,"doc_id":"/v/x")",
                                R"("TARNMDPath":"/v/a",)",
                                "\xEF\xBB\xBF",
                                "null"};
  const std::string nul(1, '\0');
  extractor_.Set([&](const std::string& request) {
    std::string reply = Read(request);
    for (auto i = random() % 4; i > 0; --i) {
      const std::string piece = random() % 30 == 0 ? nul : pieces[random() % std::size(pieces)];
      reply.replace(random() % reply.size(), random() % 2 * piece.size(), piece);
    }
    return reply;
  });
  engine_.Set([](const std::string&) { return std::string("{}"); });
  int stored = 0;
  for (int round = 0; round < 5000; ++round) {
    Carry({"/v/a", "/v/b\"c", "/v/d"});
    for (const std::string& text : engine_.Asked()) {
      Json::Value request;
      if (!fromString(request, text)) continue;
      ASSERT_THAT(request.getMemberNames(), ElementsAre("compound")) << text;
      for (const Json::Value& element : request["compound"]) {
        ASSERT_THAT(element.getMemberNames(), ElementsAre("command", "data")) << text;
        ASSERT_EQ(element["command"], "document_upsert_by_id") << text;
        ASSERT_THAT(element["data"].getMemberNames(), ElementsAre("data", "doc_id", "id")) << text;
        ASSERT_EQ(element["data"]["id"], "fileindex_photo") << text;
        ASSERT_EQ(element["data"]["doc_id"].asString().substr(0, 3), "/v/") << text;
        ASSERT_NE(element["data"]["doc_id"], "/v/x") << text;
        ASSERT_TRUE(element["data"]["data"].isObject()) << text;
        ++stored;
      }
    }
  }
  EXPECT_GT(stored, 1000);
}

TEST_F(DocumentCarrierTest, KeepsItsConnections) {
  for (int i = 0; i < 5; ++i) EXPECT_THAT(Carry({"/v/a"}), ElementsAre(true));
  EXPECT_EQ(extractor_.ConnectionCount(), 1U);
  EXPECT_EQ(engine_.ConnectionCount(), 1U);
}

TEST(DocumentCarrierAloneTest, NothingIsDoneWhereNobodyListens) {
  const test::TempDir dir;
  DocumentCarrier carrier({dir / "x", dir / "e"});
  EXPECT_THAT(carrier.Carry("i", {{"/v/a", true}}, Always), ElementsAre(false));
  const Peer extractor(dir / "x");
  EXPECT_THAT(carrier.Carry("i", {{"/v/a", true}}, Always), ElementsAre(false));
}

}  // namespace
}  // namespace quarry::fileindexd
