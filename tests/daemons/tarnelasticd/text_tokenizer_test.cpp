#include "daemons/tarnelasticd/text_tokenizer.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <random>
#include <stdexcept>

#include "daemons/tarnelasticd/database.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::engine {
namespace {

using testing::ElementsAre;

class TextTokenizerTest : public testing::Test {
 protected:
  TextTokenizerTest() {
    test::WriteFile(dir_ / "db", "");
    db_ = std::make_unique<Database>(dir_ / "db");
    tokenizer_ = std::make_unique<TextTokenizer>(db_->handle());
  }
  test::TempDir dir_;
  std::unique_ptr<Database> db_;
  std::unique_ptr<TextTokenizer> tokenizer_;
};

TEST_F(TextTokenizerTest, CutsIntoFoldedWords) {
  EXPECT_THAT(tokenizer_->Words("The R\xC3\x89SUM\xC3\x89, page_2 (v1.5)"),
              ElementsAre("the", "resume", "page", "2", "v1", "5"));
  EXPECT_THAT(tokenizer_->Words(""), testing::IsEmpty());
  EXPECT_THAT(tokenizer_->Words("\xFF\x80 -- "), testing::IsEmpty());
}

TEST_F(TextTokenizerTest, FoldsNamesWithWhatStandsBetween) {
  EXPECT_EQ(tokenizer_->Fold("My R\xC3\xA9sum\xC3\xA9 (2).PDF"), "my resume (2).pdf");
  EXPECT_EQ(tokenizer_->Fold("a\nb\x7F"
                             "c"),
            "a b c");
  EXPECT_EQ(tokenizer_->Fold("a\xFF-b"), "a\xEF\xBF\xBD-b");
  EXPECT_EQ(tokenizer_->Fold(""), "");
}

// The fast way against FTS5's own, with bytes of all kinds close to each other.
TEST_F(TextTokenizerTest, FindsTheSameWordsFast) {
  const std::vector<std::string> pieces = {
      "a",    "Z",    "0",        "word",     std::string(100, 'x'), " ",        "-",
      "\n",   "_",    "\x7F",     "\xC3\x89", "e\xCC\x81",           "\xCC\x81", "\xE4\xB8\xAD",
      "\xFF", "\x80", "\xC3",     "\xE4\xB8", "\xF0\x9F\x98\x80",    "\xC2\xA0", "\xE2\x80\xA6",
      "`",    "{",    "\xC2\xB2", "@",        std::string(1, '\0'),  "[",        "/"};
  std::mt19937 random(12);
  for (int round = 0; round < 20000; ++round) {
    std::string text;
    for (auto i = random() % 16; i > 0; --i) {
      text += random() % 4 == 0 ? std::string(1, static_cast<char>(random() % 256))
                                : pieces[random() % pieces.size()];
    }
    std::vector<std::string> words;
    tokenizer_->EachWord(text, [&words](std::string_view word) { words.emplace_back(word); });
    ASSERT_EQ(words, tokenizer_->Words(text)) << testing::PrintToString(text);
  }
}

TEST_F(TextTokenizerTest, TakesAnyBytes) {
  std::mt19937 random(11);
  for (int round = 0; round < 20000; ++round) {
    std::string text;
    for (auto i = random() % 12; i > 0; --i) text += static_cast<char>(random() % 256);
    std::size_t done = 0;
    tokenizer_->ForEach(text, [&](std::string_view word, std::size_t begin, std::size_t end) {
      EXPECT_FALSE(word.empty());
      EXPECT_LE(done, begin);
      EXPECT_LT(begin, end);
      EXPECT_LE(end, text.size());
      done = end;
      return true;
    });
  }
}

TEST_F(TextTokenizerTest, StopsWhenAskedAndPassesExceptionsOn) {
  int words = 0;
  tokenizer_->ForEach("a b c",
                      [&](std::string_view, std::size_t, std::size_t) { return ++words < 2; });
  EXPECT_EQ(words, 2);
  EXPECT_THROW(tokenizer_->ForEach("a b",
                                   [](std::string_view, std::size_t, std::size_t) -> bool {
                                     throw std::runtime_error("stop");
                                   }),
               std::runtime_error);
}

TEST_F(TextTokenizerTest, CountsCharacters) {
  EXPECT_EQ(CountCharacters(""), 0U);
  EXPECT_EQ(CountCharacters("a\xC3\xA9\xE6\xB5\xB7\xF0\x9F\x98\x80"), 4U);
  EXPECT_EQ(CountCharacters("\xFF\x80\xC3"), 3U);
  EXPECT_EQ(CountCharacters("\xE6\xB5"), 2U);
}

}  // namespace
}  // namespace quarry::engine
