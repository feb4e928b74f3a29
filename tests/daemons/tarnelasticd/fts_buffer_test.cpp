// Full text that is written by way of segments of our own, against the same written by FTS5 alone.

#include "daemons/tarnelasticd/fts_buffer.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <iterator>
#include <map>
#include <memory>
#include <random>
#include <thread>
#include <vector>

#include "common/json.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/segment_merger.h"
#include "daemons/tarnelasticd/varint.h"
#include "tests/daemons/tarnelasticd/support/full_text.h"
#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::engine {
namespace {

using Columns = std::vector<std::string>;

Schema ThreeTexts() {
  Json::Value mappings;
  for (const char* name : {"A", "B", "C"}) mappings["properties"][name]["type"] = "text";
  return Schema(mappings);
}

std::string Pack(const Columns& columns) {
  std::string packed;
  for (std::size_t i = 0; i < columns.size(); ++i) {
    if (columns[i].empty()) continue;
    AppendNumber(&packed, i);
    AppendNumber(&packed, columns[i].size());
    packed += columns[i];
  }
  return packed;
}

class FtsBufferTest : public testing::Test {
 protected:
  FtsBufferTest() {
    model_ = Make("model");
    Make("tested");
    Open();
  }

  std::unique_ptr<Database> Make(const std::string& name) {
    test::WriteFile(dir_ / name, "");
    auto db = Connect(name);
    db->Execute(schema_.CreateStatements());
    return db;
  }
  std::unique_ptr<Database> Connect(const std::string& name) {
    auto db = std::make_unique<Database>(dir_ / name);
    db->Execute("PRAGMA synchronous=OFF;PRAGMA journal_mode=MEMORY");
    CreatePlaces(db.get());
    return db;
  }

  // Anew, as after a restart.
  void Open() {
    buffer_.reset();
    tokenizer_.reset();
    db_ = Connect("tested");
    tokenizer_ = std::make_unique<TextTokenizer>(db_->handle());
    buffer_ = std::make_unique<FtsBuffer>(schema_, db_.get(), *tokenizer_, &work_);
  }

  void Begin() {
    db_->Execute("BEGIN");
    model_->Execute("BEGIN");
    before_ = texts_;
  }
  void Commit() {
    buffer_->Flush();
    db_->Execute("COMMIT");
    model_->Execute("COMMIT");
  }
  void Rollback() {
    buffer_->Clear();
    db_->Execute("ROLLBACK");
    model_->Execute("ROLLBACK");
    texts_ = before_;
  }

  void Insert(std::int64_t id, const Columns& columns) {
    buffer_->InsertBody(id, std::make_shared<const std::string>(Pack(columns)));
    RunModel("INSERT INTO body(rowid,t0,t1,t2) VALUES(?1,?2,?3,?4)", id, columns);
    texts_[id] = columns;
  }
  void Remove(std::int64_t id) {
    buffer_->ChangeBody(id, Pack(texts_[id]), "");
    RunModel("INSERT INTO body(body,rowid,t0,t1,t2) VALUES('delete',?1,?2,?3,?4)", id, texts_[id]);
    texts_.erase(id);
  }
  void Change(std::int64_t id, const Columns& columns) {
    buffer_->ChangeBody(id, Pack(texts_[id]), Pack(columns));
    RunModel("INSERT INTO body(body,rowid,t0,t1,t2) VALUES('delete',?1,?2,?3,?4)", id, texts_[id]);
    RunModel("INSERT INTO body(rowid,t0,t1,t2) VALUES(?1,?2,?3,?4)", id, columns);
    texts_[id] = columns;
  }
  void RunModel(const std::string& sql, std::int64_t id, const Columns& columns) {
    Statement statement = model_->Prepare(sql);
    statement.Bind(1, id);
    for (int i = 0; i < 3; ++i) {
      statement.Bind(i + 2, std::string_view(columns[static_cast<std::size_t>(i)]));
    }
    statement.Run();
  }

  void ExpectSame() { ExpectSameWords(db_.get(), model_.get()); }
  // Segments have places for their words, one for each first leaf at least.
  std::int64_t Segments() {
    return Number(db_.get(), "SELECT count(DISTINCT segid) FROM body_idx");
  }

  std::string Text(std::size_t words, std::size_t vocabulary) {
    return RandomWords(&random_, words, vocabulary);
  }

  const Schema schema_ = ThreeTexts();
  test::TempDir dir_;
  std::unique_ptr<Database> model_;
  std::unique_ptr<Database> db_;
  std::unique_ptr<TextTokenizer> tokenizer_;
  SideWork work_;
  std::unique_ptr<FtsBuffer> buffer_;
  std::map<std::int64_t, Columns> texts_;
  std::map<std::int64_t, Columns> before_;
  std::mt19937_64 random_{17};
};

TEST_F(FtsBufferTest, WritesOneSegmentForNewTexts) {
  Begin();
  Insert(1, {"one two one", "", "three"});
  Insert(2, {"", "two", ""});
  Commit();
  EXPECT_EQ(Segments(), 1);
  ExpectSame();
}

TEST_F(FtsBufferTest, KnowsOfTextsWithoutWords) {
  Begin();
  Insert(1, {"--", "", ""});
  Commit();
  EXPECT_EQ(Segments(), 0);
  ExpectSame();
}

TEST_F(FtsBufferTest, SpreadsListsOverLeaves) {
  Begin();
  std::string text;
  for (int i = 0; i < 9000; ++i) text += i % 300 == 0 ? "rare " : "often ";
  for (int i = 1; i < 40; ++i) Insert(3 * i, {text, "often", Text(2000, 20000)});
  Commit();
  EXPECT_GT(Number(db_.get(), "SELECT count(*) FROM body_data"), 50);
  EXPECT_LE(Number(db_.get(), "SELECT max(length(block)) FROM body_data"), 4096);
  ExpectSame();
}

TEST_F(FtsBufferTest, TakesLongWordsAndTexts) {
  Begin();
  for (const std::size_t size : {400U, 999U, 1000U, 1001U, 5000U, 40000U}) {
    Insert(static_cast<std::int64_t>(size),
           {"a " + std::string(size, 'x'), std::string(size, 'y'), "b"});
  }
  for (int i = 0; i < 30; ++i) {
    Insert(50000 + i, {"a " + std::string(900, 'z') + std::to_string(i), "", ""});
  }
  Insert(60000, {Text(900000, 3000), "c", ""});
  Insert(60001, {"a", "c", ""});
  Commit();
  ExpectSame();
}

TEST_F(FtsBufferTest, TakesAnyBytes) {
  Begin();
  for (int id = 1; id < 300; ++id) {
    Columns columns(3);
    for (std::string& text : columns) {
      for (auto i = random_() % 60; i > 0; --i) text += static_cast<char>(random_() % 256);
    }
    if (columns[0].empty()) columns[0] = "x";
    Insert(id, columns);
  }
  Commit();
  ExpectSame();
}

TEST_F(FtsBufferTest, RemovesWhatItsSegmentsHold) {
  Begin();
  Insert(1, {"one two", "", ""});
  Insert(2, {"two three", "", ""});
  Remove(1);
  Commit();
  ExpectSame();
  Begin();
  Change(2, {"three four", "", "five"});
  Insert(3, {"two", "", ""});
  Commit();
  ExpectSame();
}

// A number that is given out again after its text has gone.
TEST_F(FtsBufferTest, HoldsAgainstOlderSegments) {
  Begin();
  Insert(1, {"one two", "", ""});
  Commit();
  Begin();
  Remove(1);
  Commit();
  Open();
  Begin();
  Insert(1, {"two three", "", ""});
  Commit();
  ExpectSame();
}

TEST_F(FtsBufferTest, ForgetsWhatIsRolledBack) {
  Begin();
  Insert(1, {"one", "", ""});
  Commit();
  Begin();
  Insert(2, {"two", "", ""});
  buffer_->Flush();
  Insert(3, {"three", "", ""});
  Rollback();
  ExpectSame();
  Begin();
  Insert(2, {"other", "", ""});
  Commit();
  ExpectSame();
}

TEST_F(FtsBufferTest, KeepsSegmentsFew) {
  for (int id = 1; id <= 200; ++id) {
    Begin();
    Insert(id, {Text(50, 1000), "", ""});
    Commit();
    EXPECT_LE(Segments(), 24);
  }
  ExpectSame();
}

// It takes long for what is too large to be merged at once, and more comes meanwhile.
TEST_F(FtsBufferTest, KeepsSegmentsFewWhileFts5Merges) {
  for (int id = 1; id <= 4; ++id) {
    std::string text;
    for (int i = 0; i < 50000; ++i) text += "word" + std::to_string(id * 1000000 + i * 7) + ' ';
    Begin();
    Insert(id, {text, "", ""});
    Commit();
  }
  db_->Execute("INSERT INTO body(body,rank) VALUES('merge',10)");
  const auto is_merging = [this] {
    return ReadStructure(db_.get(), "body")->levels[0].merging > 0;
  };
  int id = 5;
  for (; is_merging(); ++id) {
    Begin();
    Insert(id, {Text(50, 1000), "", ""});
    if (id % 4 == 0) Remove(id - 3);
    Commit();
    EXPECT_LE(Segments(), 16);
  }
  EXPECT_GT(id, 20);
  ExpectSame();
}

// For the sake of one change many leaves would be written anew.
TEST_F(FtsBufferTest, LeavesLargeSegmentsAloneWhereTextsChange) {
  for (int id = 1; id <= 2; ++id) {
    std::string text;
    for (int i = 0; i < 130000; ++i) text += "word" + std::to_string(id * 1000000 + i * 7) + ' ';
    Begin();
    Insert(id, {text, "", ""});
    Commit();
  }
  const char* const large = "SELECT hex(block) FROM body_data WHERE id>>37 IN (1,2)";
  const std::vector<std::string> before = Rows(db_.get(), large);
  EXPECT_GT(before.size(), 512U);
  Begin();
  Insert(3, {"one", "", ""});
  Commit();
  for (int i = 0; i < 80; ++i) {
    Begin();
    Change(3, {Text(50, 1000), "", ""});
    Commit();
    EXPECT_LE(Segments(), 20);
  }
  EXPECT_TRUE(Rows(db_.get(), large) == before);
  ExpectSame();
}

// FTS5 would add a level each time, and fail with the two thousandth.
TEST_F(FtsBufferTest, KeepsLevelsFewWhereAllIsMerged) {
  for (int id = 1; id <= 60; ++id) {
    Begin();
    Insert(id, {Text(20, 1000), "", ""});
    if (id % 5 == 0) Remove(id - 3);
    Commit();
    Begin();
    MergeAllSegments(db_.get(), "body");
    Commit();
    EXPECT_EQ(Segments(), 1);
    const std::optional<FtsStructure> structure = ReadStructure(db_.get(), "body");
    ASSERT_TRUE(structure);
    EXPECT_LE(structure->levels.size(), 8U);
  }
  ExpectSame();
}

// A library to come may say more of its levels than is understood here.
TEST_F(FtsBufferTest, MergesWhatIsNotUnderstood) {
  Begin();
  Insert(1, {"one", "", ""});
  Commit();
  Begin();
  Insert(2, {"two", "", ""});
  Commit();
  db_->Execute("UPDATE body_config SET v=5 WHERE k='version'");
  Begin();
  MergeAllSegments(db_.get(), "body");
  db_->Execute("UPDATE body_config SET v=4 WHERE k='version'");
  Commit();
  EXPECT_EQ(Segments(), 1);
  ExpectSame();
}

TEST_F(FtsBufferTest, TellsMemory) {
  Begin();
  EXPECT_EQ(buffer_->list_bytes(), 0U);
  Insert(1, {Text(3000, 3000), "", ""});
  work_.RunAll();
  Insert(2, {"one", "", ""});
  EXPECT_GT(buffer_->list_bytes(), 3000U);
  buffer_->Flush();
  EXPECT_EQ(buffer_->list_bytes(), 0U);
  Rollback();
}

// Whoever cuts texts, in whatever order they are done.
TEST_F(FtsBufferTest, OthersCutTheSameWords) {
  std::atomic<bool> is_over{false};
  std::vector<std::thread> helpers;
  for (int i = 0; i < 2; ++i) {
    helpers.emplace_back([&] {
      while (!is_over) work_.RunAll();
    });
  }
  std::int64_t id = 0;
  for (int round = 0; round < 4; ++round) {
    Begin();
    for (int i = 0; i < 60; ++i) {
      const std::string long_word(i % 20 == 7 ? 2000 : 20, 'x');
      Insert(++id, {Text(i % 15 == 0 ? 9000 : 90, 3000), long_word, Text(5, 10)});
    }
    Remove(id - 3);
    Change(id - 5, {"one two", "", Text(20, 50)});
    if (round == 2) {
      Rollback();
    } else {
      Commit();
    }
  }
  is_over = true;
  for (std::thread& helper : helpers) helper.join();
  ExpectSame();
}

TEST_F(FtsBufferTest, ForgetsWhatIsRolledBackWhileItIsCut) {
  for (const bool is_cut : {false, true}) {
    Begin();
    Insert(1, {"one", "", ""});
    if (is_cut) work_.RunAll();
    Rollback();
    work_.RunAll();
    Begin();
    Commit();
    ExpectSame();
  }
  Begin();
  Insert(1, {"other", "", ""});
  Commit();
  ExpectSame();
}

TEST_F(FtsBufferTest, TellsWhatHasFailedBesideIt) {
  for (const bool by_flush : {false, true}) {
    Begin();
    Insert(1, {"one", "", ""});
    sqlite3_hard_heap_limit64(1);
    work_.RunAll();
    sqlite3_hard_heap_limit64(0);
    if (by_flush) {
      EXPECT_THROW(buffer_->Flush(), Error);
    } else {
      EXPECT_THROW(Insert(2, {"two", "", ""}), Error);
    }
    Rollback();
  }
  Begin();
  Insert(1, {"one two", "", ""});
  Commit();
  ExpectSame();
}

TEST_F(FtsBufferTest, MayEndBeforeItsWork) {
  Begin();
  Insert(1, {"one", "", ""});
  const auto task = work_.Add(1, [] {});
  buffer_.reset();
  work_.Finish(task);
  work_.RunAll();
}

TEST_F(FtsBufferTest, MakesOneSegmentOfSavedLists) {
  Begin();
  for (int id = 1; id < 30; ++id) {
    Insert(id, {Text(200, 3000), id % 4 == 0 ? "" : "all", ""});
    if (id % 5 == 0) {
      buffer_->SaveLists();
      EXPECT_EQ(buffer_->list_bytes(), 0U);
    }
  }
  buffer_->SaveLists();
  EXPECT_EQ(Segments(), 0);
  Remove(7);
  Commit();
  EXPECT_EQ(Segments(), 2);  // that of the new texts, and what FTS5 has of the removed one
  ExpectSame();
}

TEST_F(FtsBufferTest, SavesListsOnlySoOften) {
  Begin();
  for (int id = 1; id <= 12; ++id) {
    Insert(id, {"one w" + std::to_string(id), "", ""});
    buffer_->SaveLists();
  }
  EXPECT_EQ(Segments(), 1);
  Commit();
  EXPECT_EQ(Segments(), 2);
  ExpectSame();
}

TEST_F(FtsBufferTest, ForgetsSavedListsThatAreRolledBack) {
  Begin();
  Insert(1, {"one", "", ""});
  buffer_->SaveLists();
  Rollback();
  Begin();
  Insert(1, {"two", "", ""});
  Commit();
  ExpectSame();
}

// Another library's tables are not touched.
TEST_F(FtsBufferTest, LeavesToFts5WhatIsNotUnderstood) {
  db_->Execute("UPDATE body_config SET v=5 WHERE k='version'");
  buffer_ = std::make_unique<FtsBuffer>(schema_, db_.get(), *tokenizer_, &work_);
  db_->Execute("UPDATE body_config SET v=4 WHERE k='version'");
  Begin();
  Insert(1, {"one", "", ""});
  EXPECT_EQ(buffer_->list_bytes(), 0U);
  Commit();
  ExpectSame();
}

TEST_F(FtsBufferTest, ReportsDamage) {
  Begin();
  Insert(1, {"one", "", ""});
  db_->Execute("UPDATE body_data SET block=x'00000000ff' WHERE id=10");
  try {
    buffer_->Flush();
    FAIL() << "no damage was found";
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), static_cast<int>(kDamagedIndex));
  }
  Rollback();
}

TEST_F(FtsBufferTest, HoldsWhatFts5DoesThroughRandomChanges) {
  std::int64_t next = 1;
  for (int round = 0; round < 120; ++round) {
    if (round % 30 == 29) Open();
    Begin();
    for (auto i = random_() % 12; i > 0; --i) {
      const std::uint64_t what = random_() % 10;
      const Columns columns = {Text(1 + random_() % 300, 4000), Text(random_() % 3, 50),
                               random_() % 200 == 0 ? std::string(2000, 'q') : ""};
      if (what < 6 || texts_.empty()) {
        Insert(next, columns);
        next += static_cast<std::int64_t>(1 + random_() % 3);
      } else {
        auto some = texts_.begin();
        std::advance(some, static_cast<std::ptrdiff_t>(random_() % texts_.size()));
        if (what < 8) {
          Remove(some->first);
        } else {
          Change(some->first, columns);
        }
      }
      if (random_() % 8 == 0) buffer_->Flush();
      if (random_() % 4 == 0) buffer_->SaveLists();
    }
    if (random_() % 6 == 0) {
      Rollback();
    } else {
      Commit();
    }
    if (round % 10 == 0) ExpectSame();
  }
  ExpectSame();
}

}  // namespace
}  // namespace quarry::engine
