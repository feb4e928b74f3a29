#include "cli/search.h"

#include <gtest/gtest.h>

#include <sstream>

#include "cli/problem.h"
#include "common/json.h"

namespace quarry::cli {
namespace {

Json::Value Parsed(const std::string& text) {
  Json::Value value;
  EXPECT_TRUE(fromString(value, text)) << text;
  return value;
}

std::string Shown(const std::string& found, unsigned int offset = 0, bool colours = false) {
  std::ostringstream out;
  PrintHits(out, Parsed(found), offset, colours);
  return out.str();
}

constexpr char kTwoOfFive[] =
    R"({"total":5,"hits":[
        {"path":"/v/a/b.txt","is_dir":false,"size":2048,"mtime":0,
         "snippet":{"text":"a word here","highlights":[[2,4]]}},
        {"path":"/v/a","is_dir":true,"size":0,"mtime":0,"snippet":{"text":"","highlights":[]}}]})";

TEST(QueryOfTest, KeepsAQueryAsItStands) {
  EXPECT_EQ(QueryOf({"cat OR \"big dog\""}), "cat OR \"big dog\"");
  EXPECT_EQ(QueryOf({}), "");
}

TEST(QueryOfTest, JoinsWordsAndQuotesPhrases) {
  EXPECT_EQ(QueryOf({"cat", "OR", "big dog", "name:\"a b\""}), "cat OR \"big dog\" name:\"a b\"");
}

TEST(PrintHitsTest, NumbersTheHitsAndTellsHowManyThereAre) {
  const std::string text = Shown(kTwoOfFive, 2);
  EXPECT_EQ(text.rfind("3. /v/a/b.txt  2.0 KB, ", 0), 0u) << text;
  EXPECT_NE(text.find("\n   a word here\n4. /v/a\n2 of 5 shown.\n"), std::string::npos) << text;
}

TEST(PrintHitsTest, TellsHowManyThereAreBeyondTheLastOne) {
  EXPECT_EQ(Shown(R"({"total":5,"hits":[]})", 7), "0 of 5 shown.\n");
  EXPECT_EQ(Shown(R"({"total":2,"hits":[{"path":"/v/a","is_dir":true}]})", 1),
            "2. /v/a\n1 of 2 shown.\n");
}

TEST(PrintHitsTest, SaysNoNumberWhereAllAreShown) {
  EXPECT_EQ(Shown(R"({"total":1,"hits":[{"path":"/v/a","is_dir":true}]})"), "1. /v/a\n");
}

TEST(PrintHitsTest, MarksMatchesOnATerminal) {
  const std::string text = Shown(kTwoOfFive, 0, true);
  EXPECT_NE(text.find("a \033[1;33mword\033[0m here"), std::string::npos) << text;
  EXPECT_NE(text.find("/v/a/\033[1mb.txt\033[0m"), std::string::npos) << text;
}

TEST(PrintHitsTest, LeavesOutHighlightsThatLieOutsideTheText) {
  const std::string text = Shown(R"({"total":1,"hits":[{"path":"/a","is_dir":true,
                "snippet":{"text":"word","highlights":[[0,9],[9,1],[2,1],[1,1]]}}]})",
                                 0, true);
  EXPECT_NE(text.find("wo\033[1;33mr\033[0md\n"), std::string::npos) << text;
}

TEST(PrintHitsTest, EscapesNamesThatSteerATerminal) {
  EXPECT_EQ(Shown(R"({"total":1,"hits":[{"path":"/v/\u001b[2J","is_dir":true}]})"),
            "1. /v/\\x1b[2J\n");
}

TEST(PrintHitsTest, SaysThatNothingWasFound) {
  EXPECT_EQ(Shown(R"({"total":0,"hits":[]})"), "Nothing found.\n");
}

TEST(PrintHitsTest, NamesAnIndexThatCouldNotBeSearched) {
  EXPECT_EQ(
      Shown(R"({"total":0,"hits":[],"skipped":[{"id":"fileindex_a","msg":"It is damaged."}]})"),
      "Nothing found.\nThe index fileindex_a could not be searched: It is damaged.\n");
}

TEST(PrintHitsTest, AsksWhetherSomethingElseWasMeant) {
  EXPECT_EQ(Shown(R"({"total":0,"hits":[],"suggestion":"a \"big harbour\""})"),
            "Nothing found.\nDid you mean \"a \"big harbour\"\"?\n");
  EXPECT_EQ(Shown(R"({"total":1,"hits":[{"path":"/v/a","is_dir":true}],"suggestion":"\u001b[2J"})"),
            "1. /v/a\nDid you mean \"\\x1b[2J\"?\n");
}

TEST(PrintHitsTest, RefusesAnswersOfAnotherShape) {
  for (const char* found :
       {R"([])", R"({"total":"many","hits":[]})", R"({"total":1,"hits":[7]})",
        R"({"total":1,"hits":[{"path":[]}]})", R"({"total":0,"hits":[],"suggestion":["a"]})",
        R"({"total":1,"hits":[{"path":"/a","is_dir":true,"snippet":[1]}]})"}) {
    EXPECT_THROW(Shown(found), Problem) << found;
  }
}

}  // namespace
}  // namespace quarry::cli
