#include "daemons/tarnelasticd/snippet.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <random>

#include "daemons/tarnelasticd/database.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::engine {
namespace {

class SnippetTest : public testing::Test {
 protected:
  SnippetTest() {
    test::WriteFile(dir_ / "db", "");
    db_ = std::make_unique<Database>(dir_ / "db");
    tokenizer_ = std::make_unique<TextTokenizer>(db_->handle());
  }
  Snippet Make(const std::string& text, const std::string& query, std::size_t length) {
    query_ = ParseQuery(query);
    Resolve(*tokenizer_, &query_);
    std::vector<const QueryTerm*> terms;
    for (const auto& group : query_.groups) {
      for (const QueryTerm& term : group) terms.push_back(&term);
    }
    return MakeSnippet(*tokenizer_, text, terms, length);
  }
  // The snippet with its matches in brackets.
  std::string Marked(const std::string& text, const std::string& query, std::size_t length = 40) {
    const Snippet snippet = Make(text, query, length);
    std::string marked = snippet.text;
    for (auto range = snippet.highlights.rbegin(); range != snippet.highlights.rend(); ++range) {
      marked.insert(range->first + range->second, "]");
      marked.insert(range->first, "[");
    }
    return marked;
  }

  test::TempDir dir_;
  std::unique_ptr<Database> db_;
  std::unique_ptr<TextTokenizer> tokenizer_;
  Query query_;
};

TEST_F(SnippetTest, MarksWordsPhrasesAndBeginnings) {
  EXPECT_EQ(Marked("one two three", "two"), "one [two] three");
  EXPECT_EQ(Marked("one TWO thr\xC3\xA9\x65", "two three"), "one [TWO] [thr\xC3\xA9\x65]");
  EXPECT_EQ(Marked("one two three", "\"two three\""), "one [two three]");
  EXPECT_EQ(Marked("one, two - three", "\"one two\" thr*"), "[one, two] - [three]");
  EXPECT_EQ(Marked("one two", "none"), "one two");
  EXPECT_EQ(Marked("", "one"), "");
}

TEST_F(SnippetTest, ChoosesTheStretchWithMostOfTheWords) {
  const std::string filler = "filler filler filler filler filler filler filler filler ";
  EXPECT_EQ(Marked("one " + filler + "one two " + filler, "one two", 20),
            "\xE2\x80\xA6"
            "filler [one] [two]\xE2\x80\xA6");
  EXPECT_EQ(Marked(filler + "one", "one", 20),
            "\xE2\x80\xA6"
            "filler filler filler [one]");
  EXPECT_EQ(Marked(filler, "one", 20), "filler filler\xE2\x80\xA6");
}

TEST_F(SnippetTest, DrawsBlanksTogether) {
  EXPECT_EQ(Marked("  one \n\t\r two\x01\x02three  ", "two"), "one [two] three");
  EXPECT_EQ(Marked("one \n two", "\"one two\""), "[one two]");
}

// Scripts without blanks have no places between words to cut at.
TEST_F(SnippetTest, CutsLongWordsBetweenCharacters) {
  std::string text;
  for (int i = 0; i < 50; ++i) text += "\xE6\xB5\xB7";
  const Snippet snippet = Make(text, "none", 31);
  EXPECT_EQ(snippet.text, text.substr(0, 30) + "\xE2\x80\xA6");
  EXPECT_EQ(Make(std::string(500, 'x'), "none", 100).text, std::string(100, 'x') + "\xE2\x80\xA6");
}

TEST_F(SnippetTest, RangesLieWithinTheTextWhateverItIs) {
  std::mt19937 random(7);
  const std::vector<std::string> pieces = {
      "one",          "two", " ",          "\n",   "\xC3\xA9",          "\xFF",
      "\xE6\xB5\xB7", "-",   "longerword", "\x80", std::string(60, 'y')};
  for (int round = 0; round < 2000; ++round) {
    std::string text;
    for (auto i = random() % 60; i > 0; --i) text += pieces[random() % pieces.size()];
    const std::size_t length = random() % 80;
    const Snippet snippet = Make(text, "one two* \"one two\"", length);
    EXPECT_LE(snippet.text.size(), length + 100) << text;
    std::size_t done = 0;
    for (const auto& [begin, size] : snippet.highlights) {
      ASSERT_GE(begin, done);
      ASSERT_GT(size, 0U);
      ASSERT_LE(begin + size, snippet.text.size());
      done = begin + size;
    }
  }
}

}  // namespace
}  // namespace quarry::engine
