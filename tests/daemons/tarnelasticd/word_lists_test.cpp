// Texts that are cut into words, and lists of these, against a model that writes down every place.

#include "daemons/tarnelasticd/word_lists.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <map>
#include <memory>
#include <random>
#include <set>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/segment_reader.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::engine {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

// Where words stand: of each the rows, of these the columns and places.
using Places = std::map<std::string, std::map<std::int64_t, std::set<std::pair<int, int>>>>;

class WordListsTest : public testing::Test {
 protected:
  WordListsTest() {
    test::WriteFile(dir_ / "db", "");
    db_ = std::make_unique<Database>(dir_ / "db");
    tokenizer_ = std::make_unique<TextTokenizer>(db_->handle());
    cutter_ = std::make_unique<WordCutter>(*tokenizer_);
  }

  std::vector<std::size_t> Add(std::int64_t id, const std::vector<std::string>& columns) {
    CutText cut;
    cutter_->Cut({columns.begin(), columns.end()}, &cut);
    lists_.Add(id, cut);
    return cut.sizes;
  }

  void AddToModel(std::int64_t id, const std::vector<std::string>& columns) {
    for (std::size_t i = 0; i < columns.size(); ++i) {
      int place = 0;
      for (const std::string& word : tokenizer_->Words(columns[i])) {
        model_[word][id].emplace(static_cast<int>(i), place++);
      }
    }
  }

  static std::set<std::pair<int, int>> Decode(std::string_view positions) {
    std::set<std::pair<int, int>> places;
    const char* at = positions.data();
    const char* const end = at + positions.size();
    int column = 0;
    int place = 0;
    while (at < end) {
      const auto number = static_cast<int>(TakeVarint(&at, end));
      if (number == 1) {
        column = static_cast<int>(TakeVarint(&at, end));
        place = 0;
      } else {
        place += number - 2;
        places.emplace(column, place);
      }
    }
    return places;
  }

  Places Read() const {
    Places places;
    std::string last;
    lists_.ForEach([&](std::string_view word, std::string_view list) {
      EXPECT_TRUE(places.empty() || last < word);
      last = word;
      const char* at = list.data();
      const char* const end = at + list.size();
      std::int64_t row = 0;
      while (at < end) {
        row += static_cast<std::int64_t>(TakeVarint(&at, end));
        const std::size_t size = TakeVarint(&at, end);
        EXPECT_EQ(size % 2, 0U);
        EXPECT_TRUE(places[last][row].empty());
        places[last][row] = Decode({at, size / 2});
        at += size / 2;
      }
    });
    return places;
  }

  test::TempDir dir_;
  std::unique_ptr<Database> db_;
  std::unique_ptr<TextTokenizer> tokenizer_;
  std::unique_ptr<WordCutter> cutter_;
  WordLists lists_;
  Places model_;
};

TEST_F(WordListsTest, KeepsWordsWithTheirPlaces) {
  EXPECT_TRUE(lists_.empty());
  EXPECT_THAT(Add(3, {"One two, one", "", "TWO"}), ElementsAre(3, 0, 1));
  EXPECT_FALSE(lists_.empty());
  EXPECT_THAT(Add(9, {"", "two", ""}), ElementsAre(0, 1, 0));
  const Places expected = {{"one", {{3, {{0, 0}, {0, 2}}}}},
                           {"two", {{3, {{0, 1}, {2, 0}}}, {9, {{1, 0}}}}}};
  EXPECT_EQ(Read(), expected);
  lists_.Clear();
  EXPECT_TRUE(lists_.empty());
  EXPECT_EQ(lists_.bytes(), 0U);
  EXPECT_EQ(Read(), Places());
}

TEST_F(WordListsTest, CountsWordsOfTextsWithoutAny) {
  EXPECT_THAT(Add(1, {"", "-- "}), ElementsAre(0, 0));
  EXPECT_TRUE(lists_.empty());
}

TEST_F(WordListsTest, LeavesLongWordsAndTextsToOthers) {
  EXPECT_THAT(Add(1, {"short " + std::string(WordCutter::kMaxWord + 1, 'a')}), IsEmpty());
  EXPECT_TRUE(lists_.empty());
  EXPECT_THAT(Add(2, {std::string(WordCutter::kMaxText, ' '), "a"}), IsEmpty());
  EXPECT_TRUE(lists_.empty());
  EXPECT_THAT(Add(3, {std::string(WordCutter::kMaxWord, 'a')}), ElementsAre(1));
  EXPECT_THAT(Add(4, {std::string(WordCutter::kMaxText - 1, ' ') + "b"}), ElementsAre(1));
  const Places expected = {{std::string(WordCutter::kMaxWord, 'a'), {{3, {{0, 0}}}}},
                           {"b", {{4, {{0, 0}}}}}};
  EXPECT_EQ(Read(), expected);
}

TEST_F(WordListsTest, TellsMemory) {
  const std::size_t before = lists_.bytes();
  for (int i = 1; i <= 300; ++i) {
    std::string text;
    for (int j = 0; j < 300; ++j) text += "w" + std::to_string(300 * i + j) + " ";
    Add(i, {text});
  }
  EXPECT_GT(lists_.bytes(), before + 90000 * 20);
  EXPECT_LT(lists_.bytes(), before + 90000 * 200);
}

TEST_F(WordListsTest, HoldsWhatTheModelDoes) {
  std::mt19937_64 random(5);
  std::int64_t id = 0;
  for (int round = 0; round < 400; ++round) {
    id += static_cast<std::int64_t>(1 + random() % (round % 50 == 0 ? 1U << 20 : 3));
    std::vector<std::string> columns(1 + random() % 4);
    // Now and then so many different words that all tables grow.
    const std::uint64_t vocabulary = round % 40 == 7 ? 20000 : 300;
    const std::size_t words = round % 40 == 7 ? 8000 : 200;
    for (std::string& text : columns) {
      for (auto i = random() % words; i > 0; --i) {
        std::string word = std::to_string(random() % vocabulary * 7919);
        if (random() % 5 == 0) word += std::string(random() % 30, 'z');
        if (random() % 20 == 0) word += "\xC3\xA9";
        text += word + (random() % 9 == 0 ? ", " : " ");
      }
    }
    ASSERT_EQ(Add(id, columns).size(), columns.size());
    AddToModel(id, columns);
  }
  EXPECT_EQ(Read(), model_);
}

}  // namespace
}  // namespace quarry::engine
