// Segments that are merged here, against the same merged by FTS5.

#include "daemons/tarnelasticd/segment_merger.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <iterator>
#include <map>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/segment_writer.h"
#include "tests/daemons/tarnelasticd/support/full_text.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::engine {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class SegmentMergerTest : public testing::Test {
 protected:
  SegmentMergerTest() : tested_(Make("tested")), model_(Make("model")) {}

  // FTS5 does not merge of itself.
  std::unique_ptr<Database> Make(const std::string& name) {
    test::WriteFile(dir_ / name, "");
    auto db = std::make_unique<Database>(dir_ / name);
    db->Execute(
        "PRAGMA synchronous=OFF;PRAGMA journal_mode=MEMORY;"
        "CREATE VIRTUAL TABLE body USING fts5(a,b, content='');"
        "INSERT INTO body(body,rank) VALUES('automerge',0);"
        "INSERT INTO body(body,rank) VALUES('crisismerge',1000);"
        "CREATE VIRTUAL TABLE temp.words USING fts5vocab(main,body,row)");
    CreatePlaces(db.get());
    return db;
  }

  void Both(const std::string& sql) {
    tested_->Execute(sql);
    model_->Execute(sql);
  }
  void Run(const std::string& sql, std::int64_t id, const std::string& a, const std::string& b) {
    for (Database* db : {tested_.get(), model_.get()}) {
      db->Prepare(sql).Bind(1, id).Bind(2, std::string_view(a)).Bind(3, std::string_view(b)).Run();
    }
  }
  void Insert(std::int64_t id, const std::string& a, const std::string& b = "") {
    Run("INSERT INTO body(rowid,a,b) VALUES(?1,?2,?3)", id, a, b);
    texts_[id] = {a, b};
  }
  void Remove(std::int64_t id) {
    const auto [a, b] = texts_[id];
    Run("INSERT INTO body(body,rowid,a,b) VALUES('delete',?1,?2,?3)", id, a, b);
    texts_.erase(id);
  }

  void ExpectSame() { ExpectSameWords(tested_.get(), model_.get()); }
  std::int64_t Segments() {
    return Number(tested_.get(), "SELECT count(DISTINCT id>>37) FROM body_data WHERE id>>37>0");
  }

  // Merges both, and compares what has been told of words.
  bool MergeAll() {
    std::vector<std::string> words;
    Both("BEGIN");
    const bool is_told =
        MergeAllSegments(tested_.get(), "body", [&words](std::string_view word, const auto& rows) {
          words.push_back(std::string(word) + " " + std::to_string(rows.size()));
        });
    model_->Execute("INSERT INTO body(body) VALUES('optimize')");
    Both("COMMIT");
    if (is_told) {
      std::vector<std::string> all =
          Rows(tested_.get(), "SELECT term||' '||doc FROM temp.words ORDER BY term");
      all.emplace_back(" 0");
      EXPECT_EQ(words, all);
    } else {
      EXPECT_THAT(words, IsEmpty());
    }
    return is_told;
  }

  std::string Text(std::size_t words, std::size_t vocabulary) {
    return RandomWords(&random_, words, vocabulary);
  }
  void ChangeAtRandom() {
    if (texts_.empty() || random_() % 4 != 0) {
      Insert(next_++, Text(1 + random_() % 200, 3000), Text(random_() % 3, 20));
      return;
    }
    auto some = texts_.begin();
    std::advance(some, static_cast<std::ptrdiff_t>(random_() % texts_.size()));
    const std::int64_t id = some->first;
    Remove(id);
    if (random_() % 2 == 0) Insert(id, Text(30, 3000));
  }

  test::TempDir dir_;
  std::unique_ptr<Database> tested_;
  std::unique_ptr<Database> model_;
  std::map<std::int64_t, std::pair<std::string, std::string>> texts_;
  std::int64_t next_ = 1;
  std::mt19937_64 random_{29};
};

TEST_F(SegmentMergerTest, HasNothingToDoWithoutSegments) {
  EXPECT_FALSE(MergeAll());
  Insert(1, "one");
  EXPECT_FALSE(MergeAll());
  ExpectSame();
}

TEST_F(SegmentMergerTest, JoinsLists) {
  for (int id = 1; id < 6; ++id) Insert(id, "all w" + std::to_string(id), "all");
  EXPECT_EQ(Segments(), 5);
  EXPECT_TRUE(MergeAll());
  EXPECT_EQ(Segments(), 1);
  ExpectSame();
}

TEST_F(SegmentMergerTest, WeavesRowsThatComeInNoOrder) {
  for (const int id : {7, 3, 9, 1, 8, 2}) Insert(id, "all w" + std::to_string(id % 3));
  EXPECT_TRUE(MergeAll());
  EXPECT_EQ(Segments(), 1);
  ExpectSame();
}

TEST_F(SegmentMergerTest, ForgetsWhatIsDeleted) {
  Insert(1, "one two");
  Insert(2, "one");
  Remove(1);
  Remove(2);
  EXPECT_TRUE(MergeAll());
  EXPECT_EQ(Segments(), 0);
  EXPECT_EQ(Number(tested_.get(), "SELECT count(*) FROM body_idx"), 0);
  ExpectSame();
  Insert(1, "one");
  ExpectSame();
}

TEST_F(SegmentMergerTest, GoesOnWhereFts5HasBegun) {
  for (int id = 1; id < 20; ++id) Insert(id, Text(3000, 20000));
  Both("INSERT INTO body(body,rank) VALUES('usermerge',2)");
  Both("INSERT INTO body(body,rank) VALUES('merge',10)");
  const std::optional<FtsStructure> structure = ReadStructure(tested_.get(), "body");
  ASSERT_GT(structure->levels[0].merging, 0);
  EXPECT_FALSE(MergeAll());
  EXPECT_EQ(Segments(), 1);
  ExpectSame();
}

TEST_F(SegmentMergerTest, LeavesVeryManySegmentsToFts5) {
  for (int id = 1; id < 70; ++id) Insert(id, "w" + std::to_string(id % 5));
  EXPECT_FALSE(MergeAll());
  EXPECT_EQ(Segments(), 1);
  ExpectSame();
}

TEST_F(SegmentMergerTest, TakesLongWordsAndPositions) {
  for (const std::size_t size : {500U, 2500U, 5000U, 33000U}) {
    Insert(static_cast<std::int64_t>(size), "a " + std::string(size, 'x') + " " + Text(9, 9),
           std::string(size, 'y') + " b");
  }
  std::string often;
  for (int i = 0; i < 20000; ++i) often += i % 300 == 0 ? "rare " : "often ";
  Insert(40000, often);
  Insert(40001, "often");
  EXPECT_TRUE(MergeAll());
  ExpectSame();
}

// FTS5 skips leaves of long lists by these.
TEST_F(SegmentMergerTest, WritesIndexesOfLongLists) {
  for (int part = 0; part < 4; ++part) {
    Both("BEGIN");
    for (int i = 1; i <= 4000; ++i) {
      const int id = part * 4000 + i;
      Insert(id,
             "often and" + std::string(id % 1000 == 0 ? " rare often" : " more " + Text(1, 900)));
    }
    Both("COMMIT");
  }
  EXPECT_TRUE(MergeAll());
  ExpectSame();
  const char* const indexes = "SELECT count(*) FROM body_data WHERE id>>36&1";
  EXPECT_GE(Number(tested_.get(), indexes), 2);
  EXPECT_EQ(Rows(tested_.get(), indexes), Rows(model_.get(), indexes));
  const char* const phrase =
      "SELECT rowid FROM body('\"and rare often\" AND often') ORDER BY rowid";
  EXPECT_EQ(Rows(tested_.get(), phrase), Rows(model_.get(), phrase));
  EXPECT_THAT(Rows(tested_.get(), phrase), testing::SizeIs(16));
}

// Row ids far apart make an index that does not fit into one node.
TEST_F(SegmentMergerTest, WritesIndexesOfSeveralNodes) {
  constexpr std::int64_t kStep = 1'000'000'000;
  constexpr int kRows = 250000;
  const std::string positions(20, '\2');
  tested_->Execute("BEGIN");
  WriteOutFts(tested_.get(), "body");
  SegmentWriter writer(tested_.get(), "body", 1);
  writer.BeginWord("0often");
  for (int i = 1; i <= kRows; ++i) writer.AddEntry({i * kStep, positions});
  writer.BeginWord("0rare");
  for (int i = 1000; i <= kRows; i += 1000) writer.AddEntry({i * kStep, "\2"});
  std::optional<FtsStructure> structure = ReadStructure(tested_.get(), "body");
  structure->levels.resize(1);
  structure->levels[0].segments = {{1, 1, writer.Finish()}};
  WriteStructure(tested_.get(), "body", *structure);
  AddToTotals(tested_.get(), "body", kRows, {kRows, 0});
  ForgetFts(tested_.get());
  tested_->Execute("COMMIT;INSERT INTO body(body) VALUES('integrity-check')");
  EXPECT_GT(Number(tested_.get(), "SELECT count(*) FROM body_data WHERE id>>36&1 AND id>>31&31=0"),
            1);
  EXPECT_EQ(Number(tested_.get(), "SELECT count(*) FROM body_data WHERE id>>36&1 AND id>>31&31=1"),
            1);
  EXPECT_EQ(Number(tested_.get(), "SELECT count(*) FROM body('rare often')"), kRows / 1000);
}

TEST_F(SegmentMergerTest, MergesFullLevelsOnly) {
  for (int id = 1; id < 8; ++id) Insert(id, "one " + Text(900, 5000));
  const auto merge = [this] {
    tested_->Execute("BEGIN");
    WriteOutFts(tested_.get(), "body");
    std::optional<FtsStructure> structure = ReadStructure(tested_.get(), "body");
    MergeFullLevels(tested_.get(), "body", &*structure);
    ForgetFts(tested_.get());
    tested_->Execute("COMMIT");
  };
  merge();
  EXPECT_EQ(Segments(), 7);
  Insert(8, "one");
  merge();
  EXPECT_EQ(Segments(), 1);
  ExpectSame();
  // What is deleted from an older segment stays deleted.
  Remove(3);
  for (int id = 20; id < 27; ++id) Insert(id, "one");
  merge();
  EXPECT_EQ(Segments(), 2);
  ExpectSame();
  EXPECT_TRUE(MergeAll());
  ExpectSame();
}

// For the sake of a few new leaves many would be written anew.
TEST_F(SegmentMergerTest, LeavesLargeSegmentsAlone) {
  Both("INSERT INTO body(body,rank) VALUES('hashsize',67108864)");
  for (int id = 1; id < 3; ++id) {
    std::string text;
    for (int i = 0; i < 130000; ++i) text += "word" + std::to_string(id * 1000000 + i * 7) + ' ';
    Insert(id, text);
  }
  const char* const large = "SELECT hex(block) FROM body_data WHERE id>>37 IN (1,2)";
  const std::vector<std::string> before = Rows(tested_.get(), large);
  for (int id = 3; id < 17; ++id) {
    Insert(id, "one");
    tested_->Execute("BEGIN");
    WriteOutFts(tested_.get(), "body");
    std::optional<FtsStructure> structure = ReadStructure(tested_.get(), "body");
    MergeFullLevels(tested_.get(), "body", &*structure);
    ForgetFts(tested_.get());
    tested_->Execute("COMMIT");
  }
  EXPECT_TRUE(Rows(tested_.get(), large) == before);
  EXPECT_GT(before.size(), 512U);
  EXPECT_LE(Segments(), 10);
  ExpectSame();
  EXPECT_TRUE(MergeAll());
  ExpectSame();
}

TEST_F(SegmentMergerTest, HoldsWhatFts5DoesThroughRandomChanges) {
  for (int round = 0; round < 40; ++round) {
    // Now and then FTS5 merges between.
    if (round == 20) Both("INSERT INTO body(body,rank) VALUES('automerge',4)");
    for (auto flushes = 1 + random_() % 9; flushes > 0; --flushes) {
      Both("BEGIN");
      for (auto i = 1 + random_() % 12; i > 0; --i) ChangeAtRandom();
      Both("COMMIT");
    }
    MergeAll();
    EXPECT_EQ(Segments(), texts_.empty() ? 0 : 1);
    if (round % 5 == 0) ExpectSame();
  }
  Both("INSERT INTO body(body) VALUES('optimize')");
  ExpectSame();
}

// Each byte wrong in turn is told, or does no harm but to the answers.
TEST_F(SegmentMergerTest, SurvivesDamage) {
  std::string often;
  for (int i = 0; i < 6000; ++i) often += i % 300 == 0 ? "rare " : "often ";
  Insert(1, "one two three tree");
  Insert(2, often);
  Insert(3, "one often trees");
  Remove(1);
  std::vector<std::pair<std::int64_t, std::string>> rows;
  {
    Statement all = tested_->Prepare("SELECT id,block FROM body_data WHERE id>=10");
    while (all.Step()) rows.emplace_back(all.Int(0), all.Blob(1));
  }
  ASSERT_GE(rows.size(), 6U);
  int told = 0;
  for (const auto& [id, block] : rows) {
    for (std::size_t at = 0; at < block.size(); at += at < 100 ? 1 : 37) {
      std::string damaged = block;
      damaged[at] = static_cast<char>(damaged[at] ^ (1 << random_() % 8));
      tested_->Execute("BEGIN");
      tested_->Prepare("UPDATE body_data SET block=?2 WHERE id=?1")
          .Bind(1, id)
          .BindBlob(2, damaged)
          .Run();
      try {
        MergeAllSegments(tested_.get(), "body", [](std::string_view, const auto&) {});
      } catch (const Error& error) {
        EXPECT_EQ(error.code(), static_cast<int>(kDamagedIndex)) << error.reason();
        ++told;
      }
      tested_->Execute("ROLLBACK");
    }
  }
  EXPECT_GT(told, 50);
  EXPECT_TRUE(MergeAll());
  ExpectSame();
}

// They could be copied to no leaf for ever.
TEST_F(SegmentMergerTest, TakesPositionsWithoutEndForDamage) {
  tested_->Execute("BEGIN");
  SegmentWriter writer(tested_.get(), "body", 1);
  writer.BeginWord("0one");
  EXPECT_THROW(writer.AddEntry({1, std::string(9000, '\x80')}), Error);
  EXPECT_THROW(writer.BeginWord("0" + std::string(SegmentWriter::kMaxKey, 'x')), Error);
  tested_->Execute("ROLLBACK");
}

}  // namespace
}  // namespace quarry::engine
