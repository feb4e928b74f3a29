// UpdateTermSuggestion, by the whole sequence of what it asks of the engine.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <optional>
#include <string>
#include <vector>

#include "common/json.h"
#include "fileindex/index_mgr.h"
#include "tests/fileindex/operation_fixture.h"

namespace quarry::fileindex {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class TermSuggestionTest : public OperationTest {
 protected:
  TermSuggestionTest() {
    SaveList({Record("/photo/a"), Record("/music"), Record("/photo/b")});
    fake::OnRequest([this](const Json::Value& request) { return Answer(request); });
  }

  std::optional<std::string> Answer(const Json::Value& request) {
    requests_.push_back(Text(request));
    if (requests_.back() == failing_) return R"({"success":false,"error":{"msg":"no","code":777}})";
    if (request["command"] != "document_get_by_query") return R"({"success":true})";
    Json::Value reply;
    reply["success"] = true;
    reply["data"] = Json::Value(Json::arrayValue);
    for (const std::string& path : documents_) {
      Json::Value document;
      document["TARNMDPath"] = path;
      reply["data"].append(document);
    }
    return toString(reply);
  }

  // A request without what all requests have.
  static std::string Text(const Json::Value& request) {
    if (!request.isMember("compound")) {
      return request["command"].asString() + " " + toString(request["data"]);
    }
    std::string text;
    for (const Json::Value& part : request["compound"]) text += Text(part) + ";";
    return text;
  }
  std::string Query(const std::string& share) const {
    return R"(document_get_by_query {"id":"fileindex_)" + share +
           R"(","query":{"load_field":["TARNMDPath"],"qsl":{"prefix":{"TARNMDPath":")" + volume_ +
           "/" + share + R"(/"}}}})";
  }
  static std::string Suggest(const std::string& share, const std::string& path) {
    return R"(update_term_suggestion {"db_name":"fileindex_)" + share + R"(","doc_id_field":")" +
           path + "\"};";
  }
  static std::string Commit(const std::string& share) {
    return R"(commit {"id":"fileindex_)" + share + "\"}";
  }

  std::vector<std::string> documents_ = {"/one", "/two"};
  std::string failing_;
  std::vector<std::string> requests_;
};

TEST_F(TermSuggestionTest, RefreshesTheNamedIndexesInOrderOfTheirShares) {
  UpdateTermSuggestion({"fileindex_photo", "fileindex_music", "fileindex_photo"});
  EXPECT_THAT(requests_,
              ElementsAre(Query("music"), Suggest("music", "/one") + Suggest("music", "/two"),
                          Commit("music"), Query("photo"),
                          Suggest("photo", "/one") + Suggest("photo", "/two"), Commit("photo")));
}

TEST_F(TermSuggestionTest, OtherNamesArePassedOver) {
  fake::AddShare("other", volume_ + "/other");
  UpdateTermSuggestion({});
  UpdateTermSuggestion({"photo", "fileindex_other", "FILEINDEX_photo", "fileindex_phot"});
  EXPECT_THAT(requests_, IsEmpty());
}

TEST_F(TermSuggestionTest, AnEmptyIndexIsCommittedAllTheSame) {
  documents_.clear();
  UpdateTermSuggestion({"fileindex_photo"});
  EXPECT_THAT(requests_, ElementsAre(Query("photo"), Commit("photo")));
}

TEST_F(TermSuggestionTest, AFailureKeepsWhatWasDoneBefore) {
  failing_ = Query("photo");
  EXPECT_EQ(FailureOf([] {
              UpdateTermSuggestion({"fileindex_photo", "fileindex_music"});
            }),
            "777 Request failed, msg=no");
  EXPECT_EQ(requests_.size(), 4U);
  EXPECT_EQ(requests_[2], Commit("music"));
}

TEST_F(TermSuggestionTest, EachRequestThatFailsEndsIt) {
  const std::vector<std::string> requests = {
      Query("music"), Suggest("music", "/one") + Suggest("music", "/two"), Commit("music")};
  for (size_t i = 0; i < requests.size(); ++i) {
    requests_.clear();
    failing_ = requests[i];
    EXPECT_EQ(FailureOf([] {
                UpdateTermSuggestion({"fileindex_photo", "fileindex_music"});
              }),
              "777 Request failed, msg=no")
        << failing_;
    EXPECT_EQ(requests_.size(), i + 1) << failing_;
  }
}

TEST_F(TermSuggestionTest, AShareThatThePlatformDoesNotKnowFails) {
  fake::RemoveShare("photo");
  EXPECT_EQ(FailureOf([] { UpdateTermSuggestion({"fileindex_music"}); }).substr(0, 3), "800");
  EXPECT_EQ(requests_.size(), 3U);
}

TEST_F(TermSuggestionTest, AListThatCannotBeLoadedFails) {
  test::WriteFile(kFileIndexFoldersCfgPath, "[");
  EXPECT_EQ(FailureOf([] { UpdateTermSuggestion({"fileindex_music"}); }).substr(0, 3), "504");
  EXPECT_THAT(requests_, IsEmpty());
}

}  // namespace
}  // namespace quarry::fileindex
