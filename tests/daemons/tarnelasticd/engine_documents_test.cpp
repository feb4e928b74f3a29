// Storing, changing, finding and deleting documents.

#include <algorithm>
#include <cstdint>
#include <limits>

#include "common/json.h"
#include "tests/daemons/tarnelasticd/support/engine_fixture.h"

namespace quarry::engine {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class DocumentsTest : public EngineTest {
 protected:
  DocumentsTest() { Create(); }

  // As text, since a number may be of another type than it was.
  std::string GetText(const std::string& path) { return toString(Get(path)); }
  Json::Value IdData(const std::string& path) {
    Json::Value data;
    data["id"] = "a";
    data["doc_id"] = path;
    return data;
  }
  bool Delete(const std::string& path) {
    return Ask("document_del_by_id", IdData(path))["found"].asBool();
  }
  bool SetValue(const std::string& path, const Json::Value& changes) {
    Json::Value data = IdData(path);
    data["data"] = changes;
    return Ask("document_set_by_id", data)["found"].asBool();
  }
  bool Set(const std::string& path, const std::string& changes) {
    return SetValue(path, Parse(changes));
  }
  int DeleteBelow(const std::string& prefix, Json::Value more = Json::objectValue) {
    Json::Value data;
    data["id"] = "a";
    data["query"] = std::move(more);
    data["query"]["qsl"]["prefix"]["TARNMDPath"] = prefix;
    return Ask("document_del_by_query", data)["deleted"].asInt();
  }
  std::string Found(const std::string& query) {
    Json::Value data;
    data["id"] = "a";
    data["query"] = Parse(query);
    return toString(Ask("document_get_by_query", data));
  }
};

TEST_F(DocumentsTest, GivesBackEveryValueAsItCame) {
  Json::Value document = FileDocument("/s/1.txt", "some text");
  document["TARNMDFSSize"] = Json::Int64{std::numeric_limits<std::int64_t>::max()};
  document["TARNMDFSCreationDate"] = -1;
  document["TARNMDDurationSecond"] = 1.25;
  document["TARNMDAuthors"] = Parse(R"(["one author","another"])");
  document["TARNMDTitle"] = "A title";
  document["TARNMDKeywords"] = Parse(R"({"deep":[["er"]]})");
  document["TARNMDRecordingYear"] = "not a number";
  document["TARNMDAudioBitRate"] = 1.5;
  document["TARNMDIsDir"] = 0;
  document["TARNMDFSName"] = 7;
  document["TARNMDLogicalSize"] = Json::UInt64{std::numeric_limits<std::uint64_t>::max()};
  document["SomethingElse"] = Parse(R"([1,2.5,true,{"x":"y"}])");
  document["Empty"] = "";
  document["TARNMDCodecs"] = std::string("a\0b", 3);
  document["TARNMDOwnerUserID"] = std::string("c\0d", 3);
  Upsert(document);
  EXPECT_EQ(GetText("/s/1.txt"), toString(document));
  Commit();
  Restart();
  EXPECT_EQ(GetText("/s/1.txt"), toString(document));
}

TEST_F(DocumentsTest, LeavesOutWhatIsNull) {
  Json::Value document = FileDocument("/s/1.txt");
  const Json::Value without = document;
  document["TARNMDTitle"] = Json::nullValue;
  document["Other"] = Json::nullValue;
  Upsert(document);
  EXPECT_EQ(GetText("/s/1.txt"), toString(without));
}

TEST_F(DocumentsTest, TheIdentifierCountsWhateverTheDocumentSays) {
  Json::Value data = IdData("/s/real");
  data["data"]["TARNMDPath"] = "/s/claimed";
  Ask("document_upsert_by_id", data);
  data["data"]["TARNMDPath"] = Json::arrayValue;
  Ask("document_upsert_by_id", data);
  EXPECT_THAT(Below("/"), ElementsAre("/s/real"));
}

TEST_F(DocumentsTest, UpsertReplacesTheWholeDocument) {
  Json::Value document = FileDocument("/s/1.txt", "old words");
  document["TARNMDTitle"] = "gone";
  document["Unlisted"] = "vanished";
  Upsert(document);
  Add("/s/1.txt", "new words");
  EXPECT_EQ(GetText("/s/1.txt"), toString(FileDocument("/s/1.txt", "new words")));
  EXPECT_THAT(Paths("new"), ElementsAre("/s/1.txt"));
  for (const char* word : {"old", "gone", "vanished"}) EXPECT_THAT(Paths(word), IsEmpty()) << word;
  Add("/s/1.txt", "");
  EXPECT_THAT(Paths("new"), IsEmpty());
  EXPECT_EQ(Ask("engine_status", Json::objectValue)["indexes"][0U]["documents"].asInt(), 1);
}

TEST_F(DocumentsTest, SetChangesTheGivenFieldsOnly) {
  Json::Value document = FileDocument("/s/1.txt", "body words");
  document["TARNMDTitle"] = "first title";
  document["Unlisted"] = "unlisted";
  Upsert(document);
  EXPECT_TRUE(Set("/s/1.txt", R"({"TARNMDTitle":"second heading","TARNMDFSSize":5,"Unlisted":null,
                                  "Another":"another"})"));
  Commit();
  document["TARNMDTitle"] = "second heading";
  document["TARNMDFSSize"] = 5;
  document["Another"] = "another";
  document.removeMember("Unlisted");
  EXPECT_EQ(GetText("/s/1.txt"), toString(document));
  for (const char* word : {"heading", "body", "another"}) {
    EXPECT_THAT(Paths(word), ElementsAre("/s/1.txt")) << word;
  }
  for (const char* word : {"first", "unlisted"}) EXPECT_THAT(Paths(word), IsEmpty()) << word;
}

TEST_F(DocumentsTest, SetTurnsListsIntoTextAndBack) {
  Json::Value document = FileDocument("/s/1.txt");
  document["TARNMDAuthors"] = Parse(R"(["one author","another"])");
  Upsert(document);
  EXPECT_TRUE(Set("/s/1.txt", R"({"TARNMDAuthors":"nobody"})"));
  document["TARNMDAuthors"] = "nobody";
  EXPECT_EQ(GetText("/s/1.txt"), toString(document));
  EXPECT_TRUE(Set("/s/1.txt", R"({"TARNMDAuthors":null})"));
  document.removeMember("TARNMDAuthors");
  EXPECT_EQ(GetText("/s/1.txt"), toString(document));
}

TEST_F(DocumentsTest, SettingAndDeletingWhatIsMissingSucceedsWithoutEffect) {
  EXPECT_FALSE(Set("/s/none", R"({"TARNMDTitle":"x"})"));
  EXPECT_FALSE(Set("/s/none", R"({"TARNMDPath":"/s/new"})"));
  EXPECT_FALSE(Delete("/s/none"));
  EXPECT_EQ(DeleteBelow("/s/"), 0);
  EXPECT_THAT(Below("/"), IsEmpty());
  Commit();
}

TEST_F(DocumentsTest, ARenameMovesTheDocumentAndKeepsItsText) {
  Add("/s/old.txt", "alpha beta");
  EXPECT_TRUE(Set("/s/old.txt", R"({"TARNMDPath":"/t/new.pdf","TARNMDParent":"/t",
      "TARNMDFSName":"new.pdf","TARNMDSearchFileName":"new.pdf","TARNMDDisplayName":"new.pdf",
      "TARNMDExtension":"pdf","TARNMDKind":"pdf"})"));
  Commit();
  EXPECT_THAT(Below("/"), ElementsAre("/t/new.pdf"));
  EXPECT_THAT(Paths("alpha"), ElementsAre("/t/new.pdf"));
  EXPECT_THAT(Paths("new.pdf"), ElementsAre("/t/new.pdf"));
  EXPECT_THAT(Paths("ext:pdf"), ElementsAre("/t/new.pdf"));
  EXPECT_THAT(Paths("old"), IsEmpty());
  EXPECT_THAT(Paths("ext:txt"), IsEmpty());
}

TEST_F(DocumentsTest, ARenameReplacesWhatIsInItsWay) {
  Add("/s/1.txt", "alpha");
  Add("/s/2.txt", "beta");
  EXPECT_TRUE(Set("/s/1.txt", R"({"TARNMDPath":"/s/2.txt"})"));
  Commit();
  EXPECT_THAT(Below("/"), ElementsAre("/s/2.txt"));
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/2.txt"));
  EXPECT_THAT(Paths("beta"), IsEmpty());
}

TEST_F(DocumentsTest, PathsMayBeExchangedInOneTransaction) {
  Upsert(FileDocument("/s/1", "alpha"));
  Upsert(FileDocument("/s/2", "beta"));
  EXPECT_TRUE(Set("/s/1", R"({"TARNMDPath":"/s/x"})"));
  EXPECT_TRUE(Set("/s/2", R"({"TARNMDPath":"/s/1"})"));
  EXPECT_TRUE(Set("/s/x", R"({"TARNMDPath":"/s/2"})"));
  Commit();
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/2"));
  EXPECT_THAT(Paths("beta"), ElementsAre("/s/1"));
}

TEST_F(DocumentsTest, DeletesWhatLiesBelowAndNothingBeside) {
  for (const char* path : {"/v/a", "/v/a/1", "/v/a/b/2", "/v/a0", "/v/a.b", "/v/ab", "/v/A/1"}) {
    Upsert(FileDocument(path, "word"));
  }
  EXPECT_EQ(DeleteBelow("/v/a/"), 2);
  Commit();
  EXPECT_THAT(Below("/"), ElementsAre("/v/A/1", "/v/a", "/v/a.b", "/v/a0", "/v/ab"));
  EXPECT_EQ(Paths("word").size(), 5U);
  EXPECT_TRUE(Delete("/v/a"));
  EXPECT_FALSE(Delete("/v/a"));
}

TEST_F(DocumentsTest, DeletesMoreThanOneChunk) {
  for (int i = 0; i < 1203; ++i) Upsert(FileDocument("/s/d/" + std::to_string(i)));
  Upsert(FileDocument("/s/kept"));
  EXPECT_EQ(DeleteBelow("/s/d/", Parse(R"({"limit":3})")), 3);
  EXPECT_EQ(DeleteBelow("/s/d/", Parse(R"({"limit":0})")), 0);
  EXPECT_EQ(DeleteBelow("/s/d/"), 1200);
  EXPECT_THAT(Below("/"), ElementsAre("/s/kept"));
}

TEST_F(DocumentsTest, WildcardsInPathsAreOrdinaryBytes) {
  for (const char* path : {"/s/%/1", "/s/_/1", "/s/*/1", "/s/x/1"}) Upsert(FileDocument(path));
  EXPECT_EQ(DeleteBelow("/s/%/"), 1);
  EXPECT_EQ(DeleteBelow("/s/_/"), 1);
  EXPECT_EQ(DeleteBelow("/s/*/"), 1);
  EXPECT_THAT(Below("/"), ElementsAre("/s/x/1"));
}

TEST_F(DocumentsTest, PathsAreBytesAndArriveIntact) {
  const std::vector<std::string> paths = {
      "/s/\x80\xFF/caf\xE9.txt", "/s/\xC3\x28", "/s/\xED\xA0\x80",
      "/s/a\nb\x01\x7F\"\\'",    "/s/\xFF",     "/s/\xFF\xFF/x"};
  for (const std::string& path : paths) Add(path, "word");
  std::vector<std::string> sorted = paths;
  std::sort(sorted.begin(), sorted.end());
  EXPECT_EQ(Below("/"), sorted);
  EXPECT_EQ(Paths("word", Parse(R"({"sort":"path"})")), sorted);
  for (const std::string& path : paths)
    EXPECT_EQ(GetText(path), toString(FileDocument(path, "word")));
  EXPECT_EQ(DeleteBelow("/s/\xFF\xFF/"), 1);
  EXPECT_EQ(DeleteBelow("/s/\xFF"), 1);
  EXPECT_THAT(Paths("name:caf\xE9.txt"), ElementsAre(paths[0]));
  Json::Value changes;
  changes["TARNMDPath"] = "/s/\xFE\xFE";
  EXPECT_TRUE(SetValue(paths[0], changes));
  EXPECT_EQ(Get("/s/\xFE\xFE")["TARNMDPath"].asString(), "/s/\xFE\xFE");
  // The same as text over the socket.
  Json::Value data = IdData("/s/\xFE\xFE");
  EXPECT_EQ(Parse(engine_->HandleText(toString(MakeRequest("document_del_by_id", data)))),
            Parse(R"({"success":true,"data":{"found":true}})"));
}

TEST_F(DocumentsTest, LoadsTheFieldsThatAreAskedFor) {
  Json::Value document = FileDocument("/s/1.txt", "some text");
  document["Unlisted"] = "x";
  Upsert(document);
  EXPECT_EQ(Found(R"({"qsl":{"prefix":{"TARNMDPath":"/s/"}},"load_field":["TARNMDPath"]})"),
            R"([{"TARNMDPath":"/s/1.txt"}])");
  EXPECT_EQ(Found(R"({"qsl":{"term":{"TARNMDPath":"/s/1.txt"}},
                "load_field":["TARNMDTextContent","Unlisted","TARNMDFSSize","TARNMDTitle"]})"),
            R"([{"TARNMDFSSize":9,"TARNMDTextContent":"some text","Unlisted":"x"}])");
  EXPECT_EQ(Found(R"({"qsl":{"term":{"TARNMDPath":"/s/1.txt"}},"load_field":[]})"), "[{}]");
  document.removeMember("TARNMDTextContent");
  EXPECT_EQ(Found(R"({"qsl":{"term":{"TARNMDPath":"/s/1.txt"}}})"), "[" + toString(document) + "]");
}

TEST_F(DocumentsTest, ListsAFolderInPages) {
  for (const char* path : {"/s/d", "/s/d/1", "/s/d/2", "/s/d/3", "/s/d/3/x", "/s/e/1"}) {
    Upsert(FileDocument(path));
  }
  const auto page = [this](const std::string& rest) {
    return Found(R"({"qsl":{"term":{"TARNMDParent":"/s/d"}},"load_field":["TARNMDPath"])" + rest +
                 "}");
  };
  EXPECT_EQ(page(R"(,"limit":2)"), R"([{"TARNMDPath":"/s/d/1"},{"TARNMDPath":"/s/d/2"}])");
  EXPECT_EQ(page(R"(,"limit":2,"after":"/s/d/2")"), R"([{"TARNMDPath":"/s/d/3"}])");
  EXPECT_EQ(page(R"(,"limit":2,"after":"/s/d/3")"), "[]");
  EXPECT_EQ(page(R"(,"limit":0)"), "[]");
  EXPECT_EQ(page(R"(,"after":"")").size(), page("").size());
}

TEST_F(DocumentsTest, NeverGivesMoreTextAtOnceThanFitsInMemory) {
  const std::string text(std::size_t{24} << 20, 'x');
  for (const char* path : {"/s/1", "/s/2", "/s/3"}) Upsert(FileDocument(path, text));
  Json::Value data;
  data["id"] = "a";
  data["query"]["qsl"]["prefix"]["TARNMDPath"] = "/s/";
  data["query"]["load_field"].append("TARNMDTextContent");
  EXPECT_EQ(AskError("document_get_by_query", data), 1402);
  data["query"]["limit"] = 2;
  EXPECT_EQ(Ask("document_get_by_query", data).size(), 2U);
}

TEST_F(DocumentsTest, QuestionsSeeWhatIsNotCommittedAndSearchesDoNot) {
  Upsert(FileDocument("/s/1.txt", "alpha"));
  EXPECT_THAT(Below("/"), ElementsAre("/s/1.txt"));
  EXPECT_THAT(Paths("alpha"), IsEmpty());
  Commit();
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1.txt"));
  EXPECT_TRUE(Delete("/s/1.txt"));
  EXPECT_THAT(Below("/"), IsEmpty());
  EXPECT_THAT(Paths("alpha"), ElementsAre("/s/1.txt"));
}

TEST_F(DocumentsTest, BookkeepingIsKeptButNotFound) {
  Add("/s/1.txt");
  EXPECT_EQ(Get("/s/1.txt")["QuarryAttributeStamp"].asString(), "1:2:3");
  EXPECT_THAT(Paths("\"1 2 3\""), IsEmpty());
}

TEST_F(DocumentsTest, FieldsOutsideTheDefaultSearchAreNotFound) {
  Json::Value document = FileDocument("/s/1.txt");
  document["TARNMDPrivilege"] = "keepsake";
  document["TARNMDIdentifier"] = "keepsake";
  document["TARNMDTitle"] = "headline";
  document["_TARNMDUserTags"] = "tagged";
  document["NotListed"] = "incidental";
  Upsert(document);
  Commit();
  EXPECT_THAT(Paths("keepsake"), IsEmpty());
  for (const char* word : {"headline", "tagged", "incidental"}) {
    EXPECT_THAT(Paths(word), ElementsAre("/s/1.txt")) << word;
  }
}

TEST_F(DocumentsTest, AnIndexWithoutMappingsWorks) {
  Json::Value data = CreateRequest("plain", DirectoryOf("plain"))["data"];
  data.removeMember("mappings");
  Ask("index_create", data);
  Add("/s/1.txt", "alpha beta", "plain");
  EXPECT_THAT(Paths("beta"), ElementsAre("/s/1.txt"));
  EXPECT_THAT(Paths("1.txt"), ElementsAre("/s/1.txt"));
  EXPECT_THAT(Paths("type:document"), IsEmpty());
}

}  // namespace
}  // namespace quarry::engine
