// The lists that FTS5 has written, read without it, against a model that counts words.

#include "daemons/tarnelasticd/posting_lists.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <array>
#include <fstream>
#include <map>
#include <random>
#include <set>
#include <string>
#include <vector>

#include "daemons/tarnelasticd/engine_error.h"
#include "tests/support/temp_dir.h"

namespace quarry::engine {
namespace {

const std::vector<double> kWeights = {6, 1, 0.5};

class PostingListsTest : public testing::Test {
 protected:
  using Texts = std::array<std::vector<std::string>, 3>;
  using Counts = std::map<std::int64_t, float>;

  PostingListsTest() {
    const std::string path = dir_ / "test.db";
    std::ofstream(path).close();
    db_ = std::make_unique<Database>(path);
    db_->Execute(
        "PRAGMA synchronous=OFF;PRAGMA journal_mode=MEMORY;"
        "CREATE VIRTUAL TABLE body USING fts5(a,b,c, content='');");
  }

  void Insert(std::int64_t id, const Texts& texts) {
    Write("INSERT INTO body(rowid,a,b,c) VALUES(?1,?2,?3,?4)", id, texts);
    model_[id] = texts;
  }
  void Remove(std::int64_t id) {
    const auto document = model_.find(id);
    Write("INSERT INTO body(body,rowid,a,b,c) VALUES('delete',?1,?2,?3,?4)", id, document->second);
    model_.erase(document);
  }
  // One of FTS5's own commands.
  void Tell(const std::string& command, std::int64_t rank) {
    db_->Prepare("INSERT INTO body(body,rank) VALUES(?1,?2)")
        .Bind(1, std::string_view(command))
        .Bind(2, rank)
        .Run();
  }

  PostingLists Lists() {
    return {db_.get(), "body", LastId(), kWeights, [] {}};
  }
  Counts Read(const std::string& word, bool prefix = false) {
    Counts counts;
    Lists().ForEach(word, prefix, [&counts](const std::vector<Posting>& some) {
      for (const Posting& posting : some) counts[posting.id] += posting.frequency;
    });
    return counts;
  }
  Counts Expected(const std::string& word, bool prefix) const {
    Counts counts;
    for (const auto& [id, texts] : model_) {
      for (std::size_t column = 0; column < texts.size(); ++column) {
        for (const std::string& one : texts[column]) {
          const bool is_meant = prefix ? one.rfind(word, 0) == 0 : one == word;
          if (is_meant) counts[id] += static_cast<float>(kWeights[column]);
        }
      }
    }
    return counts;
  }
  // By how many rows have them, a row counting by its number.
  using WordCounts = std::map<std::string, std::int64_t>;
  static std::int64_t CountOf(std::int64_t id) { return 1 + id % 3; }
  WordCounts CountWords() {
    WordCounts counts;
    std::string last;
    Lists().CountWords(&CountOf, [&](std::string_view word, std::int64_t rows) {
      EXPECT_LT(last, word);
      last = word;
      counts[last] = rows;
    });
    return counts;
  }
  WordCounts ExpectedWords() const {
    WordCounts counts;
    for (const auto& [id, texts] : model_) {
      std::set<std::string> words;
      for (const auto& text : texts) words.insert(text.begin(), text.end());
      for (const std::string& word : words) counts[word] += CountOf(id);
    }
    return counts;
  }
  std::int64_t LastId() const { return model_.empty() ? 0 : model_.rbegin()->first; }

  test::TempDir dir_;
  std::unique_ptr<Database> db_;
  std::map<std::int64_t, Texts> model_;

 private:
  static std::string Join(const std::vector<std::string>& words) {
    std::string text;
    for (const std::string& word : words) text += word + ' ';
    return text;
  }
  void Write(const std::string& sql, std::int64_t id, const Texts& texts) {
    const std::string joined[] = {Join(texts[0]), Join(texts[1]), Join(texts[2])};
    Statement row = db_->Prepare(sql);
    row.Bind(1, id);
    for (int i = 0; i < 3; ++i) row.Bind(i + 2, std::string_view(joined[i]));
    row.Run();
  }
};

TEST_F(PostingListsTest, FindNothingInAnEmptyTable) {
  EXPECT_TRUE(Lists().IsReadable());
  EXPECT_TRUE(Read("a").empty());
  EXPECT_TRUE(Read("", true).empty());
}

TEST_F(PostingListsTest, WeighColumns) {
  Insert(3, Texts{{{"one"}, {"one", "two", "one"}, {}}});
  Insert(7, Texts{{{}, {}, {"one", "once"}}});
  EXPECT_EQ(Read("one"), (Counts{{3, 8.0F}, {7, 0.5F}}));
  EXPECT_EQ(Read("two"), (Counts{{3, 1.0F}}));
  EXPECT_EQ(CountWords(), (WordCounts{{"one", 3}, {"once", 2}, {"two", 1}}));
  EXPECT_EQ(Read("on", true), (Counts{{3, 8.0F}, {7, 1.0F}}));
  EXPECT_TRUE(Read("on").empty());
}

TEST_F(PostingListsTest, LeaveTheFormOfAnotherVersionToTheLibrary) {
  db_->Execute("UPDATE body_config SET v=5 WHERE k='version'");
  EXPECT_FALSE(Lists().IsReadable());
  db_->Execute("UPDATE body_config SET v=4 WHERE k='version'");
  EXPECT_TRUE(Lists().IsReadable());
  db_->Execute("UPDATE body_data SET block=x'00000000ff000001010000' WHERE id=10");
  EXPECT_FALSE(Lists().IsReadable());
}

TEST_F(PostingListsTest, StopWhereTheCheckSaysSo) {
  Tell("pgsz", 64);
  db_->Execute("BEGIN");
  for (std::int64_t id = 1; id < 5000; ++id) Insert(id, Texts{{{"word"}, {}, {}}});
  db_->Execute("COMMIT");
  PostingLists lists(db_.get(), "body", LastId(), kWeights,
                     [] { throw Error(kSearchTooLong, "The search took too long"); });
  EXPECT_THROW(lists.ForEach("word", false, [](const std::vector<Posting>&) {}), Error);
}

// A merge forgets that a row was deleted before it was put in again, and older segments may still
// have what it was.
TEST_F(PostingListsTest, BelieveTheNewestSegment) {
  Tell("automerge", 0);
  const auto merge = [this] { Tell("merge", 100); };
  for (std::int64_t id = 1; id <= 4; ++id) Insert(id, Texts{{{"word", "word"}, {}, {}}});
  merge();
  Remove(1);
  Insert(1, Texts{{{"word"}, {}, {}}});
  for (std::int64_t id = 5; id <= 6; ++id) Insert(id, Texts{{{"word", "work"}, {}, {}}});
  merge();
  EXPECT_EQ(Read("word"), Expected("word", false));
  EXPECT_EQ(Read("wor", true), Expected("wor", true));
}

TEST_F(PostingListsTest, ReadNoListBeyondItsEnd) {
  Insert(1, Texts{{{"aa", "ab"}, {}, {}}});
  std::string leaf;
  std::int64_t id = 0;
  {
    Statement row = db_->Prepare("SELECT id,block FROM body_data WHERE id>10");
    ASSERT_TRUE(row.Step());
    id = row.Int(0);
    leaf = row.Blob(1);
  }
  // The list is a row id, a size and one position, and then comes the other word: now the size
  // goes on in it, and is far more than the leaf has.
  const std::size_t list = leaf.find("0aa") + 3;
  leaf[list + 1] = leaf[list + 2] = static_cast<char>(0x82);
  db_->Prepare("UPDATE body_data SET block=?2 WHERE id=?1").Bind(1, id).BindBlob(2, leaf).Run();
  EXPECT_THROW(Read("aa"), Error);
}

TEST_F(PostingListsTest, MissALeafThatIsGone) {
  Tell("pgsz", 64);
  db_->Execute("BEGIN");
  for (std::int64_t id = 1; id < 500; ++id) Insert(id, Texts{{{"word"}, {}, {}}});
  db_->Execute("COMMIT");
  EXPECT_EQ(Read("word").size(), 499U);
  // Rows with that bit help FTS5 to skip parts of long lists.
  const std::string leaves = "SELECT id FROM body_data WHERE id>10 AND id>>36&1=0 ORDER BY id ";
  for (const char* order : {"DESC", "ASC"}) {
    db_->Execute("SAVEPOINT whole");
    db_->Execute("DELETE FROM body_data WHERE id IN (" + leaves + order + " LIMIT 1)");
    EXPECT_THROW(Read("word"), Error) << order;
    db_->Execute("ROLLBACK TO whole; RELEASE whole");
  }
}

// Whatever a leaf holds, reading it ends, and within its bounds.
TEST_F(PostingListsTest, TakeDamageForDamage) {
  Tell("pgsz", 128);
  std::mt19937 random(5);
  db_->Execute("BEGIN");
  for (std::int64_t id = 1; id < 300; ++id) {
    Insert(id, Texts{{{"all", "w" + std::to_string(id % 40)}, {}, {"all", "all"}}});
  }
  db_->Execute("COMMIT;BEGIN");
  std::vector<std::pair<std::int64_t, std::string>> leaves;
  {
    Statement rows = db_->Prepare("SELECT id,block FROM body_data");
    while (rows.Step()) leaves.emplace_back(rows.Int(0), std::string(rows.Blob(1)));
  }
  int damaged = 0;
  for (int round = 0; round < 1000; ++round) {
    const auto& leaf = leaves[random() % leaves.size()];
    const std::int64_t id = leaf.first;
    const std::string& block = leaf.second;
    std::string bad = block;
    if (random() % 4 == 0) bad.resize(random() % (bad.size() + 1));
    if (!bad.empty()) bad[random() % bad.size()] = static_cast<char>(random());
    const auto write = [&](const std::string& bytes) {
      db_->Prepare("UPDATE body_data SET block=?2 WHERE id=?1")
          .Bind(1, id)
          .BindBlob(2, bytes)
          .Run();
    };
    write(bad);
    try {
      for (const char* word : {"all", "w17"}) Read(word);
      Read("w", true);
    } catch (const Error& error) {
      EXPECT_TRUE(HasCode(error, kDamagedIndex)) << error.reason();
      ++damaged;
    }
    write(block);
  }
  EXPECT_GT(damaged, 100);
}

class PostingListsModelTest : public PostingListsTest,
                              public testing::WithParamInterface<unsigned> {
 protected:
  std::size_t Number(std::size_t below) {
    return std::uniform_int_distribution<std::size_t>(0, below - 1)(random_);
  }
  std::string Word() {
    // Few are frequent, and many begin alike.
    const std::size_t kind = Number(6);
    if (kind < 2) return "the";
    if (kind < 4) return "w" + std::to_string(Number(30));
    return std::string(1, static_cast<char>('a' + Number(26))) + std::to_string(Number(300));
  }
  Texts RandomTexts() {
    Texts texts;
    // A long one now and then, whose positions take several leaves and large steps.
    const std::size_t most = Number(40) == 0 ? 3000 : 12;
    for (auto& text : texts) {
      for (std::size_t left = Number(most); left > 0; --left) text.push_back(Word());
    }
    return texts;
  }
  void Change() {
    const auto id = static_cast<std::int64_t>(1 + Number(900));
    const bool exists = model_.count(id) > 0;
    if (exists) Remove(id);
    if (!exists || Number(3) > 0) Insert(id, RandomTexts());
  }
  void Tend() {
    switch (Number(6)) {
      case 0:
        return Tell("merge", static_cast<std::int64_t>(1 + Number(20)));
      case 1:
        return Tell("merge", -static_cast<std::int64_t>(1 + Number(20)));
      case 2:
        return Tell("automerge", static_cast<std::int64_t>(Number(9)));
      case 3:
        return Number(4) == 0 ? Tell("optimize", 0) : void();
      default:
        return;
    }
  }
  void Compare() {
    for (const char* word : {"the", "w1", "w17", "a", "a1", "k299", "none", "zzz"}) {
      ASSERT_EQ(Read(word), Expected(word, false)) << word;
    }
    for (const char* word : {"", "t", "w", "w1", "k2", "none", "z"}) {
      ASSERT_EQ(Read(word, true), Expected(word, true)) << word << '*';
    }
    ASSERT_EQ(CountWords(), ExpectedWords());
  }

  std::mt19937 random_{GetParam()};
};

TEST_P(PostingListsModelTest, HoldWhatTheModelHolds) {
  Tell("pgsz", std::array<std::int64_t, 3>{64, 300, 4050}[GetParam() % 3]);
  for (int round = 0; round < 25; ++round) {
    db_->Execute("BEGIN");
    for (std::size_t left = Number(120); left > 0; --left) Change();
    db_->Execute("COMMIT");
    Tend();
    ASSERT_NO_FATAL_FAILURE(Compare());
  }
}

INSTANTIATE_TEST_SUITE_P(Seeds, PostingListsModelTest, testing::Range(1U, 10U));

}  // namespace
}  // namespace quarry::engine
