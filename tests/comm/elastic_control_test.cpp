#include "comm/elastic_control.h"

#include <gmock/gmock.h>

#include <stdexcept>

#include "common/error.h"
#include "common/json.h"
#include "common/paths.h"
#include "fileindex/config/status_mgr.h"
#include "tests/fake_platform/fixture.h"
#include "tests/support/files.h"
#include "tests/support/thrown.h"

namespace quarry::fileindex::elastic {
namespace {

using test::Thrown;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

Json::Value Parse(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

class ElasticControlTest : public fake::FakePlatformTest {
 protected:
  ElasticControlTest() {
    test::WriteFile(RootedPath("/var/run/tarnelasticd.sock"), "");
    fake::AddShare("photo", "/volume1/photo");
  }

  static void Reply(const std::string& text) { fake::QueueReply(text); }

  // Expects that exactly this was sent, whatever the order of members.
  static void ExpectSent(const std::string& request) {
    ASSERT_THAT(fake::JsonRequests(), SizeIs(1));
    EXPECT_EQ(fake::JsonRequests().front(), Parse(request)) << fake::Requests().front();
    fake::ClearRequests();
  }
};

constexpr char kRefusal[] = R"({"success":false,"error":{"code":1310,"msg":"no"}})";

// ---- Names and built-in texts

TEST_F(ElasticControlTest, Constants) {
  EXPECT_STREQ(kFieldPath, "TARNMDPath");
  EXPECT_STREQ(kFieldParent, "TARNMDParent");
  EXPECT_STREQ(kFieldFSName, "TARNMDFSName");
  EXPECT_STREQ(kFieldSearchFileName, "TARNMDSearchFileName");
  EXPECT_STREQ(kFieldDisplayName, "TARNMDDisplayName");
  EXPECT_STREQ(kFieldKind, "TARNMDKind");
  EXPECT_STREQ(kFieldExtension, "TARNMDExtension");
  EXPECT_STREQ(kOptionNeedMeta, "need_meta");
  EXPECT_STREQ(kContentExtractDaemon, "tarncontentextractd");
  EXPECT_EQ(kContentExtractPidPath, RootedPath("/var/run/tarncontentextractd.pid"));
  EXPECT_EQ(kContentExtractShmPath, RootedPath("/tmp/tarnce_shm"));
}

TEST_F(ElasticControlTest, IndexIdKeepsTheName) {
  EXPECT_EQ(GetFileIndexID("photo"), "fileindex_photo");
  EXPECT_EQ(GetFileIndexID("My Fötos \"1\""), "fileindex_My Fötos \"1\"");
  EXPECT_EQ(GetFileIndexID(""), "fileindex_");
}

TEST_F(ElasticControlTest, SettingsAreAnEmptyObject) {
  EXPECT_EQ(toString(GetFileIndexSettings()), "{}");
}

TEST_F(ElasticControlTest, EventHandler) {
  EXPECT_EQ(toString(GetFileIndexEventHandler()),
            R"({"lib_path":"/var/packages/Quarry/target/handler/fileindex_event_handler.so"})");
}

// ---- Commands on whole indexes

TEST_F(ElasticControlTest, Create) {
  fake::SetIndexPath("/volume1/photo", "/index/of photo");
  ShareIndexCreate("photo");
  ASSERT_THAT(fake::JsonRequests(), SizeIs(1));
  const Json::Value request = fake::JsonRequests().front();
  EXPECT_THAT(request.getMemberNames(), ElementsAre("command", "data"));
  EXPECT_EQ(request["command"], Json::Value("index_create"));
  EXPECT_THAT(request["data"].getMemberNames(),
              ElementsAre("event_handler", "id", "mappings", "path", "settings"));
  EXPECT_EQ(request["data"]["id"], Json::Value("fileindex_photo"));
  EXPECT_EQ(request["data"]["path"], Json::Value("/index/of photo"));
  EXPECT_EQ(toString(request["data"]["settings"]), "{}");
  EXPECT_EQ(request["data"]["mappings"], GetFileIndexMappings());
  EXPECT_EQ(request["data"]["event_handler"], GetFileIndexEventHandler());
}

TEST_F(ElasticControlTest, CreateForAnUnknownShareSendsNothing) {
  EXPECT_EQ(Thrown([] { ShareIndexCreate("nobody"); }).code(), 800);
  EXPECT_THAT(fake::Requests(), IsEmpty());
}

TEST_F(ElasticControlTest, CreateWithoutAnIndexPathSendsNothing) {
  fake::FailCall("FILEIDXDBPathCompose");
  const Error error = Thrown([] { ShareIndexCreate("photo"); });
  EXPECT_EQ(error.code(), 502);
  EXPECT_EQ(error.reason(), "FILEIDXDBPathCompose failed, share=photo");
  EXPECT_THAT(fake::Requests(), IsEmpty());
}

TEST_F(ElasticControlTest, DeletePauseResume) {
  ShareIndexDelete("any");
  ExpectSent(R"({"command":"index_delete","data":{"id":"fileindex_any"}})");
  ShareIndexPause("any");
  ExpectSent(R"({"command":"index_pause","data":{"id":"fileindex_any"}})");
  ShareIndexResume("any");
  ExpectSent(R"({"command":"index_resume","data":{"id":"fileindex_any"}})");
}

TEST_F(ElasticControlTest, RenameAndMigrate) {
  ShareIndexRename("old", "new", "/db/new");
  ExpectSent(R"({"command":"index_config_set","data":{"id":"fileindex_old",)"
             R"("data":{"id":"fileindex_new","path":"/db/new"}}})");
  ShareIndexMigrate("photo", "/volume2/db");
  ExpectSent(R"({"command":"index_config_set","data":{"id":"fileindex_photo",)"
             R"("data":{"path":"/volume2/db"}}})");
}

// ---- Commands on documents

TEST_F(ElasticControlTest, DeleteOneDocument) {
  IndexDel("photo", "/volume1/photo/a \"b\"");
  ExpectSent(R"({"command":"document_del_by_id",)"
             R"("data":{"id":"fileindex_photo","doc_id":"/volume1/photo/a \"b\""}})");
}

TEST_F(ElasticControlTest, DeleteBelowADirectoryNamesOnlyWhatIsInIt) {
  IndexDelDir("photo", "/volume1/a");
  ExpectSent(R"({"command":"document_del_by_query","data":{"id":"fileindex_photo",)"
             R"("query":{"qsl":{"prefix":{"TARNMDPath":"/volume1/a/"}}}}})");
}

TEST_F(ElasticControlTest, UpsertSendsTheWholeDocument) {
  for (const bool need_meta : {true, false}) {
    Json::Value asked;
    fake::OnParseFile([&](const std::string& path, const Json::Value& options) {
      asked = options;
      Json::Value document;
      document["TARNMDPath"] = path;
      document["TARNMDFSName"] = "Ä.TXT";
      document["TARNMDTextContent"] = "words";
      return document;
    });
    IndexUpsert("photo", "/volume1/photo/Ä.TXT", need_meta);
    EXPECT_EQ(toString(asked), need_meta ? R"({"need_meta":true})" : R"({"need_meta":false})");
    ExpectSent(
        R"({"command":"document_upsert_by_id","data":{"id":"fileindex_photo",)"
        R"("doc_id":"/volume1/photo/Ä.TXT","data":{"TARNMDPath":"/volume1/photo/Ä.TXT",)"
        R"("TARNMDFSName":"Ä.TXT","TARNMDSearchFileName":"Ä.TXT","TARNMDTextContent":"words"}}})");
  }
}

TEST_F(ElasticControlTest, AttrAsksForNoContent) {
  Json::Value asked;
  fake::OnParseFile([&](const std::string&, const Json::Value& options) {
    asked = options;
    return Parse(R"({"TARNMDFSName":"n","TARNMDFSSize":3,"TARNMDSearchFileName":"other"})");
  });
  IndexAttr("photo", "/p");
  EXPECT_EQ(toString(asked), R"({"need_meta":false})");
  ExpectSent(R"({"command":"document_set_by_id","data":{"id":"fileindex_photo","doc_id":"/p",)"
             R"("data":{"TARNMDFSName":"n","TARNMDFSSize":3,"TARNMDSearchFileName":"n"}}})");
}

TEST_F(ElasticControlTest, WhateverTheExtractorThrowsIsAParseFailure) {
  const auto expect_failure = [] {
    for (const bool attr : {true, false}) {
      const Error error = Thrown([&] {
        if (attr) {
          IndexAttr("photo", "/x/y");
        } else {
          IndexUpsert("photo", "/x/y", true);
        }
      });
      EXPECT_EQ(error.code(), 914);
      EXPECT_EQ(error.reason(), "Parse failed, path=/x/y");
    }
  };
  using Path = const std::string&;
  using Options = const Json::Value&;
  fake::OnParseFile([](Path, Options) -> Json::Value { throw std::runtime_error("gone"); });
  expect_failure();
  fake::OnParseFile([](Path, Options) -> Json::Value { throw Error(1, "x"); });
  expect_failure();
  fake::OnParseFile([](Path, Options) -> Json::Value { throw 7; });
  expect_failure();
  fake::OnParseFile([](Path, Options) { return Json::Value("text"); });
  expect_failure();
  EXPECT_THAT(fake::Requests(), IsEmpty());
  EXPECT_THAT(fake::Logs(), IsEmpty());
}

TEST_F(ElasticControlTest, TheEnginesErrorsPassThrough) {
  const auto expect_refusal = [](const std::function<void()>& call) {
    fake::QueueReply(std::string(kRefusal));
    const Error error = Thrown(call);
    EXPECT_EQ(error.code(), 1310);
    EXPECT_EQ(error.reason(), "Request failed, msg=no");
  };
  expect_refusal([] { ShareIndexCreate("photo"); });
  expect_refusal([] { ShareIndexDelete("photo"); });
  expect_refusal([] { ShareIndexPause("photo"); });
  expect_refusal([] { ShareIndexResume("photo"); });
  expect_refusal([] { ShareIndexRename("photo", "b", "/c"); });
  expect_refusal([] { ShareIndexMigrate("photo", "/c"); });
  expect_refusal([] { IndexDel("photo", "/c"); });
  expect_refusal([] { IndexDelDir("photo", "/c"); });
  expect_refusal([] { IndexUpsert("photo", "/c", false); });
  expect_refusal([] { IndexAttr("photo", "/c"); });
  expect_refusal([] { IndexRename("photo", "/c", "/d"); });
  expect_refusal([] { IndexCommit("photo"); });
  expect_refusal([] { UpdateTermSuggestion("db", {"x"}); });
  std::vector<std::string> out;
  expect_refusal([&] { IndexGetByPrefixPath("id", "/c", out); });
}

// ---- Renaming

constexpr char kRenameOfDir[] =
    R"({"command":"document_set_by_id","data":{"id":"fileindex_photo","doc_id":"/v/photo/old",)"
    R"("data":{"TARNMDPath":"/v/photo/new.D","TARNMDParent":"/v/photo","TARNMDFSName":"new.D",)"
    R"("TARNMDSearchFileName":"new.D","TARNMDDisplayName":"new.D","TARNMDKind":"d",)"
    R"("TARNMDExtension":"d"}}})";

constexpr char kQueryOfDir[] =
    R"({"command":"document_get_by_query","data":{"id":"fileindex_photo","query":{)"
    R"("qsl":{"prefix":{"TARNMDPath":"/v/photo/old/"}},)"
    R"("load_field":["TARNMDPath","TARNMDFSName","TARNMDParent"]}}})";

TEST_F(ElasticControlTest, RenameWithNothingBelowStillSendsItsBatch) {
  Reply(R"({"success":true})");
  Reply(R"({"success":true,"data":[]})");
  IndexRename("photo", "/v/photo/new.D", "/v/photo/old");
  EXPECT_THAT(fake::JsonRequests(),
              ElementsAre(Parse(kRenameOfDir), Parse(kQueryOfDir), Parse(R"({"compound":[]})")));
}

TEST_F(ElasticControlTest, RenameMovesWhatIsBelow) {
  Reply(R"({"success":true})");
  Reply(R"({"success":true,"data":[)"
        R"({"TARNMDPath":"/v/photo/old/a","TARNMDFSName":"a","TARNMDParent":"/v/photo/old"},)"
        R"({"TARNMDPath":"/v/photo/old/a/old/b.X","TARNMDFSName":"b.X",)"
        R"("TARNMDParent":"/v/photo/old/a/old"}]})");
  IndexRename("photo", "/v/photo/new.D", "/v/photo/old");
  ASSERT_THAT(fake::JsonRequests(), SizeIs(3));
  EXPECT_EQ(
      fake::JsonRequests()[2],
      Parse(R"({"compound":[{"command":"document_set_by_id","data":{"id":"fileindex_photo",)"
            R"("doc_id":"/v/photo/old/a","data":{"TARNMDParent":"/v/photo/new.D",)"
            R"("TARNMDPath":"/v/photo/new.D/a","TARNMDSearchFileName":"a"}}},)"
            R"({"command":"document_set_by_id","data":{"id":"fileindex_photo",)"
            R"("doc_id":"/v/photo/old/a/old/b.X","data":{"TARNMDParent":"/v/photo/new.D/a/old",)"
            R"("TARNMDPath":"/v/photo/new.D/a/old/b.X","TARNMDSearchFileName":"b.X"}}}]})"));
}

TEST_F(ElasticControlTest, RenameOfAFileWithoutExtension) {
  Reply(R"({"success":true})");
  Reply(R"({"success":true,"data":[]})");
  IndexRename("photo", "/v/photo.d/README", "/v/photo.d/x");
  const Json::Value fields = fake::JsonRequests().front()["data"]["data"];
  EXPECT_EQ(fields["TARNMDKind"], Json::Value(""));
  EXPECT_EQ(fields["TARNMDExtension"], Json::Value(""));
  EXPECT_EQ(fields["TARNMDParent"], Json::Value("/v/photo.d"));
}

TEST_F(ElasticControlTest, AStaleParentIsTakenFromThePath) {
  Reply(R"({"success":true})");
  Reply(R"({"success":true,"data":[)"
        R"({"TARNMDPath":"/v/old/s/a","TARNMDFSName":"a","TARNMDParent":"/v/older"},)"
        R"({"TARNMDPath":"/v/old/b","TARNMDFSName":"b","TARNMDParent":""}]})");
  IndexRename("photo", "/v/new", "/v/old");
  const Json::Value moves = fake::JsonRequests()[2]["compound"];
  EXPECT_EQ(moves[0]["data"]["data"]["TARNMDPath"], Json::Value("/v/new/s/a"));
  EXPECT_EQ(moves[1]["data"]["data"]["TARNMDPath"], Json::Value("/v/new/b"));
}

TEST_F(ElasticControlTest, ADocumentOfAnotherPlaceIsRefused) {
  Reply(R"({"success":true})");
  Reply(R"({"success":true,"data":[{"TARNMDPath":"/w","TARNMDFSName":"w","TARNMDParent":""}]})");
  const Error error = Thrown([] { IndexRename("photo", "/v/new", "/v/old"); });
  EXPECT_EQ(error.code(), 916);
  EXPECT_THAT(fake::Requests(), SizeIs(2));
}

constexpr char kNoArrayLine[] =
    "Failed [!res.isMember(\"data\") || !res[\"data\"].isArray()], "
    "reason: ";

TEST_F(ElasticControlTest, RenameNeedsAListOfDocuments) {
  for (const char* reply : {R"({"success":true})", R"({"success":true,"data":null})",
                            R"({"success":true,"data":{}})", R"({"success":true,"data":"x"})"}) {
    fake::ClearLogs();
    Reply(R"({"success":true})");
    Reply(reply);
    const Error error = Thrown([] { IndexRename("photo", "/a", "/b"); });
    EXPECT_EQ(error.code(), 916);
    EXPECT_EQ(error.reason(), "");
    EXPECT_THAT(fake::Logs(),
                ElementsAre(fake::LogHead("elastic_control", 253, "IndexRename") + kNoArrayLine));
  }
}

TEST_F(ElasticControlTest, RenameNeedsNameAndParentOfEachDocument) {
  const struct {
    const char* document;
    const char* reason;
  } cases[] = {
      {R"({"TARNMDPath":"/b/c","TARNMDParent":"/b"})", "Missing property: TARNMDFSName"},
      {R"({"TARNMDPath":"/b/c","TARNMDFSName":"c"})", "Missing property: TARNMDParent"},
      {R"({"TARNMDFSName":"c","TARNMDParent":"/b"})", "Missing property: TARNMDPath"},
      {R"({"TARNMDPath":"/b/c","TARNMDFSName":[],"TARNMDParent":"/b"})", "Not a string"},
      {R"("text")", "Not an object"},
      {"[]", "Not an object"},
  };
  for (const auto& one : cases) {
    fake::ClearRequests();
    Reply(R"({"success":true})");
    Reply(std::string(R"({"success":true,"data":[)") + one.document + "]}");
    const Error error = Thrown([] { IndexRename("photo", "/a", "/b"); });
    EXPECT_EQ(error.code(), 120);
    EXPECT_EQ(error.reason(), std::string(one.reason) + AppendData(Parse(one.document)));
    EXPECT_THAT(fake::Requests(), SizeIs(2)) << "no batch may be sent for " << one.document;
  }
}

TEST_F(ElasticControlTest, DocumentsThatCannotBeMovedAreLogged) {
  Reply(R"({"success":true})");
  Reply(R"({"success":true,"data":[)"
        R"({"TARNMDPath":"/b/c","TARNMDFSName":"c","TARNMDParent":"/b"}]})");
  Reply(R"({"success":true,"has_fail":true,"data":[{"success":false,)"
        R"("error":{"code":404,"msg":"none"}}]})");
  IndexRename("photo", "/a", "/b");
  ASSERT_THAT(fake::Logs(), SizeIs(1));
  EXPECT_THAT(fake::Logs().front(), ::testing::HasSubstr("Compound failed: "));
}

TEST_F(ElasticControlTest, ALargeDirectoryIsMovedInBatches) {
  constexpr int kDocuments = 9001;
  fake::OnRequest([](const Json::Value& request) -> std::optional<std::string> {
    Json::Value reply;
    reply["success"] = true;
    if (request["command"] == Json::Value("document_get_by_query")) {
      for (int i = 0; i < kDocuments; ++i) {
        Json::Value document;
        document["TARNMDFSName"] = "f" + std::to_string(i);
        document["TARNMDParent"] = "/b";
        document["TARNMDPath"] = "/b/f" + std::to_string(i);
        reply["data"].append(document);
      }
    }
    return toString(reply);
  });
  IndexRename("photo", "/a", "/b");
  int moved = 0;
  const std::vector<Json::Value> requests = fake::JsonRequests();
  for (size_t i = 2; i < requests.size(); ++i) {
    EXPECT_LE(requests[i]["compound"].size(), 4000u);
    for (const Json::Value& move : requests[i]["compound"]) {
      EXPECT_EQ(move["data"]["doc_id"].asString(), "/b/f" + std::to_string(moved++));
    }
  }
  EXPECT_EQ(moved, kDocuments);
}

// ---- Asking for paths

TEST_F(ElasticControlTest, GetByPrefixAppendsPathsInOrder) {
  Reply(R"({"success":true,"data":[{"TARNMDPath":"/v/b"},{"TARNMDPath":"/v/a"}]})");
  std::vector<std::string> out = {"kept"};
  IndexGetByPrefixPath("any id", "/v", out);
  EXPECT_THAT(out, ElementsAre("kept", "/v/b", "/v/a"));
  ExpectSent(R"({"command":"document_get_by_query","data":{"id":"any id","query":{)"
             R"("qsl":{"prefix":{"TARNMDPath":"/v/"}},"load_field":["TARNMDPath"]}}})");
}

TEST_F(ElasticControlTest, GetByPrefixNeedsAList) {
  for (const char* reply : {R"({"success":true})", R"({"success":true,"data":{"a":1}})"}) {
    fake::ClearLogs();
    Reply(reply);
    std::vector<std::string> out;
    const Error error = Thrown([&] { IndexGetByPrefixPath("id", "/v", out); });
    EXPECT_EQ(error.code(), 916);
    EXPECT_THAT(
        fake::Logs(),
        ElementsAre(fake::LogHead("elastic_control", 307, "IndexGetByPrefixPath") + kNoArrayLine));
  }
}

TEST_F(ElasticControlTest, GetByPrefixNeedsThePathOfEachDocument) {
  for (const char* document : {"{}", "7", R"({"TARNMDPath":{}})"}) {
    Reply(std::string(R"({"success":true,"data":[{"TARNMDPath":"/v/a"},)") + document + "]}");
    std::vector<std::string> out;
    EXPECT_EQ(Thrown([&] { IndexGetByPrefixPath("id", "/v", out); }).code(), 120);
    EXPECT_THAT(out, ElementsAre("/v/a"));
  }
}

// ---- Commit

TEST_F(ElasticControlTest, Commit) {
  IndexCommit("photo");
  ExpectSent(R"({"command":"commit","data":{"id":"fileindex_photo"}})");
  EXPECT_THAT(fake::CallsOf("TARNQuotaIsEnough"), IsEmpty());
}

TEST_F(ElasticControlTest, AFailedCommitWithSpaceChangesNoStatus) {
  Reply(kRefusal);
  const Error error = Thrown([] { IndexCommit("photo"); });
  EXPECT_EQ(error.code(), 1310);
  EXPECT_EQ(error.reason(), "Request failed, msg=no");
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 0);
}

TEST_F(ElasticControlTest, AFailedCommitWithoutSpaceMarksTheShare) {
  StatusMgr().SetShareStatus("photo", 2);
  for (const int out_of_space : {0x2900, 0x2400}) {
    StatusMgr().UnsetShareStatus("photo", 1);
    fake::SetQuota(false, out_of_space);
    Reply(kRefusal);
    const Error error = Thrown([] { IndexCommit("photo"); });
    EXPECT_EQ(error.code(), 1003);
    EXPECT_EQ(error.reason(), "Share (photo) space not enough");
    EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 3);
  }
}

TEST_F(ElasticControlTest, AFailingQuotaServiceIsNoLackOfSpace) {
  fake::SetQuota(false, 0x1234);
  Reply(kRefusal);
  EXPECT_EQ(Thrown([] { IndexCommit("photo"); }).code(), 1310);
  EXPECT_EQ(StatusMgr().GetShareStatus("photo"), 0);
}

TEST_F(ElasticControlTest, AFailedTransportFailsTheCommitToo) {
  fake::FailCall("SockConnection::Send");
  const Error error = Thrown([] { IndexCommit("photo"); });
  EXPECT_EQ(error.code(), 913);
  EXPECT_EQ(error.reason(), "Send failed");
}

TEST_F(ElasticControlTest, AMarkThatCannotBeKeptIsTheError) {
  test::WriteFile(kFileIndexStatusCfgPath, "not JSON");
  fake::SetQuota(false, 0x2900);
  Reply(kRefusal);
  EXPECT_EQ(Thrown([] { IndexCommit("photo"); }).code(), 504);
}

TEST_F(ElasticControlTest, AFailedCommitOfAShareThatIsGone) {
  Reply(kRefusal);
  EXPECT_EQ(Thrown([] { IndexCommit("gone"); }).code(), 800);
}

// ---- Term suggestions

TEST_F(ElasticControlTest, NoFieldsContactNoEngine) {
  UpdateTermSuggestion("db", {});
  EXPECT_THAT(fake::Calls(), IsEmpty());
}

TEST_F(ElasticControlTest, OneElementPerField) {
  UpdateTermSuggestion("db", {"/v/b", "/v/a"});
  ExpectSent(
      R"({"compound":[)"
      R"({"command":"update_term_suggestion","data":{"doc_id_field":"/v/b","db_name":"db"}},)"
      R"({"command":"update_term_suggestion","data":{"doc_id_field":"/v/a","db_name":"db"}})"
      R"(]})");
}

TEST_F(ElasticControlTest, VeryManyFieldsGoInSeveralBatches) {
  std::vector<std::string> fields;
  for (int i = 0; i < 5000; ++i) {
    fields.push_back("/v/" + std::string(4000, 'x') + std::to_string(i));
  }
  UpdateTermSuggestion("db", fields);
  std::vector<std::string> sent;
  for (const Json::Value& request : fake::JsonRequests()) {
    EXPECT_LT(toString(request).size(), std::size_t{10} << 20);
    for (const Json::Value& element : request["compound"]) {
      sent.push_back(element["data"]["doc_id_field"].asString());
    }
  }
  EXPECT_EQ(fake::JsonRequests().size(), 3u);
  EXPECT_EQ(sent, fields);
}

}  // namespace
}  // namespace quarry::fileindex::elastic
