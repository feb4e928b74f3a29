// What the engine suggests: other spellings of a query, and how a word may go on.

#include "common/json.h"
#include "tests/daemons/tarnelasticd/support/engine_fixture.h"

namespace quarry::engine {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class SuggestionTest : public EngineTest {
 protected:
  SuggestionTest() { Create(); }

  void Collect(const std::string& id = "a") {
    Json::Value data;
    data["db_name"] = id;
    data["doc_id_field"] = "TARNMDPath";
    Ask("update_term_suggestion", data);
    Commit(id);
  }
  // Stores so many files with this text.
  void AddMany(int count, const std::string& text, const std::string& id = "a") {
    static int number = 0;
    for (int i = 0; i < count; ++i) {
      Upsert(FileDocument("/s/" + std::to_string(++number) + ".txt", text), id);
    }
  }
  // The other spelling; "" without one.
  std::string Suggested(const std::string& query, const Json::Value& more = Json::objectValue) {
    const Json::Value found = Search(query, more);
    if (!found.isMember("suggestion")) return "";
    EXPECT_FALSE(found["suggestion"].asString().empty());
    return found["suggestion"].asString();
  }
  // The words and their documents: "word 2".
  std::vector<std::string> Completed(const std::string& prefix,
                                     Json::Value more = Json::objectValue) {
    more["prefix"] = prefix;
    std::vector<std::string> words;
    const Json::Value completed = Ask("complete", more);
    EXPECT_TRUE(completed["words"].isArray());
    for (const Json::Value& word : completed["words"]) {
      words.push_back(word["word"].asString() + ' ' + std::to_string(word["documents"].asInt()));
    }
    return words;
  }
};

TEST_F(SuggestionTest, ReplacesAWordThatNothingHas) {
  AddMany(2, "the harbour lighthouse");
  Collect();
  EXPECT_EQ(Suggested("harbuor"), "harbour");
  EXPECT_EQ(Suggested("lihgtouse"), "lighthouse");
  EXPECT_EQ(Suggested("HARBUOR Lighthouse"), "harbour Lighthouse");
  EXPECT_EQ(Suggested("harbuor lihgthouse harbuor"), "harbour lighthouse harbour");
  EXPECT_EQ(Suggested("nothing-like-it"), "");
  EXPECT_EQ(Suggested("harbour"), "");
}

TEST_F(SuggestionTest, ChangesNothingElse) {
  AddMany(2, "the harbour lighthouse");
  AddMany(2, "harbour");
  Collect();
  const Json::Value more = Parse(R"({"limit":2,"highlight":{"length":0}})");
  Json::Value found = Search("harbuor OR lighthouse", more);
  EXPECT_EQ(found["suggestion"], "harbour OR lighthouse");
  found.removeMember("suggestion");
  EXPECT_EQ(found["total"].asInt(), 2);
  EXPECT_EQ(found["hits"].size(), 2U);
  EXPECT_EQ(found.size(), 2U);
}

TEST_F(SuggestionTest, WithoutCollectedWordsThereIsNone) {
  AddMany(2, "the harbour lighthouse");
  Commit();
  EXPECT_EQ(Suggested("harbuor"), "");
  EXPECT_THAT(Completed("har"), IsEmpty());
}

TEST_F(SuggestionTest, KeepsOperatorsQuotesAndFilters) {
  AddMany(2, "the harbour lighthouse at night");
  Collect();
  EXPECT_EQ(Suggested("  \"harbuor lihgthouse\"   -storm\ttype:document nigth "),
            "  \"harbour lighthouse\"   -storm\ttype:document night ");
  EXPECT_EQ(Suggested("nigth -harbuor"), "night -harbuor");
  EXPECT_EQ(Suggested("nigth -\"big harbuor\""), "night -\"big harbuor\"");
  EXPECT_EQ(Suggested("bridge OR harbuor ext:txt in:/s"), "bridge OR harbour ext:txt in:/s");
  EXPECT_EQ(Suggested("name:txd harbuor"), "");
  EXPECT_EQ(Suggested("harbuor,lihgthouse"), "harbour,lighthouse");
  EXPECT_EQ(Suggested("\"harbuor li\"*"), "\"harbour li\"*");
  EXPECT_EQ(Suggested("harbuo*"), "");
  EXPECT_EQ(Suggested("name:harbuor"), "");
}

TEST_F(SuggestionTest, MustFindMore) {
  AddMany(2, "harbour");
  AddMany(2, "lighthouse");
  Collect();
  EXPECT_EQ(Suggested("harbuor lighthouse"), "");
  EXPECT_EQ(Suggested("harbuor in:/elsewhere"), "");
  EXPECT_EQ(Suggested("harbuor", Parse(R"({"inside":"/elsewhere"})")), "");
  EXPECT_EQ(Suggested("harbuor", Parse(R"({"inside":"/s"})")), "harbour");
  EXPECT_EQ(Suggested("harbuor", Parse(R"({"limit":0})")), "harbour");
}

TEST_F(SuggestionTest, ReplacesARareWordByOneThatIsFarMoreFrequent) {
  AddMany(1, "harbuor");
  AddMany(9, "harbour");
  Collect();
  EXPECT_EQ(Suggested("harbuor"), "");
  AddMany(1, "harbour");
  Collect();
  EXPECT_EQ(Suggested("harbuor"), "harbour");
  EXPECT_EQ(Suggested("harbour"), "");
  AddMany(4, "harbuor");
  AddMany(90, "harbour");
  Collect();
  EXPECT_EQ(Suggested("harbuor"), "");
}

TEST_F(SuggestionTest, TakesTheNearestWordThenTheMostFrequent) {
  AddMany(2, "garden");
  AddMany(5, "gardens");
  AddMany(3, "harden");
  Collect();
  EXPECT_EQ(Suggested("gardne"), "garden");
  EXPECT_EQ(Suggested("warden"), "harden");
  EXPECT_EQ(Suggested("gardenx"), "gardens");
}

TEST_F(SuggestionTest, AllowsLongWordsTwoSlips) {
  AddMany(2, "house planet lamp");
  Collect();
  EXPECT_EQ(Suggested("hosue"), "house");
  EXPECT_EQ(Suggested("huose"), "house");
  EXPECT_EQ(Suggested("huoes"), "");
  EXPECT_EQ(Suggested("palnte"), "planet");
  EXPECT_EQ(Suggested("palte"), "");
  EXPECT_EQ(Suggested("lmap"), "lamp");
}

TEST_F(SuggestionTest, LeavesNumbersAndShortWordsAlone) {
  AddMany(2, "2019 the a4b");
  Collect();
  EXPECT_EQ(Suggested("2018"), "");
  EXPECT_EQ(Suggested("th"), "");
  EXPECT_EQ(Suggested("teh"), "the");
  EXPECT_EQ(Suggested("a5b"), "a4b");
}

TEST_F(SuggestionTest, CountsLettersOfAnyScript) {
  AddMany(2,
          "\xD0\xBC\xD0\xB0\xD1\x8F\xD0\xBA r\xC3\xA9sum\xC3\xA9 \xC3\x9C"
          "berraschung");
  Collect();
  EXPECT_EQ(Suggested("\xD0\x9C\xD0\xB0\xD0\xBA\xD1\x8F"), "\xD0\xBC\xD0\xB0\xD1\x8F\xD0\xBA");
  EXPECT_EQ(Suggested("\xD0\xBC\xD0\xB0\xD0\xBA"), "\xD0\xBC\xD0\xB0\xD1\x8F\xD0\xBA");
  EXPECT_EQ(Suggested("resme\xCC\x81"), "resume");
  EXPECT_EQ(Suggested("\xC3\xBC"
                      "beraschunk!"),
            "uberraschung!");
}

TEST_F(SuggestionTest, WorksOnWordsOfFileNames) {
  Add("/s/Holiday-plans.odt");
  Collect();
  EXPECT_EQ(Suggested("holliday"), "holiday");
  EXPECT_EQ(Suggested("hol"), "");
  EXPECT_EQ(Suggested("oliday"), "");  // a part of the name is found by itself
}

TEST_F(SuggestionTest, StandsAnythingThatIsTyped) {
  AddMany(2, "harbour near NOT columns");
  Collect();
  EXPECT_EQ(Suggested("harbuor\xFF"), "harbour\xFF");
  EXPECT_EQ(Suggested("\xC3(harbuor"), "\xC3(harbour");
  EXPECT_EQ(Suggested("harbuor AND (nera"), "");
  EXPECT_EQ(Suggested("{harbuor} ^nera t0:nott"), "");
  EXPECT_EQ(Suggested("(harbuor)"), "(harbour)");
  EXPECT_EQ(Suggested("^harbuor'"), "^harbour'");
  EXPECT_EQ(Suggested("naer"), "near");
  EXPECT_EQ(Suggested(std::string(4096, 'h')), "");
  EXPECT_EQ(Suggested("harbuor -" + std::string(4000, 'x')), "harbour -" + std::string(4000, 'x'));
  EXPECT_EQ(SearchError(""), 1409);
}

TEST_F(SuggestionTest, LooksAtAFewWordsOnly) {
  AddMany(2, "harbour");
  Collect();
  std::string words;
  for (char c = 'a'; c < 'q'; ++c) words += std::string(4, c) + " OR ";
  EXPECT_EQ(Suggested(words + "harbuor"), "");
  EXPECT_EQ(Suggested(words.substr(8) + "harbuor"), words.substr(8) + "harbour");
}

// A suggestion is no longer than a query may be.
TEST_F(SuggestionTest, CanItselfBeTyped) {
  AddMany(2, "harbour");
  Collect();
  const std::string filler = " -" + std::string(4096 - 8, 'x');
  EXPECT_EQ(Suggested("harbor" + filler), "");
  EXPECT_EQ(Suggested("harbuor" + filler.substr(0, 4089)), "harbour" + filler.substr(0, 4089));
}

// What a corrected word would make of its neighbours is not what was typed.
TEST_F(SuggestionTest, FailsNoSearch) {
  AddMany(2, "type harbour");
  Collect();
  EXPECT_EQ(Suggested("tipe:harbour"), "");
}

TEST_F(SuggestionTest, CountsOverAllIndexes) {
  Create("b");
  AddMany(3, "garden warden");
  AddMany(2, "harden");
  AddMany(2, "harden", "b");
  Collect("a");
  Collect("b");
  EXPECT_EQ(Suggested("barden"), "harden");
  EXPECT_EQ(Suggested("barden", Parse(R"({"ids":["a"]})")), "garden");
  EXPECT_EQ(Suggested("barden", Parse(R"({"ids":["b"]})")), "harden");
  EXPECT_EQ(Suggested("barden", Parse(R"({"ids":[]})")), "");
  const Json::Value found = Search("barden", Parse(R"({"ids":["b","gone"]})"));
  EXPECT_EQ(found["suggestion"], "harden");
  EXPECT_EQ(found["skipped"][0]["id"], "gone");
}

TEST_F(SuggestionTest, CompletesWithTheMostFrequentWords) {
  AddMany(3, "harbour");
  AddMany(2, "hardware harbour harm");
  Collect();
  EXPECT_THAT(Completed("har"), ElementsAre("harbour 5", "hardware 2", "harm 2"));
  EXPECT_THAT(Completed("H\xC3\x84R"), ElementsAre("harbour 5", "hardware 2", "harm 2"));
  EXPECT_THAT(Completed("har", Parse(R"({"size":1})")), ElementsAre("harbour 5"));
  EXPECT_THAT(Completed("harbour"), ElementsAre("harbour 5"));
  EXPECT_THAT(Completed("harp"), IsEmpty());
}

TEST_F(SuggestionTest, CompletesOneWordOnly) {
  AddMany(2, "harbour");
  Collect();
  for (const char* prefix : {"", " ", "har ", " har", "big har", "har*", "\"har", "-har", "\xFF",
                             "har\xFF", "%", "type:har"}) {
    EXPECT_THAT(Completed(prefix), IsEmpty()) << prefix;
  }
}

TEST_F(SuggestionTest, CompletesFromAllIndexes) {
  Create("b");
  AddMany(3, "harvest");
  AddMany(2, "harbour");
  AddMany(2, "harbour", "b");
  Collect("a");
  Collect("b");
  EXPECT_THAT(Completed("har"), ElementsAre("harbour 4", "harvest 3"));
  EXPECT_THAT(Completed("har", Parse(R"({"ids":["a"]})")), ElementsAre("harvest 3", "harbour 2"));
  EXPECT_THAT(Completed("har", Parse(R"({"ids":[]})")), IsEmpty());
  EXPECT_EQ(Ask("complete", Parse(R"({"prefix":"har","ids":["b","x"]})"))["skipped"][0]["id"], "x");
  EXPECT_EQ(AskError("complete", Parse(R"({"prefix":"har","ids":["x"]})")), 1404);
}

TEST_F(SuggestionTest, RefusesCompletionsThatItCannotUnderstand) {
  for (const char* data :
       {R"({})", R"({"prefix":1})", R"({"prefix":"a","size":0})", R"({"prefix":"a","size":101})",
        R"({"prefix":"a","size":"1"})", R"({"prefix":"a","ids":"a"})"}) {
    EXPECT_EQ(AskError("complete", Parse(data)), 1402) << data;
  }
  Json::Value data;
  data["prefix"] = std::string(4097, 'a');
  EXPECT_EQ(AskError("complete", data), 1402);
  data["prefix"] = std::string(4096, 'a');
  EXPECT_EQ(AskError("complete", data), 0);
}

TEST_F(SuggestionTest, APausedIndexGoesOnSuggesting) {
  AddMany(2, "harbour");
  Collect();
  Ask("index_pause", Parse(R"({"id":"a"})"));
  EXPECT_EQ(Suggested("harbuor"), "harbour");
  EXPECT_THAT(Completed("har"), ElementsAre("harbour 2"));
  Restart();
  EXPECT_EQ(Suggested("harbuor"), "harbour");
}

}  // namespace
}  // namespace quarry::engine
