// An index that has seen many changes, compared with one that is made anew of the same documents:
// whatever order things came in must not show.

#include <map>
#include <random>
#include <set>

#include "common/json.h"
#include "daemons/tarnelasticd/index_files.h"
#include "daemons/tarnelasticd/terms.h"
#include "tests/daemons/tarnelasticd/support/engine_fixture.h"
#include "tests/daemons/tarnelasticd/support/fault_disk.h"

namespace quarry::engine {
namespace {

using Documents = std::map<std::string, Json::Value>;

// Few, so that most are shared, of which one fills a row of texts by itself.
std::vector<std::string> Texts() {
  std::string large;
  std::string middling;
  for (int i = 0; i < 20000; ++i) large += "sea" + std::to_string(i % 4999) + ' ';
  for (int i = 0; i < 3000; ++i) middling += "isle" + std::to_string(i) + ' ';
  return {"",    "one",   "one two", "two", "three one harbour", "four one one one two",
          large, middling};
}

class IndexRemadeTest : public EngineTest, public testing::WithParamInterface<unsigned> {
 protected:
  IndexRemadeTest() {
    options_.writer.commit_age = std::chrono::hours(1);
    options_.writer.flush_bytes = std::size_t{64} << 10;
    options_.writer.list_bytes = std::size_t{128} << 10;
    Restart();
    Create();
  }
  ~IndexRemadeTest() override { engine_.reset(); }

  std::size_t Number(std::size_t below) {
    return std::uniform_int_distribution<std::size_t>(0, below - 1)(random_);
  }
  const std::string& OneOf(const std::vector<std::string>& all) { return all[Number(all.size())]; }
  std::string Path() {
    static const std::vector<std::string> kFolders = {"/s/",  "/s/a/",    "/s/a!/", "/s/a0/",
                                                      "/s//", "/s/\xFF/", "/",      "/s/a/b/"};
    static const std::vector<std::string> kNames = {"one", "two.txt", "\xFF\xFE", "\x80.txt", "a"};
    return OneOf(kFolders) + OneOf(kNames);
  }
  Json::Value Data(const std::string& path) {
    Json::Value data;
    data["id"] = "a";
    data["doc_id"] = path;
    return data;
  }

  void Store() {
    const std::string path = Path();
    Json::Value document = FileDocument(path, OneOf(texts_));
    if (Number(3) == 0) document["TARNMDTitle"] = OneOf({"one", "harbour two", "five"});
    if (Number(6) == 0) document["TARNMDParent"] = OneOf({"/s", "/", "", "/s/a/"});
    if (Number(4) == 0) document["Remark"] = OneOf({"six one", "seven"});
    Upsert(document);
    now_[path] = document;
  }
  void Set() {
    Json::Value data = Data(Path());
    switch (Number(4)) {
      case 0:
        data["data"]["TARNMDTextContent"] = OneOf(texts_);
        break;
      case 1:
        data["data"]["TARNMDTextContent"] = Json::Value();
        break;
      default:
        data["data"]["TARNMDPath"] = Path();
    }
    if (Number(3) == 0) data["data"]["TARNMDTitle"] = "two";
    Ask("document_set_by_id", data);
    const auto found = now_.find(data["doc_id"].asString());
    if (found == now_.end()) return;
    Json::Value document = found->second;
    now_.erase(found);
    for (const std::string& name : data["data"].getMemberNames()) {
      document[name] = data["data"][name];
      if (document[name].isNull()) document.removeMember(name);
    }
    if (document["TARNMDTextContent"].asString().empty()) {
      document.removeMember("TARNMDTextContent");
    }
    now_[document["TARNMDPath"].asString()] = document;
  }
  void Delete() {
    const std::string path = Path();
    Ask("document_del_by_id", Data(path));
    now_.erase(path);
  }
  void DeleteSome() {
    const std::string folder = OneOf({"/s/a", "/s", "/s/\xFF", "/"});
    const bool by_parent = Number(2) == 0;
    const std::size_t limit = Number(6);
    Json::Value data = Data("");
    data["query"]["limit"] = Json::UInt64{limit};
    Json::Value& qsl = data["query"]["qsl"];
    (by_parent ? qsl["term"]["TARNMDParent"] : qsl["prefix"]["TARNMDPath"]) = folder;
    std::size_t deleted = 0;
    for (auto document = now_.begin(); document != now_.end() && deleted < limit;) {
      const bool is_meant = by_parent ? document->second["TARNMDParent"].asString() == folder
                                      : document->first.rfind(folder, 0) == 0;
      if (is_meant) ++deleted;
      document = is_meant ? now_.erase(document) : std::next(document);
    }
    EXPECT_EQ(Ask("document_del_by_query", data)["deleted"].asUInt64(), deleted);
  }
  void CommitAll() {
    Commit();
    committed_ = now_;
  }
  // The disk is full for once: all that was not committed is gone.
  void RollBack() {
    Store();
    disk_.SetRoom(0);
    Json::Value data;
    data["id"] = "a";
    ASSERT_EQ(AskError("commit", data), kDiskFull);
    disk_.SetUnlimitedRoom();
    now_ = committed_;
  }
  void Remap() {
    Json::Value create = CreateRequest("a", DirectoryOf("a"))["data"];
    if (Number(2) == 0) create["mappings"]["properties"]["Unused"]["type"] = "text";
    Ask("index_create", create);
    CommitAll();
  }
  static Json::Value TermsRequest() {
    Json::Value data;
    data["db_name"] = "a";
    data["doc_id_field"] = "TARNMDPath";
    return MakeRequest("update_term_suggestion", data);
  }
  void CollectTerms() {
    ASSERT_TRUE(engine_->Handle(TermsRequest())["success"].asBool());
    CommitAll();
  }
  void Change() {
    const std::size_t kind = Number(200);
    if (kind < 90) return Store();
    if (kind < 140) return Set();
    if (kind < 175) return Delete();
    if (kind < 180) return DeleteSome();
    if (kind < 192) return CommitAll();
    if (kind < 195) return RollBack();
    if (kind < 196) return Remap();
    if (kind < 198) return CollectTerms();
    Restart();
    committed_ = now_;
  }

  static std::vector<std::string> Listing(Engine* engine) {
    Json::Value data;
    data["id"] = "a";
    data["query"]["qsl"]["prefix"]["TARNMDPath"] = "/";
    for (const char* field : {"TARNMDPath", "TARNMDParent", "TARNMDTitle", "TARNMDTextContent",
                              "TARNMDFSName", "TARNMDFSSize", "Remark", "QuarryAttributeStamp"}) {
      data["query"]["load_field"].append(field);
    }
    const Json::Value response = engine->Handle(MakeRequest("document_get_by_query", data));
    std::vector<std::string> documents;
    for (const Json::Value& document : response["data"]) documents.push_back(toString(document));
    return documents;
  }
  // What a search finds, without the order of those of equal score.
  static std::map<std::string, std::string> Hits(Engine* engine, const std::string& query) {
    Json::Value data;
    data["query"] = query;
    data["limit"] = 1000;
    data["highlight"]["length"] = 60;
    const Json::Value response = engine->Handle(MakeRequest("search", data));
    std::map<std::string, std::string> hits{{"total", toString(response["data"]["total"])}};
    for (const Json::Value& hit : response["data"]["hits"]) {
      hits[hit["path"].asString()] = toString(hit);
    }
    return hits;
  }
  static std::vector<std::string> TermsIn(const std::string& directory) {
    Database db(DatabasePath(directory));
    std::vector<std::string> terms;
    for (const Term& term : TermsThatBegin(&db, "", 1000000)) {
      terms.push_back(term.text + ' ' + std::to_string(term.documents));
    }
    return terms;
  }
  void Compare() {
    test::TempDir other;
    EngineOptions options;
    options.registry_path = other / "engine/indexes.json";
    Engine anew(options);
    anew.Handle(CreateRequest("a", other / "index/a"));
    for (const auto& [path, document] : now_) anew.Handle(UpsertRequest("a", document));
    ASSERT_EQ(Listing(engine_.get()), Listing(&anew));
    anew.Handle(TermsRequest());
    anew.CommitAll();
    CollectTerms();
    ASSERT_EQ(TermsIn(DirectoryOf("a")), TermsIn(other / "index/a"));
    for (const char* query : {"one", "two", "one two", "\"one one\"", "harbour", "sea7", "isle2*",
                              "three OR five", "-one", "name:txt", "six", "in:/s/a one"}) {
      ASSERT_EQ(Hits(engine_.get(), query), Hits(&anew, query)) << query;
    }
  }
  void ExpectNothingLeft() {
    Database db(DatabasePath(DirectoryOf("a")));
    // Titles are full text as well.
    std::set<std::pair<std::string, std::string>> texts;
    for (const auto& [path, document] : now_) {
      texts.emplace(document["TARNMDTitle"].asString(), document["TARNMDTextContent"].asString());
    }
    texts.erase({"", ""});
    for (const char* table : {"text_hashes", "body_docsize"}) {
      Statement count = db.Prepare(std::string("SELECT count(*) FROM ") + table);
      ASSERT_TRUE(count.Step());
      EXPECT_EQ(count.Int(0), static_cast<std::int64_t>(texts.size())) << table;
    }
  }

  const std::vector<std::string> texts_ = Texts();
  std::mt19937 random_{GetParam()};
  FaultDisk disk_;
  Documents now_;
  Documents committed_;
};

TEST_P(IndexRemadeTest, NothingTellsThemApart) {
  for (int round = 0; round < 6; ++round) {
    for (int i = 0; i < 150; ++i) ASSERT_NO_FATAL_FAILURE(Change());
    ASSERT_NO_FATAL_FAILURE(Compare()) << round << " (seed " << GetParam() << ")";
    ASSERT_NO_FATAL_FAILURE(ExpectNothingLeft());
  }
}

INSTANTIATE_TEST_SUITE_P(Seeds, IndexRemadeTest, testing::Range(1U, 5U));

}  // namespace
}  // namespace quarry::engine
