// Runs of words that are kept in a file, against the same words in a map.

#include "daemons/tarnelasticd/word_runs.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <map>
#include <random>
#include <string>
#include <vector>

#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/text_tokenizer.h"
#include "daemons/tarnelasticd/word_cutter.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::engine {
namespace {

using Words = std::map<std::string, std::vector<std::string>>;

class WordRunsTest : public testing::Test {
 protected:
  WordRunsTest() {
    test::WriteFile(dir_ / "db", "");
    db_ = std::make_unique<Database>(dir_ / "db");
    tokenizer_ = std::make_unique<TextTokenizer>(db_->handle());
  }

  void Add(std::int64_t id, const std::string& text) {
    WordCutter cutter(*tokenizer_);
    CutText words;
    cutter.Cut({text}, &words);
    lists_.Add(id, words);
  }
  void Save(WordRuns* runs) {
    lists_.ForEach([this](std::string_view word, std::string_view list) {
      model_[std::string(word)].emplace_back(list);
    });
    runs->Add(lists_);
    lists_.Clear();
  }
  static Words Read(const WordRuns& runs) {
    Words words;
    std::string last;
    runs.ForEach([&](std::string_view word, const std::vector<std::string_view>& lists) {
      EXPECT_LT(last, word);
      last = word;
      words[last].assign(lists.begin(), lists.end());
    });
    return words;
  }

  test::TempDir dir_;
  std::unique_ptr<Database> db_;
  std::unique_ptr<TextTokenizer> tokenizer_;
  WordLists lists_;
  Words model_;
};

TEST_F(WordRunsTest, AreNothingAtFirst) {
  WordRuns runs(dir_ / "");
  EXPECT_TRUE(runs.empty());
  runs.Add(lists_);
  EXPECT_TRUE(runs.empty());
  EXPECT_TRUE(Read(runs).empty());
}

TEST_F(WordRunsTest, HoldWhatTheModelHolds) {
  std::mt19937_64 random(5);
  WordRuns runs(dir_ / "");
  std::int64_t id = 1;
  for (std::size_t run = 0; run < WordRuns::kMostRuns; ++run) {
    EXPECT_FALSE(runs.IsFull());
    for (int i = 0; i < 200; ++i) {
      std::string text = "all ";
      for (auto words = random() % 300; words > 0; --words) {
        text += "w" + std::to_string(random() % 20000) + " ";
      }
      // A list that no buffer holds.
      if (run == 3 && i == 7) {
        for (int j = 0; j < 90000; ++j) text += j % 200 == 0 ? "other " : "often ";
      }
      Add(id++, text);
    }
    Save(&runs);
  }
  EXPECT_TRUE(runs.IsFull());
  EXPECT_EQ(Read(runs), model_);
  runs.Clear();
  EXPECT_TRUE(runs.empty());
  model_.clear();
  Add(1, "once more");
  Save(&runs);
  EXPECT_EQ(Read(runs), model_);
}

TEST_F(WordRunsTest, LeaveNothingInTheDirectory) {
  WordRuns runs(dir_ / "");
  Add(1, "one two");
  Save(&runs);
  for (const auto& file : std::filesystem::directory_iterator(dir_ / "")) {
    EXPECT_EQ(file.path().filename(), "db");
  }
}

TEST_F(WordRunsTest, SayWhereTheyCannotBeKept) {
  WordRuns runs(dir_ / "missing");
  Add(1, "one");
  try {
    runs.Add(lists_);
    FAIL() << "there is no such directory";
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), static_cast<int>(kStorageFailed));
  }
}

}  // namespace
}  // namespace quarry::engine
