// Selections by path, prefix and parent, compared with a look at every document.

#include "daemons/tarnelasticd/selection.h"

#include <algorithm>
#include <map>
#include <optional>
#include <random>

#include "tests/daemons/tarnelasticd/support/engine_fixture.h"

namespace quarry::engine {
namespace {

TEST(IsChildTest, IsOnePartBelow) {
  EXPECT_TRUE(IsChild("/a", "/a/b"));
  EXPECT_TRUE(IsChild("/", "/a"));
  EXPECT_TRUE(IsChild("/a/", "/a//b"));
  EXPECT_TRUE(IsChild("a", "a/b"));
  EXPECT_FALSE(IsChild("/a", "/a"));
  EXPECT_FALSE(IsChild("/a", "/ab"));
  EXPECT_FALSE(IsChild("/a", "/a/b/c"));
  EXPECT_FALSE(IsChild("/", "//a"));
  EXPECT_FALSE(IsChild("", "/a"));
  EXPECT_FALSE(IsChild("", "a"));
}

class SelectionTest : public EngineTest, public testing::WithParamInterface<unsigned> {
 protected:
  SelectionTest() { Create(); }

  std::size_t Number(std::size_t below) {
    return std::uniform_int_distribution<std::size_t>(0, below - 1)(random_);
  }
  // Bytes around the "/" in the order of paths, and paths that no file system gives.
  std::string Path() {
    static const std::vector<std::string> kParts = {"/a",  "/b",    "/a-", "/a.b",
                                                    "/a0", "/\xFF", "/",   "/a"};
    std::string path = Number(20) == 0 ? "a" : "";
    for (std::size_t left = 1 + Number(4); left > 0; --left) path += kParts[Number(kParts.size())];
    return path;
  }
  Json::Value ParentOf(const std::string& path) {
    if (Number(8) == 0) return Json::Value();
    if (Number(5) == 0) return Path();
    if (Number(12) == 0) return Json::Value(7);
    const std::string parent = path.substr(0, path.rfind('/'));
    return parent.empty() ? "/" : parent;
  }
  void Change() {
    const std::string path = Path();
    Json::Value data;
    data["id"] = "a";
    data["doc_id"] = path;
    if (Number(4) == 0) {
      Ask("document_del_by_id", data);
      parents_.erase(path);
      return;
    }
    Json::Value document;
    document["TARNMDPath"] = path;
    document["TARNMDParent"] = ParentOf(path);
    document["TARNMDFSSize"] = Json::UInt64{path.size()};
    document["Unlisted"] = path;
    Upsert(document);
    parents_[path] = document["TARNMDParent"];
  }

  bool IsMeant(const std::string& kind, const std::string& value, const std::string& path) {
    if (kind == "prefix") return path.rfind(value, 0) == 0;
    if (kind == "path") return path == value;
    return parents_[path].isString() && parents_[path].asString() == value;
  }
  void Compare(const std::string& kind, const std::string& value,
               const std::optional<std::string>& after, const std::optional<std::size_t>& limit) {
    std::vector<std::string> expected;
    for (const auto& [path, parent] : parents_) {
      if (IsMeant(kind, value, path) && (!after || path > *after)) expected.push_back(path);
    }
    if (limit && expected.size() > *limit) expected.resize(*limit);
    Json::Value data;
    data["id"] = "a";
    Json::Value& query = data["query"];
    if (kind == "prefix") query["qsl"]["prefix"]["TARNMDPath"] = value;
    if (kind == "path") query["qsl"]["term"]["TARNMDPath"] = value;
    if (kind == "parent") query["qsl"]["term"]["TARNMDParent"] = value;
    if (after) query["after"] = *after;
    if (limit) query["limit"] = Json::UInt64{*limit};
    std::vector<std::string> found;
    for (const Json::Value& document : Ask("document_get_by_query", data)) {
      const std::string path = document["TARNMDPath"].asString();
      found.push_back(path);
      EXPECT_EQ(document["TARNMDParent"], parents_[path]) << path;
      EXPECT_EQ(document["TARNMDFSSize"].asUInt64(), path.size());
      EXPECT_EQ(document["Unlisted"].asString(), path);
    }
    ASSERT_EQ(found, expected) << kind << ' ' << value << ' ' << after.value_or("-");
  }

  std::mt19937 random_{GetParam()};
  std::map<std::string, Json::Value> parents_;
};

TEST_P(SelectionTest, IsThatOfTheModel) {
  for (int round = 0; round < 5; ++round) {
    for (int i = 0; i < 120; ++i) ASSERT_NO_FATAL_FAILURE(Change());
    if (Number(2) == 0) Commit();
    for (int i = 0; i < 80; ++i) {
      const std::string kind = std::vector<std::string>{"prefix", "path", "parent"}[Number(3)];
      std::string value = Path();
      if (kind == "parent" && Number(2) == 0) value = value.substr(0, value.rfind('/'));
      std::optional<std::string> after;
      if (Number(2) == 0) after = Path();
      std::optional<std::size_t> limit;
      if (Number(2) == 0) limit = Number(5);
      if (kind == "prefix" && value.empty()) value = "/";
      ASSERT_NO_FATAL_FAILURE(Compare(kind, value, after, limit));
    }
  }
}

// More than are deleted at a time, with what stays in between and at the end.
TEST_P(SelectionTest, ALargeFolderIsDeletedWithoutWhatIsBelowItsFolders) {
  const std::size_t kChildren = 1000 + GetParam();
  for (std::size_t i = 0; i < kChildren; ++i) {
    const std::string child = "/s/" + std::to_string(i);
    Upsert(FileDocument(child));
    if (i % 2 == 0) Upsert(FileDocument(child + "/below"));
    if (i % 9 != 0) continue;
    Json::Value odd = FileDocument("/t/" + std::to_string(i));
    odd["TARNMDParent"] = "/s";
    Upsert(odd);
  }
  const std::size_t odd = (kChildren + 8) / 9;
  Json::Value data;
  data["id"] = "a";
  data["query"]["qsl"]["term"]["TARNMDParent"] = "/s";
  data["query"]["limit"] = 700;
  EXPECT_EQ(Ask("document_del_by_query", data)["deleted"].asUInt64(), 700U);
  data["query"].removeMember("limit");
  EXPECT_EQ(Ask("document_del_by_query", data)["deleted"].asUInt64(), kChildren + odd - 700);
  EXPECT_EQ(Ask("document_get_by_query", data).size(), 0U);
  EXPECT_EQ(Below("/").size(), (kChildren + 1) / 2);
}

INSTANTIATE_TEST_SUITE_P(Seeds, SelectionTest, testing::Range(1U, 9U));

}  // namespace
}  // namespace quarry::engine
