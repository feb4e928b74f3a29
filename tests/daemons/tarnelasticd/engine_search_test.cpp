// What a query finds, and in which order.

#include "tests/daemons/tarnelasticd/support/engine_fixture.h"

namespace quarry::engine {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::UnorderedElementsAre;

class SearchTest : public EngineTest {
 protected:
  SearchTest() { Create(); }
};

TEST_F(SearchTest, FindsWordsInTextWithoutRegardToCaseAndAccents) {
  Add("/s/1.txt", "The Quick brown fox. R\xC3\xA9sum\xC3\xA9");
  Add("/s/2.txt", "a lazy dog");
  EXPECT_THAT(Paths("quick"), ElementsAre("/s/1.txt"));
  EXPECT_THAT(Paths("BROWN"), ElementsAre("/s/1.txt"));
  EXPECT_THAT(Paths("resume"), ElementsAre("/s/1.txt"));
  EXPECT_THAT(Paths("r\xC3\x89sum\xC3\xA9"), ElementsAre("/s/1.txt"));
  EXPECT_THAT(Paths("cat"), IsEmpty());
}

TEST_F(SearchTest, AllWordsMustBeFoundInTextOrName) {
  Add("/s/report.txt", "alpha beta");
  Add("/s/other.txt", "alpha gamma report");
  EXPECT_THAT(Paths("alpha beta"), ElementsAre("/s/report.txt"));
  EXPECT_THAT(Paths("report alpha"), ElementsAre("/s/report.txt", "/s/other.txt"));
  EXPECT_THAT(Paths("beta gamma"), IsEmpty());
}

TEST_F(SearchTest, PhrasesAreFoundInARow) {
  Add("/s/1.txt", "one two three");
  Add("/s/2.txt", "two one three");
  EXPECT_THAT(Paths("\"one two\""), ElementsAre("/s/1.txt"));
  EXPECT_THAT(Paths("\"one two thr\"*"), ElementsAre("/s/1.txt"));
  EXPECT_THAT(Paths("one-two"), ElementsAre("/s/1.txt"));
}

TEST_F(SearchTest, StarsStandForTheRestOfAWord) {
  Add("/s/1.txt", "configuration");
  Add("/s/2.txt", "reconfigure");
  EXPECT_THAT(Paths("config*"), ElementsAre("/s/1.txt"));
  EXPECT_THAT(Paths("config"), IsEmpty());
}

TEST_F(SearchTest, MinusTakesAway) {
  Add("/s/1.txt", "red apple");
  Add("/s/2.txt", "green apple");
  Add("/s/3.txt", "green pear");
  EXPECT_THAT(Paths("apple -red"), ElementsAre("/s/2.txt"));
  EXPECT_THAT(Paths("-apple"), ElementsAre("/s/3.txt"));
  EXPECT_THAT(Paths("-apple -pear"), IsEmpty());
  EXPECT_THAT(Paths("apple -\"red apple\""), ElementsAre("/s/2.txt"));
}

TEST_F(SearchTest, OrJoinsItsNeighbours) {
  Add("/s/1.txt", "cat sleeps");
  Add("/s/2.txt", "dog sleeps");
  Add("/s/3.txt", "dog barks");
  EXPECT_THAT(Paths("sleeps cat OR dog"), UnorderedElementsAre("/s/1.txt", "/s/2.txt"));
  EXPECT_THAT(Paths("cat OR barks"), UnorderedElementsAre("/s/1.txt", "/s/3.txt"));
  EXPECT_THAT(Paths("-cat OR sleeps"), UnorderedElementsAre("/s/1.txt", "/s/2.txt", "/s/3.txt"));
}

TEST_F(SearchTest, FileNamesAreFoundByAnyThreeLetters) {
  Add("/s/Holiday-\xC3\x9C"
      "bersicht.PDF");
  Add("/s/ab.txt");
  EXPECT_THAT(Paths("lid"), ElementsAre("/s/Holiday-\xC3\x9C"
                                        "bersicht.PDF"));
  EXPECT_THAT(Paths("\xC3\xBC"
                    "BER"),
              ElementsAre("/s/Holiday-\xC3\x9C"
                          "bersicht.PDF"));
  EXPECT_THAT(Paths("day-uber"), ElementsAre("/s/Holiday-\xC3\x9C"
                                             "bersicht.PDF"));
  EXPECT_THAT(Paths("ab"), ElementsAre("/s/ab.txt"));
  EXPECT_THAT(Paths("ho"), IsEmpty());
  EXPECT_THAT(Paths("name:sicht.p"), ElementsAre("/s/Holiday-\xC3\x9C"
                                                 "bersicht.PDF"));
  EXPECT_THAT(Paths("name:holi*.pdf"), ElementsAre("/s/Holiday-\xC3\x9C"
                                                   "bersicht.PDF"));
}

}  // namespace
}  // namespace quarry::engine
