// The order of hits, their pages, and what is told of each.

#include <algorithm>
#include <random>

#include "common/json.h"
#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/text_tokenizer.h"
#include "tests/daemons/tarnelasticd/support/engine_fixture.h"
#include "tests/support/files.h"

namespace quarry::engine {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class HitsTest : public EngineTest {
 protected:
  HitsTest() { Create(); }
  void AddAt(const std::string& path, int time, const std::string& text) {
    Json::Value document = FileDocument(path, text);
    document["TARNMDFSContentChangeDate"] = time;
    Upsert(document);
  }
  void AddFolder(const std::string& path) {
    Json::Value document = FileDocument(path);
    document["TARNMDIsDir"] = true;
    Upsert(document);
  }
};

TEST_F(HitsTest, TellsWhatThereIsToTell) {
  Add("/s/d/report.txt", "The harbour is closed today.");
  const Json::Value found = Search("harbour");
  EXPECT_EQ(found["total"].asInt(), 1);
  EXPECT_FALSE(found.isMember("skipped"));
  Json::Value hit = found["hits"][0U];
  EXPECT_GT(hit["score"].asDouble(), 0);
  hit.removeMember("score");
  EXPECT_EQ(toString(hit),
            R"({"index":"a","is_dir":false,"mtime":1700000000,"name":"report.txt",)"
            R"("path":"/s/d/report.txt","size":28,)"
            R"("snippet":{"highlights":[[4,7]],"text":"The harbour is closed today."}})");
}

TEST_F(HitsTest, TellsOfFoldersAndOfDocumentsWithoutAttributes) {
  AddFolder("/s/harbour");
  Json::Value bare;
  bare["TARNMDPath"] = "/s/x/harbour";
  Upsert(bare);
  Commit();
  const Json::Value hits = Search("harbour", Parse(R"({"sort":"path"})"))["hits"];
  EXPECT_TRUE(hits[0U]["is_dir"].asBool());
  EXPECT_FALSE(hits[0U].isMember("snippet"));
  EXPECT_EQ(hits[1U]["name"].asString(), "harbour");
  EXPECT_FALSE(hits[1U]["is_dir"].asBool());
  EXPECT_EQ(hits[1U]["size"].asInt(), 0);
  EXPECT_EQ(hits[1U]["mtime"].asInt(), 0);
}

TEST_F(HitsTest, RanksRareWordsFrequentWordsAndNamesHigher) {
  for (int i = 0; i < 30; ++i) Upsert(FileDocument("/s/x" + std::to_string(i), "common filler"));
  Upsert(FileDocument("/s/much", "alpha alpha alpha alpha filler"));
  Upsert(FileDocument("/s/little", "alpha filler filler filler filler"));
  Upsert(FileDocument("/s/the alpha list", "filler"));
  Upsert(FileDocument("/s/alpha.txt", "filler"));
  Upsert(FileDocument("/s/alpha", "filler"));
  Json::Value titled = FileDocument("/s/titled", "filler filler filler filler");
  titled["TARNMDTitle"] = "alpha";
  Upsert(titled);
  Commit();
  const std::vector<std::string> paths = Paths("alpha");
  ASSERT_EQ(paths.size(), 6U);
  EXPECT_EQ(paths[0], "/s/alpha");
  EXPECT_EQ(paths[1], "/s/alpha.txt");
  EXPECT_EQ(paths.back(), "/s/little");
  const auto place = [&](const std::string& path) {
    return std::find(paths.begin(), paths.end(), path) - paths.begin();
  };
  EXPECT_LT(place("/s/titled"), place("/s/little"));
  EXPECT_LT(place("/s/much"), place("/s/little"));
}

TEST_F(HitsTest, CutsPagesThatNeverOverlap) {
  for (int i = 0; i < 57; ++i) AddAt("/s/" + std::to_string(i), 1000 + i % 5, "alpha");
  Commit();
  for (const char* sort : {"score", "path", "time"}) {
    Json::Value more;
    more["sort"] = sort;
    const std::vector<std::string> all = Paths("alpha", more);
    ASSERT_EQ(all.size(), 57U);
    std::vector<std::string> paged;
    more["limit"] = 10;
    for (int offset = 0; offset < 70; offset += 10) {
      more["offset"] = offset;
      EXPECT_EQ(Search("alpha", more)["total"].asInt(), 57);
      for (const std::string& path : Paths("alpha", more)) paged.push_back(path);
    }
    EXPECT_EQ(paged, all) << sort;
  }
  EXPECT_EQ(Search("alpha")["hits"].size(), 10U);
  const Json::Value none = Search("alpha", Parse(R"({"limit":0})"));
  EXPECT_EQ(none["total"].asInt(), 57);
  EXPECT_EQ(none["hits"].size(), 0U);
}

TEST_F(HitsTest, SortsByPathAndByTime) {
  AddAt("/s/b", 3, "alpha");
  AddAt("/s/a", 1, "alpha");
  AddAt("/s/c", 2, "alpha");
  Json::Value timeless = FileDocument("/s/d", "alpha");
  timeless.removeMember("TARNMDFSContentChangeDate");
  Upsert(timeless);
  Commit();
  EXPECT_THAT(Paths("alpha", Parse(R"({"sort":"path"})")),
              ElementsAre("/s/a", "/s/b", "/s/c", "/s/d"));
  EXPECT_THAT(Paths("alpha", Parse(R"({"sort":"time"})")),
              ElementsAre("/s/b", "/s/c", "/s/a", "/s/d"));
  EXPECT_THAT(Paths("in:/s"), ElementsAre("/s/a", "/s/b", "/s/c", "/s/d"))
      << "filters alone rank nothing";
}

// Above some thousands of hits the whole order is read instead of looking up each.
TEST_F(HitsTest, SortsManyHitsAsItSortsFew) {
  std::vector<std::string> expected;
  for (int i = 0; i < 4200; ++i) {
    const std::string path = "/s/" + std::to_string(100000 + i * 7919 % 4200);
    AddAt(path, 100000 + i, "");
    expected.push_back(path);
  }
  Commit();
  Json::Value more = Parse(R"({"sort":"time","limit":30,"offset":4100})");
  std::vector<std::string> latest(expected.rbegin() + 4100, expected.rbegin() + 4130);
  EXPECT_EQ(Paths("in:/s", more), latest);
  std::sort(expected.begin(), expected.end());
  more["sort"] = "path";
  EXPECT_EQ(Paths("in:/s", more),
            std::vector<std::string>(expected.begin() + 4100, expected.begin() + 4130));
}

TEST_F(HitsTest, SearchesTheIndexesThatAreNamed) {
  Create("b");
  Create("c");
  Add("/b/1", "alpha", "b");
  Add("/c/1", "alpha beta", "c");
  EXPECT_THAT(Paths("alpha"), testing::UnorderedElementsAre("/b/1", "/c/1"));
  EXPECT_THAT(Paths("alpha", Parse(R"({"ids":["b"]})")), ElementsAre("/b/1"));
  EXPECT_THAT(Paths("alpha", Parse(R"({"ids":["b","b"]})")), ElementsAre("/b/1"));
  EXPECT_THAT(Paths("alpha", Parse(R"({"ids":[]})")), IsEmpty());
  const Json::Value found = Search("alpha", Parse(R"({"ids":["none","c"]})"));
  EXPECT_EQ(found["total"].asInt(), 1);
  EXPECT_EQ(toString(found["skipped"]),
            R"([{"code":1404,"id":"none","msg":"There is no index none"}])");
}

TEST_F(HitsTest, TypesAndExtensionsMeanFiles) {
  for (const char* name : {"a.txt", "b.mp3", "c.avi", "d.jpg", "e.zzz", "README", "f.TXT"}) {
    Upsert(FileDocument(std::string("/s/") + name));
  }
  AddFolder("/s/folder.txt");
  AddFolder("/s/folder");
  Commit();
  EXPECT_THAT(Paths("type:document"), ElementsAre("/s/README", "/s/a.txt", "/s/f.TXT"));
  EXPECT_THAT(Paths("type:audio"), ElementsAre("/s/b.mp3"));
  EXPECT_THAT(Paths("type:video,photo"), ElementsAre("/s/c.avi", "/s/d.jpg"));
  EXPECT_THAT(Paths("ext:txt"), ElementsAre("/s/a.txt", "/s/f.TXT"));
  EXPECT_THAT(Paths("-type:document -type:audio,video,photo"),
              ElementsAre("/s/e.zzz", "/s/folder", "/s/folder.txt"));
}

TEST_F(HitsTest, InMeansAPlaceAndAllBelowIt) {
  for (const char* path : {"/s/a", "/s/a/1", "/s/a/b/2", "/s/ab", "/s/a.b"}) {
    Upsert(FileDocument(path));
  }
  Commit();
  EXPECT_THAT(Paths("in:/s/a"), ElementsAre("/s/a", "/s/a/1", "/s/a/b/2"));
  EXPECT_THAT(Paths("in:/s/a/"), ElementsAre("/s/a", "/s/a/1", "/s/a/b/2"));
  EXPECT_EQ(Paths("in:/").size(), 5U);
  EXPECT_THAT(Paths("in:/S"), IsEmpty());
  EXPECT_THAT(Paths("in:/s -in:/s/a"), ElementsAre("/s/a.b", "/s/ab"));
}

TEST_F(HitsTest, ASearchCanBeKeptToAPlaceThatCannotBeTyped) {
  const std::string place = "/s/a \"b\"";
  for (const std::string& path : {place + "/found.txt", std::string("/s/found.txt")}) {
    Upsert(FileDocument(path));
  }
  Commit();
  Json::Value more;
  more["inside"] = place + "/";
  EXPECT_THAT(Paths("found OR other", more), ElementsAre(place + "/found.txt"));
  for (const char* inside : {"", "relative"}) {
    EXPECT_EQ(
        AskError("search", Parse(R"({"query":"found","inside":")" + std::string(inside) + "\"}")),
        kMalformedRequest);
  }
}

TEST_F(HitsTest, SnippetsComeFromTheTextThatHasTheWords) {
  Json::Value document = FileDocument("/s/1.txt", "nothing of interest in here");
  document["TARNMDDescription"] = "a harbour at dawn";
  Upsert(document);
  Commit();
  EXPECT_EQ(Search("harbour")["hits"][0U]["snippet"]["text"].asString(), "a harbour at dawn");
  EXPECT_EQ(Search("1.txt")["hits"][0U]["snippet"]["text"].asString(),
            "nothing of interest in here");
  EXPECT_FALSE(
      Search("harbour", Parse(R"({"highlight":{"length":0}})"))["hits"][0U].isMember("snippet"));
}

TEST_F(HitsTest, TextOfAnyBytesIsFoundByItsOwnWords) {
  std::mt19937 random(3);
  Json::Value document = FileDocument("/s/1");
  std::string text;
  for (int i = 0; i < 300; ++i) text += static_cast<char>(random() % 255 + 1);
  document["TARNMDTextContent"] = text;
  document["Unlisted"] = text;
  Upsert(document);
  Commit();
  test::TempDir dir;
  test::WriteFile(dir / "db", "");
  const Database db(dir / "db");
  const TextTokenizer tokenizer(db.handle());
  int words = 0;
  tokenizer.ForEach(text, [&](std::string_view /*word*/, std::size_t begin, std::size_t end) {
    const std::string typed = '"' + text.substr(begin, end - begin) + '"';
    EXPECT_THAT(Paths(typed), ElementsAre("/s/1")) << testing::PrintToString(typed);
    ++words;
    return true;
  });
  EXPECT_GT(words, 20);
}

// Whatever is typed is answered, with hits or with a sentence; nothing of it reaches the database
// as an expression.
TEST_F(HitsTest, NoQueryBreaksTheSearch) {
  Add("/s/AND \"NEAR\" (x).txt", "AND OR NOT NEAR ^ + : * { } ( ) col:word body labels names");
  for (const std::string text : {"AND",
                                 "NOT",
                                 "NEAR",
                                 "NEAR(x y)",
                                 "NEAR/2",
                                 "^word",
                                 "+word",
                                 "body:word",
                                 "{a b}:x",
                                 "a + b",
                                 "x AND y",
                                 "(x)",
                                 "((((",
                                 "))))",
                                 "'",
                                 "''; DROP TABLE docs; --",
                                 "%",
                                 "_",
                                 "\\",
                                 "\"AND\"",
                                 "\"a\"\"b\"",
                                 "\"*\"*",
                                 "-",
                                 "--",
                                 "---x",
                                 "-\"\"",
                                 "\"",
                                 "\"\"",
                                 "\"x",
                                 "x\"",
                                 "OR",
                                 "x OR",
                                 "OR x",
                                 "x OR OR y",
                                 "-x OR -y",
                                 "- x",
                                 "* * *",
                                 "name:\"",
                                 "name:*x*",
                                 "name:%",
                                 "ext:%",
                                 "ext:'",
                                 "in:/%",
                                 "in:/'",
                                 "type:",
                                 "type:x",
                                 ":",
                                 "::",
                                 "a:b:c",
                                 "\xFF\xFE",
                                 "\xC3",
                                 "\xED\xA0\x80",
                                 "\xF4\x90\x80\x80",
                                 "\xC0\x80",
                                 "\x01\x02\x03",
                                 "\x7F",
                                 "name:\x02",
                                 "\xEF\xBF\xBD\xEF\xBF\xBD\xEF\xBF\xBD",
                                 "\xF0\x9F\x98\x80\xF0\x9F\x98\x80\xF0\x9F\x98\x80",
                                 "\xE2\x80\x8B",
                                 "\xCC\x81\xCC\x81\xCC\x81"}) {
    Json::Value data;
    data["query"] = text;
    const int code = AskError("search", data);
    EXPECT_TRUE(code == 0 || code == 1409) << text << ": " << code;
  }
  EXPECT_EQ(Paths("\"AND OR NOT NEAR\"").size(), 1U);
  EXPECT_EQ(Paths("name:\"(x).\"").size(), 1U);
  EXPECT_EQ(Paths("-nothing").size(), 1U);
  EXPECT_EQ(SearchError(std::string(4097, 'x')), 1409);
  EXPECT_EQ(SearchError(std::string(4096, '.')), 0);
  EXPECT_EQ(SearchError(std::string(4096, '\x80')), 0);
  std::string many;
  for (int i = 0; i < 63; ++i) many += "w" + std::to_string(i) + " OR ";
  EXPECT_EQ(Paths(many + "body").size(), 1U);
}

}  // namespace
}  // namespace quarry::engine
